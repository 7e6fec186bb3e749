#pragma once

#include <sqlite3.h>

#include <memory>
#include <string>

#include "bench/Corpus.h"

namespace peers {

// Mail in a full-text table of SQLite, as in an application without a search daemon. One thread.
// Every operation throws when SQLite reports an error.
class Fts5Database {
 public:
  // Opens or creates the database at `path`.
  explicit Fts5Database(const std::string& path);

  // Adds all items of the spool, one transaction per batch.
  void index(bench::ItemSpool& spool);

  // Merges all segments of the index into one.
  void optimize();

  // Writes everything into the database file.
  void checkpoint();

  // Fetches subject and sender of the best mails that contain all words, the last one as a prefix.
  // Returns their number.
  [[nodiscard]] size_t search(const std::string& query);

 private:
  struct Close {
    void operator()(sqlite3* database) const { sqlite3_close(database); }
  };
  struct Finalize {
    void operator()(sqlite3_stmt* statement) const { sqlite3_finalize(statement); }
  };
  using Statement = std::unique_ptr<sqlite3_stmt, Finalize>;

  void execute(const char* sql);
  [[nodiscard]] Statement prepare(const char* sql);
  void check(int code, int expected);

  std::unique_ptr<sqlite3, Close> _database;
};

}  // namespace peers
