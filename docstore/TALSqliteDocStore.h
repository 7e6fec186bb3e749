#pragma once

#include <atomic>
#include <memory>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "docstore/TALDocStore.h"
#include "platform/Log.h"
#include "platform/Mutex.h"

struct sqlite3;
struct sqlite3_stmt;

// The document store in one SQLite database in WAL mode.
//
// Tables: `docstore` with an ID, a unique URL and the retained copy of the item in wire form
// (identifier, domainIdentifier, expirationDate and the retained attributes; the column `html` is
// never written); `metadata` with byte values by key, among them "version"; `topkvocab` with at
// most one row.
//
// Threads: one mutex guards the connection and its prepared statements, and every operation holds
// it from its first bind to its last reset. enumerateDocIDs holds it page by page, and never while
// the handler runs.
class TALSqliteDocStore final : public TALDocStore {
 public:
  // A file, or ":memory:".
  explicit TALSqliteDocStore(std::string storePath);
  // Closes the store.
  ~TALSqliteDocStore() override;
  TALSqliteDocStore(const TALSqliteDocStore&) = delete;
  TALSqliteDocStore& operator=(const TALSqliteDocStore&) = delete;

  bool openWithError(TLErrorOut error) override;
  bool openWithError(TLErrorOut error, const std::string& version) override;
  void close() override;
  std::optional<std::string> metadataValueForKey(const std::string& key, TLErrorOut error) override;
  bool setMetadataValue(const std::string& value, const std::string& forKey,
                        TLErrorOut error) override;
  uint32_t documentIDWithURL(const TLURL& url, TLErrorOut error) override;
  std::optional<TLURL> urlWithID(uint32_t docID, TLErrorOut error) override;
  std::shared_ptr<TLIndexableItem> documentWithID(uint32_t docID, TLErrorOut error) override;
  std::unordered_map<uint32_t, std::shared_ptr<TLIndexableItem>> documentsWithIDs(
      const std::vector<uint32_t>& docIDs, TLErrorOut error) override;
  std::shared_ptr<TLIndexableItem> documentWithURL(const TLURL& url, TLErrorOut error) override;
  std::shared_ptr<TLIndexableItem> documentWithURL(const TLURL& url, TLErrorOut error,
                                                   uint32_t* docID) override;
  std::unordered_map<TLURL, std::shared_ptr<TLIndexableItem>> documentsWithURLs(
      const std::vector<TLURL>& urls, TLErrorOut error, TLDocumentIDs* docIDs) override;
  bool enumerateDocIDs(TLErrorOut error, const DocIDHandler& withHandler) override;
  bool storeOrUpdateDocuments(const TLDocumentBatch& documents, TLDocumentIDs* newIDs,
                              TLErrorOut error) override;
  bool storeOrUpdateDocuments(const TLDocumentBatch& documents, const TLDocumentIDs& atDocIDs,
                              TLDocumentIDs* newIDs, TLErrorOut error) override;
  bool deleteDocument(uint32_t docID, TLErrorOut error) override;
  bool deleteDocuments(const std::vector<uint32_t>& docIDs, TLErrorOut error) override;
  bool vacuumWithError(TLErrorOut error) override;
  bool resetWithError(TLErrorOut error) override;
  int64_t count(TLErrorOut error) override;
  int64_t countWithoutDocBlob(TLErrorOut error) override;
  int64_t countWithoutHtmlBlob(TLErrorOut error) override;
  void storeTopKVocab(const std::string& vocab, TLErrorOut error) override;
  std::optional<std::string> loadTopKVocab(TLErrorOut error) override;
  const std::string& storePath() const override { return _storePath; }
  const std::set<TLAttributeKey>& retainedAttributes() const override {
    return _retainedAttributes;
  }

  static const platform::Log& log();

 private:
  struct Finalizer {
    void operator()(sqlite3_stmt* statement) const;
  };
  using Statement = std::unique_ptr<sqlite3_stmt, Finalizer>;
  using ItemsByID = std::unordered_map<uint32_t, std::shared_ptr<TLIndexableItem>>;
  using ItemsByURL = std::unordered_map<TLURL, std::shared_ptr<TLIndexableItem>>;
  class Use;

  // Connection and statements.
  bool _openConnection(TLErrorOut error) TL_REQUIRES(_mutex);
  bool _createTables(const std::string& version, TLErrorOut error) TL_REQUIRES(_mutex);
  bool _dropDocuments(const std::optional<std::string>& stored, const std::string& version,
                      TLErrorOut error) TL_REQUIRES(_mutex);
  // Returns the result of SQLite; after a failure the connection stays.
  int _closeConnection() TL_REQUIRES(_mutex);
  void _buildStatementMap() TL_REQUIRES(_mutex);
  bool _initStatementsWithError(TLErrorOut error) TL_REQUIRES(_mutex);
  void _finalizeStatements() TL_REQUIRES(_mutex);
  // True if the statements are usable; prepares them if a vacuum could not.
  bool _ready(TLErrorOut error) TL_REQUIRES(_mutex);
  // Null after a failure, which is logged as "Unable to prepare WHAT QUERY: ERROR".
  Statement _prepare(const std::string& query, TLErrorOut error, const char* what = "statement")
      TL_REQUIRES(_mutex);

  // Both store the error through the pointer unless it is null, and return it for the log.
  TLError _lastSqliteErrorWithError(TLErrorOut error) TL_REQUIRES(_mutex);
  static TLError _errorWithCode(int code, TLErrorOut error);

  bool _executeQuery(const std::string& query, TLErrorOut error) TL_REQUIRES(_mutex);
  bool _executeStmt(sqlite3_stmt* statement, TLErrorOut error) TL_REQUIRES(_mutex);
  bool _beginTransaction(TLErrorOut error) TL_REQUIRES(_mutex);
  bool _commit(TLErrorOut error) TL_REQUIRES(_mutex);
  void _rollback() TL_REQUIRES(_mutex);
  void _vacuum(TLErrorOut error) TL_REQUIRES(_mutex);
  std::optional<std::string> _metadataValueForKey(const std::string& key, TLErrorOut error)
      TL_REQUIRES(_mutex);
  bool _setMetadataValue(const std::string& value, const std::string& forKey, TLErrorOut error)
      TL_REQUIRES(_mutex);

  // Documents. Binds the retained copy of the item; `buffer` holds its bytes and must live until
  // the step.
  void _serializeDoc(const TLIndexableItem& document, Use& statement, int docIndex,
                     std::string& buffer) const;
  // The item in column 0 of the statement's current row.
  static std::shared_ptr<TLIndexableItem> _deserializeDocWithStatement(const Use& statement);
  bool _documentsWithIDs(const uint32_t* docIDs, size_t count, ItemsByID& itemMap, TLErrorOut error)
      TL_REQUIRES(_mutex);
  void _documentsWithURLs(const TLURL* urls, size_t count, ItemsByURL& itemMap,
                          TLDocumentIDs* docIDs) TL_REQUIRES(_mutex);
  // The new document's ID, or 0.
  uint32_t _storeOrUpdateDocumentAtURL(const TLIndexableItem& document, const TLURL& atURL,
                                       TLErrorOut error) TL_REQUIRES(_mutex);
  // The given ID, or 0.
  uint32_t _storeOrUpdateDocumentAtDocID(const TLIndexableItem& document, uint32_t atDocID,
                                         TLErrorOut error) TL_REQUIRES(_mutex);
  bool _deleteDocument(uint32_t docID, TLErrorOut error) TL_REQUIRES(_mutex);
  // The number of rows in the page below the cursor; 0 for a buffer size below 1, -1 on failure.
  int _listDocIDsWithBuffer(std::vector<uint32_t>& docIDs, std::vector<std::string>& docURLs,
                            int bufferSize, uint32_t cursor, TLErrorOut error) TL_REQUIRES(_mutex);
  int64_t _countWithError(TLErrorOut error, Statement TALSqliteDocStore::*statement);

  const std::string _storePath;
  const std::set<TLAttributeKey> _retainedAttributes;
  // Set by close, never cleared.
  std::atomic<bool> _shutdown = false;

  platform::Mutex _mutex;
  sqlite3* _database TL_GUARDED_BY(_mutex) = nullptr;
  Statement _documentIDWithURLStmt TL_GUARDED_BY(_mutex);
  Statement _urlWithIDStmt TL_GUARDED_BY(_mutex);
  Statement _documentWithIDStmt TL_GUARDED_BY(_mutex);
  Statement _documentWithURLStmt TL_GUARDED_BY(_mutex);
  Statement _enumerateDocIDsStmt TL_GUARDED_BY(_mutex);
  Statement _storeOrUpdateDocumentStmt TL_GUARDED_BY(_mutex);
  Statement _storeOrUpdateDocumentAtDocIDStmt TL_GUARDED_BY(_mutex);
  Statement _deleteDocumentStmt TL_GUARDED_BY(_mutex);
  Statement _countStmt TL_GUARDED_BY(_mutex);
  Statement _countNoDocStmt TL_GUARDED_BY(_mutex);
  Statement _countNoHtmlStmt TL_GUARDED_BY(_mutex);
  Statement _beginTransactionStmt TL_GUARDED_BY(_mutex);
  Statement _commitStmt TL_GUARDED_BY(_mutex);
  Statement _rollbackStmt TL_GUARDED_BY(_mutex);
  Statement _storeTopKVocabStmt TL_GUARDED_BY(_mutex);
  Statement _loadTopKVocabStmt TL_GUARDED_BY(_mutex);
  // The statements above with their SQL text.
  std::vector<std::pair<Statement*, std::string>> _statementMap TL_GUARDED_BY(_mutex);
};
