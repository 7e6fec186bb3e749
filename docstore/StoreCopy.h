#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/TLError.h"

struct sqlite3;

// Writes a copy of a document store without remains of deleted data: SQLite leaves the bytes of
// deleted rows in the file until it reuses the space. IDs, client states and the ID counter are
// kept. One thread.
class StoreCopy {
 public:
  // Copies the store at `from`, which no process has open, to `to`, where nothing exists. The
  // original is unchanged except for its write-ahead log. Null with the error on failure. The file
  // is not synced.
  [[nodiscard]] static std::unique_ptr<StoreCopy> make(const std::string& from,
                                                       const std::string& to, TLErrorOut error);
  ~StoreCopy();
  StoreCopy(const StoreCopy&) = delete;
  StoreCopy& operator=(const StoreCopy&) = delete;

  // The documents' IDs, ascending.
  [[nodiscard]] std::optional<std::vector<uint32_t>> documentIDs(TLErrorOut error);
  // The stored vocabulary; nullopt without an error if there is none.
  [[nodiscard]] std::optional<std::string> vocabulary(TLErrorOut error);
  // Replaces the vocabulary and overwrites the old one in the file. A failure may leave the copy
  // unusable.
  bool setVocabulary(std::string_view vocabulary, TLErrorOut error);

 private:
  explicit StoreCopy(sqlite3* database) : _database(database) {}

  sqlite3* const _database;
};

// The size of the unused pages of the store at `path`, from its header: what a copy saves, except
// for unused space in used pages. 0 if unreadable.
[[nodiscard]] uint64_t unusedStoreBytes(const std::string& path);
