#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/TLError.h"

struct sqlite3;
struct sqlite3_stmt;

namespace mailsync {

class Database;

inline constexpr const char* kCatalogueDomain = "com.quill.tallow.catalogue";

// A prepared statement. Bind the values in order, step through the rows, then call `reset`; `run`
// does the last two. The database keeps the first failure to prepare or to step; a statement that
// could not be prepared has no rows.
class Statement {
 public:
  Statement() = default;
  Statement(Database& database, const char* text);

  // Bytes are bound as a blob, because names need not be UTF-8. They are not copied and must stay
  // valid until the reset.
  Statement& bind(int64_t value);
  Statement& bindText(std::string_view value);
  Statement& bindBytes(std::string_view value);

  // True at each row.
  bool step();
  // Steps to the end and resets. False on failure.
  bool run();
  void reset();

  [[nodiscard]] int64_t number(int column) const;
  // Text or bytes; empty for NULL.
  [[nodiscard]] std::string text(int column) const;

 private:
  struct Finalizer {
    void operator()(sqlite3_stmt* statement) const;
  };
  Database* _database = nullptr;
  std::unique_ptr<sqlite3_stmt, Finalizer> _statement;
  int _bound = 0;
};

// What `make` makes of each remaining row.
template <typename Make>
auto all(Statement& statement, const Make& make) {
  std::vector<decltype(make(statement))> rows;
  while (statement.step()) rows.push_back(make(statement));
  statement.reset();
  return rows;
}

// What `make` makes of the next row; nullopt if there is none.
template <typename Make>
auto first(Statement& statement, const Make& make) {
  std::optional<decltype(make(statement))> row;
  if (statement.step()) row = make(statement);
  statement.reset();
  return row;
}

// One SQLite database with a write-ahead log. One thread at a time.
//
// The first failure is kept, so one check after a group of steps is enough.
class Database {
 public:
  // Null with an error if the file cannot be opened or created.
  [[nodiscard]] static std::unique_ptr<Database> open(const std::string& path, TLErrorOut error);
  ~Database();
  Database(const Database&) = delete;
  Database& operator=(const Database&) = delete;

  [[nodiscard]] Statement prepare(const char* text) { return {*this, text}; }
  bool execute(const char* text);

  [[nodiscard]] const std::optional<TLError>& failure() const { return _failure; }
  [[nodiscard]] int64_t lastInsertedID() const;

 private:
  friend class Statement;

  explicit Database(sqlite3* database) : _database(database) {}
  void noteFailure();

  sqlite3* const _database;
  std::optional<TLError> _failure;
};

}  // namespace mailsync
