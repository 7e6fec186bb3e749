#include "docstore/StoreCopy.h"

#include <fcntl.h>
#include <sqlite3.h>

#include <array>
#include <functional>

#include "platform/FileDescriptor.h"
#include "platform/Files.h"
#include "records/TLErrorCodes.h"

namespace {

struct Close {
  void operator()(sqlite3* database) const { sqlite3_close(database); }
  void operator()(sqlite3_stmt* statement) const { sqlite3_finalize(statement); }
};
using Connection = std::unique_ptr<sqlite3, Close>;
using Prepared = std::unique_ptr<sqlite3_stmt, Close>;

Connection open(const std::string& path, TLErrorOut error) {
  sqlite3* opened = nullptr;
  const int code = sqlite3_open_v2(path.c_str(), &opened, SQLITE_OPEN_READWRITE, nullptr);
  Connection database(opened);
  if (code == SQLITE_OK) return database;
  platform::setError(error, {kDocStoreErrorDomain, code, path + ": " + sqlite3_errstr(code)});
  return nullptr;
}

// Runs one statement, with a value bound by `bind` if given, and passes each row to `row`.
bool run(sqlite3* database, const char* query, const std::function<int(sqlite3_stmt*)>& bind,
         const std::function<void(sqlite3_stmt*)>& row, TLErrorOut error) {
  sqlite3_stmt* made = nullptr;
  int code = sqlite3_prepare_v2(database, query, -1, &made, nullptr);
  const Prepared statement(made);
  if (code == SQLITE_OK && bind) code = bind(made);
  if (code == SQLITE_OK) {
    while ((code = sqlite3_step(made)) == SQLITE_ROW) {
      if (row) row(made);
    }
  }
  if (code == SQLITE_DONE) return true;
  platform::setError(error, {kDocStoreErrorDomain, code, sqlite3_errmsg(database)});
  return false;
}

bool run(sqlite3* database, const char* query, TLErrorOut error) {
  return run(database, query, nullptr, nullptr, error);
}

}  // namespace

std::unique_ptr<StoreCopy> StoreCopy::make(const std::string& from, const std::string& to,
                                           TLErrorOut error) {
  const auto bindPath = [&to](sqlite3_stmt* statement) {
    return sqlite3_bind_text(statement, 1, to.c_str(), -1, SQLITE_STATIC);
  };
  {
    const Connection original = open(from, error);
    if (original == nullptr || !run(original.get(), "VACUUM INTO ?;", bindPath, nullptr, error)) {
      return nullptr;
    }
  }
  Connection copy = open(to, error);
  if (copy == nullptr) return nullptr;
  // Nobody uses the copy before it is complete, so it needs no journal.
  if (!run(copy.get(), "PRAGMA journal_mode=OFF;", error) ||
      !run(copy.get(), "PRAGMA secure_delete=ON;", error)) {
    return nullptr;
  }
  return std::unique_ptr<StoreCopy>(new StoreCopy(copy.release()));
}

StoreCopy::~StoreCopy() {
  sqlite3_close(_database);
}

std::optional<std::vector<uint32_t>> StoreCopy::documentIDs(TLErrorOut error) {
  std::vector<uint32_t> ids;
  const auto add = [&ids](sqlite3_stmt* row) {
    ids.push_back(static_cast<uint32_t>(sqlite3_column_int64(row, 0)));
  };
  if (!run(_database, "SELECT docid FROM docstore ORDER BY docid;", nullptr, add, error)) {
    return std::nullopt;
  }
  return ids;
}

std::optional<std::string> StoreCopy::vocabulary(TLErrorOut error) {
  std::optional<std::string> found;
  const auto take = [&found](sqlite3_stmt* row) {
    const auto* const bytes = static_cast<const char*>(sqlite3_column_blob(row, 0));
    if (bytes != nullptr) found.emplace(bytes, static_cast<size_t>(sqlite3_column_bytes(row, 0)));
  };
  run(_database, "SELECT vocab FROM topkvocab WHERE id = 1;", nullptr, take, error);
  return found;
}

bool StoreCopy::setVocabulary(std::string_view vocabulary, TLErrorOut error) {
  const auto bind = [vocabulary](sqlite3_stmt* statement) {
    return sqlite3_bind_blob64(statement, 1, vocabulary.data(), vocabulary.size(), SQLITE_STATIC);
  };
  return run(_database, "REPLACE INTO topkvocab (id, vocab) VALUES(1, ?);", bind, nullptr, error);
}

// In the header of SQLite's file format the page size is at 16 and the number of free pages at 36,
// both big-endian.
uint64_t unusedStoreBytes(const std::string& path) {
  constexpr size_t kPageSizeAt = 16;
  constexpr size_t kFreePagesAt = 36;
  constexpr uint64_t kMaxPageBytes = 65536;  // stored as 1
  std::array<char, kFreePagesAt + 4> header{};
  const platform::FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (file.get() < 0 || !platform::readAt(file.get(), 0, header.data(), header.size())) return 0;
  const auto number = [&header](size_t at, size_t bytes) {
    uint64_t value = 0;
    for (size_t i = 0; i < bytes; ++i) value = value << 8 | static_cast<uint8_t>(header[at + i]);
    return value;
  };
  const uint64_t pageSize = number(kPageSizeAt, 2);
  return number(kFreePagesAt, 4) * (pageSize == 1 ? kMaxPageBytes : pageSize);
}
