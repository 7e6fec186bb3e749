#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/TLError.h"

struct sqlite3;

// A new file with what a document store holds, and nothing of what has been deleted from it: SQLite
// leaves the bytes of deleted rows where they were until it needs the room. IDs, client states and
// the counter of IDs are those of the original. One thread.
class StoreCopy {
 public:
  // Writes the copy of the store at `from`, which no process has open, to `to`, where nothing is.
  // The original stays as it is, but for its write-ahead log. Null, with the error, when that
  // fails. The file is not synced.
  [[nodiscard]] static std::unique_ptr<StoreCopy> make(const std::string& from,
                                                       const std::string& to, TLErrorOut error);
  ~StoreCopy();
  StoreCopy(const StoreCopy&) = delete;
  StoreCopy& operator=(const StoreCopy&) = delete;

  // The documents' IDs, ascending.
  [[nodiscard]] std::optional<std::vector<uint32_t>> documentIDs(TLErrorOut error);
  // The stored vocabulary; none, and no error, where there is none.
  [[nodiscard]] std::optional<std::string> vocabulary(TLErrorOut error);
  // Leaves nothing of the one before in the file. A failure may leave the copy unusable.
  bool setVocabulary(std::string_view vocabulary, TLErrorOut error);

 private:
  explicit StoreCopy(sqlite3* database) : _database(database) {}

  sqlite3* const _database;
};

// The bytes of the pages of the store at `path` that hold nothing any more, by its header: what a
// copy saves, less what lies in pages that are in use. 0 where it cannot be read.
[[nodiscard]] uint64_t unusedStoreBytes(const std::string& path);
