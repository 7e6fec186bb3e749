#pragma once

#include <sqlite3.h>

#include <string>
#include <string_view>

#include "docstore/TALSqliteDocStore.h"

// Helpers for the sources of TALSqliteDocStore, on top of sqlite3.h.

namespace docstore {

// Number of URLs in one execution of the look-up by URL.
inline constexpr int kURLsPerStatement = 64;

}  // namespace docstore

// One execution of a prepared statement, from its binds to its reset. Bound text and blobs are not
// copied and must outlive the steps. After a failed bind every step fails.
class TALSqliteDocStore::Use {
 public:
  explicit Use(sqlite3_stmt* statement) : _statement(statement) {}
  explicit Use(const Statement& statement) : _statement(statement.get()) {}
  ~Use() {
    sqlite3_reset(_statement);
    // A statement that could not be prepared is null, which all other functions take.
    if (_statement != nullptr) sqlite3_clear_bindings(_statement);
  }
  Use(const Use&) = delete;
  Use& operator=(const Use&) = delete;

  Use& bindText(int index, std::string_view text) {
    return check(sqlite3_bind_text64(_statement, index, text.data(), text.size(), SQLITE_STATIC,
                                     SQLITE_UTF8));
  }
  Use& bindText(int index, std::string&& text) = delete;
  Use& bindBlob(int index, std::string_view bytes) {
    return check(sqlite3_bind_blob64(_statement, index, bytes.data(), bytes.size(), SQLITE_STATIC));
  }
  Use& bindInt(int index, int64_t value) {
    return check(sqlite3_bind_int64(_statement, index, value));
  }

  // SQLITE_ROW, SQLITE_DONE or an error code.
  int step() { return _bound == SQLITE_OK ? sqlite3_step(_statement) : _bound; }

  [[nodiscard]] uint32_t columnID(int column) const {
    return static_cast<uint32_t>(sqlite3_column_int(_statement, column));
  }
  [[nodiscard]] int64_t columnInt(int column) const {
    return sqlite3_column_int64(_statement, column);
  }
  // The bytes of a text column; empty for NULL.
  [[nodiscard]] std::string columnText(int column) const {
    const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(_statement, column));
    const int length = sqlite3_column_bytes(_statement, column);
    return text != nullptr ? std::string(text, static_cast<size_t>(length)) : std::string();
  }
  // The bytes of a blob column, valid until the next step; empty for NULL.
  [[nodiscard]] std::string_view columnBlob(int column) const {
    const auto* blob = static_cast<const char*>(sqlite3_column_blob(_statement, column));
    const int length = sqlite3_column_bytes(_statement, column);
    return blob != nullptr ? std::string_view(blob, static_cast<size_t>(length))
                           : std::string_view();
  }

 private:
  Use& check(int code) {
    if (code != SQLITE_OK) _bound = code;
    return *this;
  }

  sqlite3_stmt* const _statement;
  int _bound = SQLITE_OK;
};
