#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "platform/TLError.h"
#include "platform/URL.h"
#include "records/TLAttributeKey.h"
#include "records/TLIndexableItem.h"

// Documents to store, in the order in which they get their IDs. Each URL occurs once.
using TLDocumentBatch = std::vector<std::pair<TLURL, std::shared_ptr<TLIndexableItem>>>;

// The document IDs of URLs.
using TLDocumentIDs = std::unordered_map<TLURL, uint32_t>;

// The document store of an indexer: gives each document its ID (0 is none), maps IDs to URLs and
// back, keeps a retained copy of each item, and holds metadata and the top-K vocabulary.
//
// Threads: any operation may be called on any thread at any time; each is atomic, except that
// enumerateDocIDs is atomic page by page. A store that is not open answers reads with null or 0 and
// writes with false, and sets an error with code 1001.
//
// Errors have the domain "DocStore" and the code of the SQL engine. Reads return null or 0 both for
// absent data and on failure, and most do not set the error; writes return false.
//
// The indexer does not call urlWithID, documentWithURL, vacuumWithError, countWithoutDocBlob,
// countWithoutHtmlBlob, storePath and retainedAttributes. They are for tools that inspect a store.
class TALDocStore {
 public:
  // Called for each document of an enumeration with its running index from 0, its ID and URL, a
  // flag that ends the enumeration when set, and the error pointer of the enumeration. May call the
  // store.
  using DocIDHandler = std::function<void(int64_t index, uint32_t docID, const TLURL& url,
                                          bool* stop, TLErrorOut error)>;

  virtual ~TALDocStore() = default;

  // Opens or creates the store; call it once. Documents stored by another version of the software
  // are discarded; the metadata and the top-K vocabulary are kept.
  virtual bool openWithError(TLErrorOut error) = 0;
  virtual bool openWithError(TLErrorOut error, const std::string& version) = 0;
  // Waits for the running operation. Permanent: from now on the top-K operations do nothing.
  virtual void close() = 0;

  [[nodiscard]] virtual std::optional<std::string> metadataValueForKey(const std::string& key,
                                                                       TLErrorOut error) = 0;
  virtual bool setMetadataValue(const std::string& value, const std::string& forKey,
                                TLErrorOut error) = 0;

  [[nodiscard]] virtual uint32_t documentIDWithURL(const TLURL& url, TLErrorOut error) = 0;
  [[nodiscard]] virtual std::optional<TLURL> urlWithID(uint32_t docID, TLErrorOut error) = 0;

  // The caller owns the items. A damaged item is logged and returned as far as it can be read.
  [[nodiscard]] virtual std::shared_ptr<TLIndexableItem> documentWithID(uint32_t docID,
                                                                        TLErrorOut error) = 0;
  // Absent IDs have no entry.
  [[nodiscard]] virtual std::unordered_map<uint32_t, std::shared_ptr<TLIndexableItem>>
  documentsWithIDs(const std::vector<uint32_t>& docIDs, TLErrorOut error) = 0;
  [[nodiscard]] virtual std::shared_ptr<TLIndexableItem> documentWithURL(const TLURL& url,
                                                                         TLErrorOut error) = 0;
  // `docID` may be null; it is written only if the document is found.
  [[nodiscard]] virtual std::shared_ptr<TLIndexableItem> documentWithURL(const TLURL& url,
                                                                         TLErrorOut error,
                                                                         uint32_t* docID) = 0;
  // `docIDs` may be null; it receives the ID of every document found. A URL of more than 100,000
  // characters ends the look-up with the results of the batches before it.
  [[nodiscard]] virtual std::unordered_map<TLURL, std::shared_ptr<TLIndexableItem>>
  documentsWithURLs(const std::vector<TLURL>& urls, TLErrorOut error, TLDocumentIDs* docIDs) = 0;

  // All documents, newest first. Always returns true, even if a failed read ended the enumeration.
  // Documents stored or deleted meanwhile may or may not be included.
  virtual bool enumerateDocIDs(TLErrorOut error, const DocIDHandler& withHandler) = 0;

  // Inserts new documents in one transaction; a URL that is already stored fails the batch.
  // `newIDs` may be null; it receives the IDs, and after a failure still holds those set before.
  // Also true if only the commit failed, which sets the error.
  virtual bool storeOrUpdateDocuments(const TLDocumentBatch& documents, TLDocumentIDs* newIDs,
                                      TLErrorOut error) = 0;
  // Replaces the items of stored documents at the IDs given for their URLs; otherwise like above. A
  // URL without an ID in `atDocIDs` fails the batch with code 4.
  virtual bool storeOrUpdateDocuments(const TLDocumentBatch& documents,
                                      const TLDocumentIDs& atDocIDs, TLDocumentIDs* newIDs,
                                      TLErrorOut error) = 0;
  // Also true for an ID without a document.
  virtual bool deleteDocument(uint32_t docID, TLErrorOut error) = 0;
  // The same of several, all or none, in one transaction: each transaction waits for the disk.
  virtual bool deleteDocuments(const std::vector<uint32_t>& docIDs, TLErrorOut error) = 0;

  // Returns free space to the file system. Always returns true.
  virtual bool vacuumWithError(TLErrorOut error) = 0;
  // Removes everything except the version; the next document gets ID 1.
  virtual bool resetWithError(TLErrorOut error) = 0;

  // Number of distinct URLs: all, those without an item, those without an HTML body.
  [[nodiscard]] virtual int64_t count(TLErrorOut error) = 0;
  [[nodiscard]] virtual int64_t countWithoutDocBlob(TLErrorOut error) = 0;
  [[nodiscard]] virtual int64_t countWithoutHtmlBlob(TLErrorOut error) = 0;

  // The serialised top-K vocabulary. Both operations do nothing after the store is closed.
  virtual void storeTopKVocab(const std::string& vocab, TLErrorOut error) = 0;
  [[nodiscard]] virtual std::optional<std::string> loadTopKVocab(TLErrorOut error) = 0;

  [[nodiscard]] virtual const std::string& storePath() const = 0;
  // The keys of the attributes kept in the retained copy of an item.
  [[nodiscard]] virtual const std::set<TLAttributeKey>& retainedAttributes() const = 0;
};
