#pragma once

#include <sqlite3.h>

#include <memory>
#include <string>

#include "bench/Corpus.h"

namespace peers {

// Mail in a full-text table of SQLite: what an application does that has no search daemon. One
// thread. Every operation throws when SQLite reports an error.
class Fts5Database {
 public:
  // Opens the database at `path`, or makes it.
  explicit Fts5Database(const std::string& path);

  // Adds all items of the spool, a transaction for each of its batches.
  void index(bench::ItemSpool& spool);

  // Merges all segments of the index into one.
  void optimize();

  // Brings everything into the database file.
  void checkpoint();

  // Fetches subject and sender of the best mails that have all words, the last one as a prefix.
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
