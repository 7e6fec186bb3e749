#pragma once

#include <gtest/gtest.h>
#include <sqlite3.h>

#include <string>

namespace testsupport {

// A connection to a database file.
class SQLiteConnection {
 public:
  explicit SQLiteConnection(const std::string& path) {
    EXPECT_EQ(sqlite3_open(path.c_str(), &_database), SQLITE_OK);
  }
  ~SQLiteConnection() { sqlite3_close(_database); }
  SQLiteConnection(const SQLiteConnection&) = delete;
  SQLiteConnection& operator=(const SQLiteConnection&) = delete;

  void run(const std::string& query) {
    EXPECT_EQ(sqlite3_exec(_database, query.c_str(), nullptr, nullptr, nullptr), SQLITE_OK)
        << sqlite3_errmsg(_database);
  }
  // The first column of the first row.
  std::string ask(const std::string& query) {
    std::string result;
    const auto keep = [](void* out, int, char** values, char**) {
      *static_cast<std::string*>(out) = values[0] != nullptr ? values[0] : "NULL";
      return 0;
    };
    EXPECT_EQ(sqlite3_exec(_database, query.c_str(), keep, &result, nullptr), SQLITE_OK);
    return result;
  }

 private:
  sqlite3* _database = nullptr;
};

}  // namespace testsupport
