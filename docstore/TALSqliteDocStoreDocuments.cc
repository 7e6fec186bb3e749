// Documents of TALSqliteDocStore: look-ups, storing, enumeration and counts.

#include <sqlite3.h>

#include <algorithm>
#include <unordered_set>

#include "docstore/Statement.h"
#include "docstore/TALSqliteDocStore.h"
#include "platform/Assert.h"

namespace {

// Upper bound of the total length of the URLs in one execution of the look-up by URL.
constexpr size_t kBatchLength = 100000;

// IDs are part of the SQL text, so the limit on parameters does not apply.
constexpr size_t kIDsPerStatement = 10000;

// Number of rows in one page of an enumeration.
constexpr int kPageSize = 1024;

constexpr int kDocumentIDMismatch = 4;

}  // namespace

// --- The retained copy

void TALSqliteDocStore::_serializeDoc(const TLIndexableItem& document, Use& statement, int docIndex,
                                      std::string& buffer) const {
  TLIndexableItem retained;
  retained.setIdentifier(document.identifier());
  retained.setDomainIdentifier(document.domainIdentifier());
  if (document.hasExpirationDate()) retained.setExpirationDate(document.expirationDate());
  for (const auto& attribute : document.attributes()) {
    // Shared, not copied: the retained item exists only to be written.
    if (_retainedAttributes.contains(attribute->key())) retained.addAttributes(attribute);
  }
  buffer = retained.data();
  statement.bindBlob(docIndex, buffer);
}

std::shared_ptr<TLIndexableItem> TALSqliteDocStore::_deserializeDocWithStatement(
    const Use& statement) {
  auto item = std::make_shared<TLIndexableItem>();
  if (item->initWithWrittenData(statement.columnBlob(0))) return item;
  item = std::make_shared<TLIndexableItem>();
  if (!item->initWithData(statement.columnBlob(0))) log().error("A stored document is damaged");
  return item;
}

// --- Look-ups

uint32_t TALSqliteDocStore::documentIDWithURL(const TLURL& url, TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  if (!_ready(error)) return 0;
  Use use(_documentIDWithURLStmt);
  if (use.bindText(1, url.absoluteString()).step() == SQLITE_ROW) return use.columnID(0);
  _lastSqliteErrorWithError(error);
  return 0;
}

std::optional<TLURL> TALSqliteDocStore::urlWithID(uint32_t docID, TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  if (!_ready(error)) return std::nullopt;
  Use use(_urlWithIDStmt);
  if (use.bindInt(1, docID).step() != SQLITE_ROW) return std::nullopt;
  return TLURL::parse(use.columnText(0));
}

std::shared_ptr<TLIndexableItem> TALSqliteDocStore::documentWithID(uint32_t docID,
                                                                   TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  if (!_ready(error)) return nullptr;
  Use use(_documentWithIDStmt);
  if (use.bindInt(1, docID).step() != SQLITE_ROW) return nullptr;
  return _deserializeDocWithStatement(use);
}

std::unordered_map<uint32_t, std::shared_ptr<TLIndexableItem>> TALSqliteDocStore::documentsWithIDs(
    const std::vector<uint32_t>& docIDs, TLErrorOut error) {
  ItemsByID items;
  const platform::MutexLock lock(_mutex);
  if (!_ready(error)) return items;
  items.reserve(docIDs.size());
  for (size_t start = 0; start < docIDs.size(); start += kIDsPerStatement) {
    const size_t count = std::min(kIDsPerStatement, docIDs.size() - start);
    _documentsWithIDs(docIDs.data() + start, count, items, error);
  }
  return items;
}

bool TALSqliteDocStore::_documentsWithIDs(const uint32_t* docIDs, size_t count, ItemsByID& itemMap,
                                          TLErrorOut error) {
  const Statement statement = _prepare(
      fmt::format("SELECT doc, docid FROM docstore WHERE docid IN ({}) ORDER BY docid ASC;",
                  fmt::join(docIDs, docIDs + count, ",")),
      error);
  if (statement == nullptr) return false;
  Use use(statement);
  while (use.step() == SQLITE_ROW) itemMap[use.columnID(1)] = _deserializeDocWithStatement(use);
  return true;
}

std::shared_ptr<TLIndexableItem> TALSqliteDocStore::documentWithURL(const TLURL& url,
                                                                    TLErrorOut error) {
  return documentWithURL(url, error, nullptr);
}

std::shared_ptr<TLIndexableItem> TALSqliteDocStore::documentWithURL(const TLURL& url,
                                                                    TLErrorOut error,
                                                                    uint32_t* docID) {
  TLDocumentIDs ids;
  const auto items = documentsWithURLs({url}, error, &ids);
  const auto found = items.find(url);
  if (found == items.end()) return nullptr;
  if (docID != nullptr) *docID = ids.at(url);
  return found->second;
}

std::unordered_map<TLURL, std::shared_ptr<TLIndexableItem>> TALSqliteDocStore::documentsWithURLs(
    const std::vector<TLURL>& urls, TLErrorOut error, TLDocumentIDs* docIDs) {
  ItemsByURL items;
  const platform::MutexLock lock(_mutex);
  if (!_ready(error)) return items;
  for (size_t start = 0, count = 0; start < urls.size(); start += count) {
    count = 0;
    for (size_t length = 0; count < docstore::kURLsPerStatement && start + count < urls.size();
         ++count) {
      length += urls[start + count].absoluteString().size();
      if (length > kBatchLength) break;
    }
    if (count == 0) break;
    _documentsWithURLs(urls.data() + start, count, items, docIDs);
  }
  return items;
}

void TALSqliteDocStore::_documentsWithURLs(const TLURL* urls, size_t count, ItemsByURL& itemMap,
                                           TLDocumentIDs* docIDs) {
  Use use(_documentWithURLStmt);
  for (size_t i = 0; i < docstore::kURLsPerStatement; ++i) {
    const auto text = i < count ? std::string_view(urls[i].absoluteString()) : std::string_view("");
    use.bindText(static_cast<int>(i) + 1, text);
  }
  while (use.step() == SQLITE_ROW) {
    const auto url = TLURL::parse(use.columnText(2));
    if (!url || itemMap.contains(*url)) continue;
    itemMap.emplace(*url, _deserializeDocWithStatement(use));
    if (docIDs != nullptr) (*docIDs)[*url] = use.columnID(1);
  }
}

// --- Storing

bool TALSqliteDocStore::storeOrUpdateDocuments(const TLDocumentBatch& documents,
                                               TLDocumentIDs* newIDs, TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  if (!_ready(error) || !_beginTransaction(error)) return false;
  for (const auto& [url, document] : documents) {
    TL_ASSERT(document != nullptr);
    std::optional<TLError> failure;
    const uint32_t docID = _storeOrUpdateDocumentAtURL(*document, url, &failure);
    if (docID == 0) {
      log().error("Unable to store or update document: {}", platform::printable(failure));
      if (failure) platform::setError(error, *failure);
      _rollback();
      return false;
    }
    if (newIDs != nullptr) (*newIDs)[url] = docID;
  }
  _commit(error);
  return true;
}

uint32_t TALSqliteDocStore::_storeOrUpdateDocumentAtURL(const TLIndexableItem& document,
                                                        const TLURL& atURL, TLErrorOut error) {
  std::string buffer;
  Use use(_storeOrUpdateDocumentStmt);
  _serializeDoc(document, use, 1, buffer);
  if (use.bindText(2, atURL.absoluteString()).step() != SQLITE_DONE) {
    _lastSqliteErrorWithError(error);
    return 0;
  }
  return static_cast<uint32_t>(sqlite3_last_insert_rowid(_database));
}

bool TALSqliteDocStore::storeOrUpdateDocuments(const TLDocumentBatch& documents,
                                               const TLDocumentIDs& atDocIDs, TLDocumentIDs* newIDs,
                                               TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  if (!_ready(error) || !_beginTransaction(error)) return false;
  for (const auto& [url, document] : documents) {
    TL_ASSERT(document != nullptr);
    const auto given = atDocIDs.find(url);
    std::optional<TLError> failure;
    const uint32_t docID = given != atDocIDs.end()
                               ? _storeOrUpdateDocumentAtDocID(*document, given->second, &failure)
                               : 0;
    if (docID == 0 || docID != given->second) {
      if (!failure) failure = _errorWithCode(kDocumentIDMismatch, nullptr);
      platform::setError(error, *failure);
      _rollback();
      return false;
    }
    if (newIDs != nullptr) (*newIDs)[url] = docID;
  }
  _commit(error);
  return true;
}

uint32_t TALSqliteDocStore::_storeOrUpdateDocumentAtDocID(const TLIndexableItem& document,
                                                          uint32_t atDocID, TLErrorOut error) {
  std::string buffer;
  Use use(_storeOrUpdateDocumentAtDocIDStmt);
  _serializeDoc(document, use, 1, buffer);
  if (use.bindInt(2, atDocID).step() == SQLITE_DONE) return atDocID;
  log().error("Unable to commit {}", platform::printable(_lastSqliteErrorWithError(error)));
  return 0;
}

bool TALSqliteDocStore::deleteDocument(uint32_t docID, TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  return _ready(error) && _deleteDocument(docID, error);
}

bool TALSqliteDocStore::deleteDocuments(const std::vector<uint32_t>& docIDs, TLErrorOut error) {
  const platform::MutexLock lock(_mutex);
  if (!_ready(error) || !_beginTransaction(error)) return false;
  for (const uint32_t docID : docIDs) {
    if (_deleteDocument(docID, error)) continue;
    _rollback();
    return false;
  }
  return _commit(error);
}

bool TALSqliteDocStore::_deleteDocument(uint32_t docID, TLErrorOut error) {
  Use use(_deleteDocumentStmt);
  if (use.bindInt(1, docID).step() == SQLITE_DONE) return true;
  log().error("Unable to commit {}", platform::printable(_lastSqliteErrorWithError(error)));
  return false;
}

// --- Enumeration and counts

bool TALSqliteDocStore::enumerateDocIDs(TLErrorOut error, const DocIDHandler& withHandler) {
  std::vector<uint32_t> docIDs;
  std::vector<std::string> docURLs;
  docIDs.reserve(kPageSize);
  docURLs.reserve(kPageSize);
  std::unordered_set<TLURL> seen;
  uint32_t cursor = 0x7FFFFFFF;
  int64_t index = 0;
  bool stop = false;
  int rows = 0;
  do {
    {
      const platform::MutexLock lock(_mutex);
      rows = _ready(error) ? _listDocIDsWithBuffer(docIDs, docURLs, kPageSize, cursor, error) : 0;
    }
    for (size_t i = 0; rows > 0 && i < docIDs.size() && !stop; ++i) {
      cursor = docIDs[i];
      const auto url = TLURL::parse(std::move(docURLs[i]));
      if (!url || seen.contains(*url)) continue;
      withHandler(index++, cursor, *url, &stop, error);
      if (!stop) seen.insert(*url);
    }
  } while (!stop && rows > kPageSize - 1);
  return true;
}

int TALSqliteDocStore::_listDocIDsWithBuffer(std::vector<uint32_t>& docIDs,
                                             std::vector<std::string>& docURLs, int bufferSize,
                                             uint32_t cursor, TLErrorOut error) {
  docIDs.clear();
  docURLs.clear();
  if (bufferSize < 1) return 0;
  Use use(_enumerateDocIDsStmt);
  use.bindInt(1, cursor).bindInt(2, bufferSize);
  int code = use.step();
  for (; code == SQLITE_ROW; code = use.step()) {
    docIDs.push_back(use.columnID(0));
    docURLs.push_back(use.columnText(1));
  }
  if (code != SQLITE_DONE) {
    log().error("Unable to step with statement: {}",
                platform::printable(_lastSqliteErrorWithError(error)));
    return -1;
  }
  return static_cast<int>(docIDs.size());
}

int64_t TALSqliteDocStore::count(TLErrorOut error) {
  return _countWithError(error, &TALSqliteDocStore::_countStmt);
}

int64_t TALSqliteDocStore::countWithoutDocBlob(TLErrorOut error) {
  return _countWithError(error, &TALSqliteDocStore::_countNoDocStmt);
}

int64_t TALSqliteDocStore::countWithoutHtmlBlob(TLErrorOut error) {
  return _countWithError(error, &TALSqliteDocStore::_countNoHtmlStmt);
}

int64_t TALSqliteDocStore::_countWithError(TLErrorOut, Statement TALSqliteDocStore::*statement) {
  const platform::MutexLock lock(_mutex);
  if (!_ready(nullptr)) return 0;
  Use use(this->*statement);
  return use.step() == SQLITE_ROW ? use.columnInt(0) : 0;
}
