#include "sync/Database.h"

#include <sqlite3.h>

namespace mailsync {

namespace {

// How long a reader or writer waits for another process.
constexpr int kBusyMilliseconds = 10000;

}  // namespace

void Statement::Finalizer::operator()(sqlite3_stmt* statement) const {
  sqlite3_finalize(statement);
}

Statement::Statement(Database& database, const char* text) : _database(&database) {
  sqlite3_stmt* statement = nullptr;
  const int code = sqlite3_prepare_v3(database._database, text, -1, SQLITE_PREPARE_PERSISTENT,
                                      &statement, nullptr);
  if (code != SQLITE_OK) database.noteFailure();
  _statement.reset(statement);
}

Statement& Statement::bind(int64_t value) {
  sqlite3_bind_int64(_statement.get(), ++_bound, value);
  return *this;
}

Statement& Statement::bindText(std::string_view value) {
  sqlite3_bind_text64(_statement.get(), ++_bound, value.data(), value.size(), SQLITE_STATIC,
                      SQLITE_UTF8);
  return *this;
}

Statement& Statement::bindBytes(std::string_view value) {
  // A null pointer would be NULL and not an empty blob.
  sqlite3_bind_blob64(_statement.get(), ++_bound, value.empty() ? "" : value.data(), value.size(),
                      SQLITE_STATIC);
  return *this;
}

bool Statement::step() {
  const int code = sqlite3_step(_statement.get());
  if (code != SQLITE_ROW && code != SQLITE_DONE) _database->noteFailure();
  return code == SQLITE_ROW;
}

bool Statement::run() {
  while (step()) {
  }
  reset();
  return !_database->failure().has_value();
}

void Statement::reset() {
  sqlite3_reset(_statement.get());
  // A statement that could not be prepared is null, which all other functions take.
  if (_statement != nullptr) sqlite3_clear_bindings(_statement.get());
  _bound = 0;
}

int64_t Statement::number(int column) const {
  return sqlite3_column_int64(_statement.get(), column);
}

std::string Statement::text(int column) const {
  const auto* bytes = static_cast<const char*>(sqlite3_column_blob(_statement.get(), column));
  const auto size = static_cast<size_t>(sqlite3_column_bytes(_statement.get(), column));
  return bytes == nullptr ? std::string() : std::string(bytes, size);
}

std::unique_ptr<Database> Database::open(const std::string& path, TLErrorOut error) {
  sqlite3* handle = nullptr;
  const int code =
      sqlite3_open_v2(path.c_str(), &handle, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, nullptr);
  std::unique_ptr<Database> database(new Database(handle));
  if (code != SQLITE_OK) {
    database->noteFailure();
  } else {
    sqlite3_busy_timeout(handle, kBusyMilliseconds);
    if (database->execute("PRAGMA journal_mode=WAL; PRAGMA synchronous=NORMAL;")) return database;
  }
  platform::setError(error, *database->failure());
  return nullptr;
}

Database::~Database() {
  sqlite3_close_v2(_database);
}

bool Database::execute(const char* text) {
  if (sqlite3_exec(_database, text, nullptr, nullptr, nullptr) == SQLITE_OK) return true;
  noteFailure();
  return false;
}

void Database::noteFailure() {
  if (_failure) return;
  _failure = TLError{kCatalogueDomain, sqlite3_extended_errcode(_database),
                     std::string("the catalogue: ") + sqlite3_errmsg(_database)};
}

int64_t Database::lastInsertedID() const {
  return sqlite3_last_insert_rowid(_database);
}

}  // namespace mailsync
