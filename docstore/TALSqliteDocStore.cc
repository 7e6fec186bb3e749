#include "docstore/TALSqliteDocStore.h"

#include <sqlite3.h>

#include "docstore/Statement.h"
#include "platform/Files.h"
#include "records/TLErrorCodes.h"

namespace {

constexpr const char* kVersion = "v0.4";
constexpr const char* kVersionKey = "version";
constexpr const char* kInMemory = ":memory:";

std::string documentWithURLQuery() {
  std::string placeholders = "?";
  for (int i = 1; i < docstore::kURLsPerStatement; ++i) placeholders += ",?";
  return fmt::format("SELECT doc, docid, url FROM docstore WHERE url IN ({}) ORDER BY docid DESC;",
                     placeholders);
}

std::string printableText(const std::optional<std::string>& text) {
  return text.value_or("(null)");
}

}  // namespace

void TALSqliteDocStore::Finalizer::operator()(sqlite3_stmt* statement) const {
  sqlite3_finalize(statement);
}

const platform::Log& TALSqliteDocStore::log() {
  static constexpr platform::Log handle(platform::kSubsystem, "TALSqliteDocStore");
  return handle;
}

TALSqliteDocStore::TALSqliteDocStore(std::string storePath)
    : _storePath(std::move(storePath)), _retainedAttributes{TLAttributeKey::SUBJECT,
                                                            TLAttributeKey::MAIL_DATE_RECEIVED,
                                                            TLAttributeKey::CONTENT_CREATION_DATE,
                                                            TLAttributeKey::AUTHORS,
                                                            TLAttributeKey::RECIPIENTS,
                                                            TLAttributeKey::CONTENT_SNIPPET} {}

TALSqliteDocStore::~TALSqliteDocStore() {
  TALSqliteDocStore::close();
}

// --- Opening and closing

bool TALSqliteDocStore::openWithError(TLErrorOut error) {
  return openWithError(error, kVersion);
}

bool TALSqliteDocStore::openWithError(TLErrorOut error, const std::string& version) {
  const platform::MutexLock lock(_mutex);
  TL_ASSERT(_database == nullptr);
  if (!_openConnection(error)) return false;
  if (_createTables(version, error)) {
    _buildStatementMap();
    std::optional<TLError> failure;
    if (_initStatementsWithError(&failure)) return true;
    log().error("Failed to initialize statements: {}", platform::printable(failure));
    platform::setError(error, *failure);
  }
  _closeConnection();
  return false;
}

bool TALSqliteDocStore::_openConnection(TLErrorOut error) {
  const size_t slash = _storePath.rfind('/');
  if (_storePath != kInMemory && slash != std::string::npos && slash > 0 &&
      !platform::fileExists(_storePath)) {
    const std::string directory = _storePath.substr(0, slash);
    std::optional<TLError> failure;
    if (!platform::createDirectories(directory, &failure)) {
      log().error("Could not create intermediate directory {}: {}", directory,
                  platform::printable(failure));
      if (failure) platform::setError(error, *failure);
      return false;
    }
  }
  const int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_FULLMUTEX;
  const int code = sqlite3_open_v2(_storePath.c_str(), &_database, flags, nullptr);
  if (code != SQLITE_OK) {
    log().error("Failed to open database with error code {}", code);
    platform::setError(error, {kDocStoreErrorDomain, code, sqlite3_errstr(code)});
    sqlite3_close(_database);
    _database = nullptr;
    return false;
  }
  // The SQL of a reset uses double-quoted string literals.
  sqlite3_db_config(_database, SQLITE_DBCONFIG_DQS_DML, 1, nullptr);
  const int wal = sqlite3_exec(_database, "pragma journal_mode=wal;", nullptr, nullptr, nullptr);
  if (wal != SQLITE_OK) log().error("Failed to set journal mode WAL with error code {}", wal);
  return true;
}

bool TALSqliteDocStore::_createTables(const std::string& version, TLErrorOut error) {
  if (!_executeQuery("CREATE TABLE IF NOT EXISTS metadata (key TEXT PRIMARY KEY, value BLOB);",
                     error)) {
    return false;
  }
  std::optional<TLError> failure;
  const auto stored = _metadataValueForKey(kVersionKey, &failure);
  if (failure) {
    log().error("Unable to fetch version: {}", platform::printable(failure));
    platform::setError(error, *failure);
    return false;
  }
  if (stored != version && !_dropDocuments(stored, version, error)) return false;
  return _executeQuery(
             "CREATE TABLE IF NOT EXISTS docstore (docid INTEGER PRIMARY KEY AUTOINCREMENT, url "
             "TEXT UNIQUE, doc BLOB, html BLOB);",
             error) &&
         _executeQuery("CREATE INDEX IF NOT EXISTS idx_docstore_url ON docstore(url, docid);",
                       error) &&
         _executeQuery("CREATE TABLE IF NOT EXISTS topkvocab (id INTEGER PRIMARY KEY, vocab BLOB);",
                       error);
}

bool TALSqliteDocStore::_dropDocuments(const std::optional<std::string>& stored,
                                       const std::string& version, TLErrorOut error) {
  log().standard("On disk docstore's version ({}) is incompatible with the new software ({}).",
                 printableText(stored), version);
  log().standard("Dropping docstore url index.");
  if (!_executeQuery("DROP INDEX IF EXISTS idx_docstore_url;", error)) return false;
  log().standard("Dropping docstore table.");
  return _executeQuery("DROP TABLE IF EXISTS docstore;", error) &&
         _setMetadataValue(version, kVersionKey, error);
}

void TALSqliteDocStore::close() {
  _shutdown = true;
  const platform::MutexLock lock(_mutex);
  if (_database == nullptr) return;
  log().standard("Closing database connection");
  const int code = _closeConnection();
  if (code == SQLITE_OK) {
    log().standard("Closed database connection");
  } else {
    log().error("Failed to close database (error code {}): {}", code,
                platform::printable(_lastSqliteErrorWithError(nullptr)));
  }
}

int TALSqliteDocStore::_closeConnection() {
  _finalizeStatements();
  const int code = sqlite3_close(_database);
  if (code == SQLITE_OK) _database = nullptr;
  return code;
}

// --- Statements

void TALSqliteDocStore::_buildStatementMap() {
  _statementMap.clear();
  const auto add = [this](Statement& slot, std::string query)
                       TL_REQUIRES(_mutex) { _statementMap.emplace_back(&slot, std::move(query)); };
  add(_documentIDWithURLStmt, "SELECT MAX(docid) FROM docstore WHERE url = (?);");
  add(_urlWithIDStmt, "SELECT url FROM docstore WHERE docid = (?);");
  add(_documentWithIDStmt, "SELECT doc FROM docstore WHERE docid = (?) LIMIT 1;");
  add(_documentWithURLStmt, documentWithURLQuery());
  add(_enumerateDocIDsStmt,
      "SELECT docid, url FROM docstore WHERE docid < (?) ORDER BY docid DESC LIMIT (?);");
  add(_storeOrUpdateDocumentStmt, "INSERT INTO docstore(doc, url) VALUES(?, ?);");
  add(_storeOrUpdateDocumentAtDocIDStmt, "UPDATE docstore SET doc = (?) WHERE docid = (?);");
  add(_deleteDocumentStmt, "DELETE FROM docstore WHERE docid = (?);");
  add(_countStmt, "SELECT COUNT(DISTINCT url) FROM docstore;");
  add(_countNoDocStmt, "SELECT COUNT(DISTINCT url) FROM docstore WHERE doc is NULL;");
  add(_countNoHtmlStmt, "SELECT COUNT(DISTINCT url) FROM docstore WHERE html is NULL;");
  add(_beginTransactionStmt, "BEGIN IMMEDIATE;");
  add(_commitStmt, "COMMIT;");
  add(_rollbackStmt, "ROLLBACK;");
  add(_storeTopKVocabStmt, "REPLACE INTO topkvocab (id, vocab) VALUES(1, ?);");
  add(_loadTopKVocabStmt, "SELECT vocab from topkvocab WHERE id = 1;");
}

// Prepares all statements or none.
bool TALSqliteDocStore::_initStatementsWithError(TLErrorOut error) {
  for (auto& [slot, query] : _statementMap) {
    *slot = _prepare(query, error, "statement for query");
    if (*slot == nullptr) {
      _finalizeStatements();
      return false;
    }
  }
  return true;
}

void TALSqliteDocStore::_finalizeStatements() {
  for (auto& [slot, query] : _statementMap) slot->reset();
}

bool TALSqliteDocStore::_ready(TLErrorOut error) {
  if (_database == nullptr) {
    _lastSqliteErrorWithError(error);
    return false;
  }
  return _beginTransactionStmt != nullptr || _initStatementsWithError(error);
}

TALSqliteDocStore::Statement TALSqliteDocStore::_prepare(const std::string& query, TLErrorOut error,
                                                         const char* what) {
  sqlite3_stmt* statement = nullptr;
  if (sqlite3_prepare_v2(_database, query.c_str(), -1, &statement, nullptr) != SQLITE_OK) {
    log().error("Unable to prepare {} {}: {}", what, query,
                platform::printable(_lastSqliteErrorWithError(error)));
  }
  return Statement(statement);
}

TLError TALSqliteDocStore::_lastSqliteErrorWithError(TLErrorOut error) {
  if (_database == nullptr)
    return _errorWithCode(static_cast<int>(TALDocStoreError::noConnection), error);
  TLError result{kDocStoreErrorDomain, sqlite3_errcode(_database), sqlite3_errmsg(_database)};
  platform::setError(error, result);
  return result;
}

TLError TALSqliteDocStore::_errorWithCode(int code, TLErrorOut error) {
  TLError result{kDocStoreErrorDomain, code, ""};
  platform::setError(error, result);
  return result;
}

bool TALSqliteDocStore::_executeQuery(const std::string& query, TLErrorOut error) {
  const Statement statement = _prepare(query, error);
  if (statement == nullptr) return false;
  Use use(statement);
  if (use.step() == SQLITE_DONE) return true;
  log().error("Unable to step statement  {}: {}", query,
              platform::printable(_lastSqliteErrorWithError(error)));
  return false;
}

bool TALSqliteDocStore::_executeStmt(sqlite3_stmt* statement, TLErrorOut error) {
  Use use(statement);
  if (use.step() == SQLITE_DONE) return true;
  log().error("Unable to step statement: {}",
              platform::printable(_lastSqliteErrorWithError(error)));
  return false;
}

bool TALSqliteDocStore::_beginTransaction(TLErrorOut error) {
  std::optional<TLError> failure;
  if (_executeStmt(_beginTransactionStmt.get(), &failure)) return true;
  log().error("Unable to begin immediate transaction: {}", platform::printable(failure));
  platform::setError(error, *failure);
  _rollback();
  return false;
}

bool TALSqliteDocStore::_commit(TLErrorOut error) {
  std::optional<TLError> failure;
  if (_executeStmt(_commitStmt.get(), &failure)) return true;
  log().error("Unable to commit transaction: {}", platform::printable(failure));
  platform::setError(error, *failure);
  _rollback();
  return false;
}

void TALSqliteDocStore::_rollback() {
  std::optional<TLError> failure;
  if (!_executeStmt(_rollbackStmt.get(), &failure)) {
    log().error("Unable to rollback transaction after commit failed: {}",
                platform::printable(failure));
  }
}

// --- Metadata

std::optional<std::string> TALSqliteDocStore::metadataValueForKey(const std::string& key,
                                                                  TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  if (!_ready(error)) return std::nullopt;
  return _metadataValueForKey(key, error);
}

bool TALSqliteDocStore::setMetadataValue(const std::string& value, const std::string& forKey,
                                         TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  return _ready(error) && _setMetadataValue(value, forKey, error);
}

std::optional<std::string> TALSqliteDocStore::_metadataValueForKey(const std::string& key,
                                                                   TLErrorOut error) {
  log().debug("metadataValueForKey for key {}", key);
  const std::string query = "SELECT value FROM metadata WHERE key = (?);";
  const Statement statement = _prepare(query, error);
  if (statement == nullptr) return std::nullopt;
  Use use(statement);
  const int code = use.bindText(1, key).step();
  if (code == SQLITE_ROW) return use.columnText(0);
  if (code != SQLITE_DONE) {
    log().error("Unable to prepare statement {}: {}", query,
                platform::printable(_lastSqliteErrorWithError(error)));
  }
  return std::nullopt;
}

// The value is bound as text whatever its bytes, because text is its storage class on disk.
bool TALSqliteDocStore::_setMetadataValue(const std::string& value, const std::string& forKey,
                                          TLErrorOut error) {
  log().debug("setMetadataValue for key {}", forKey);
  const Statement statement = _prepare("REPLACE INTO metadata (key, value) VALUES(?, ?);", error);
  if (statement == nullptr) return false;
  Use use(statement);
  if (use.bindText(1, forKey).bindText(2, value).step() == SQLITE_DONE) return true;
  log().error("Unable to set value for key {}: {}", forKey,
              platform::printable(_lastSqliteErrorWithError(error)));
  return false;
}

// --- Maintenance

bool TALSqliteDocStore::vacuumWithError(TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  if (_ready(error)) _vacuum(error);
  return true;
}

// SQLite cannot vacuum while statements are open.
void TALSqliteDocStore::_vacuum(TLErrorOut error) {
  _finalizeStatements();
  _executeQuery("VACUUM;", error);
  _initStatementsWithError(error);
}

bool TALSqliteDocStore::resetWithError(TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  const bool done =
      _ready(error) && _executeQuery("DELETE FROM docstore;", error) &&
      _executeQuery("DELETE FROM sqlite_sequence WHERE name = \"docstore\";", error) &&
      _executeQuery(fmt::format("DELETE FROM metadata WHERE key <> \"{}\";", kVersionKey), error) &&
      _executeQuery("DELETE FROM topkvocab;", error);
  if (done) _vacuum(error);
  return done;
}

// --- Top-K vocabulary

void TALSqliteDocStore::storeTopKVocab(const std::string& vocab, TLErrorOut error) {
  log().debug("Starting to store TopK vocab.");
  const platform::MutexLock lock(_mutex);
  if (_shutdown || _storeTopKVocabStmt == nullptr) return;
  Use use(_storeTopKVocabStmt);
  if (use.bindBlob(1, vocab).step() == SQLITE_DONE) {
    log().debug("Successfully stored TopK vocab.");
  } else {
    _lastSqliteErrorWithError(error);
  }
}

std::optional<std::string> TALSqliteDocStore::loadTopKVocab(TLErrorOut error) {
  log().debug("Starting to load TopK vocab.");
  const platform::MutexLock lock(_mutex);
  if (_shutdown || _loadTopKVocabStmt == nullptr) return std::nullopt;
  Use use(_loadTopKVocabStmt);
  const int code = use.step();
  if (code == SQLITE_ROW) {
    log().debug("Successfully loaded TopK vocab.");
    return std::string(use.columnBlob(0));
  }
  if (code == SQLITE_DONE) {
    log().debug("No data loaded from table topkvocab");
  } else {
    log().debug("Error loading data from table topkvocab: {}",
                platform::printable(_lastSqliteErrorWithError(error)));
  }
  return std::nullopt;
}
