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

// Documents to store, in the order in which they get their IDs. A URL stands in it once.
using TLDocumentBatch = std::vector<std::pair<TLURL, std::shared_ptr<TLIndexableItem>>>;

// The document IDs of URLs.
using TLDocumentIDs = std::unordered_map<TLURL, uint32_t>;

// The durable side table of an indexer: gives each document its ID (0 is none), maps IDs to URLs
// and back, keeps a small retained copy of each item, and holds metadata and the top-K vocabulary.
//
// Threads: any operation may be called on any thread at any time; each is atomic with regard to the
// others, save that enumerateDocIDs is so page by page. A store that is not open answers reads with
// null or 0 and writes with false and an error of code 1001.
//
// Errors have the domain "DocStore" and the code of the SQL engine. Reads give null or 0 both for
// what is absent and after a failure, and most leave the error untouched; writes give false.
class TALDocStore {
 public:
  // Called for a document of an enumeration: its running index from 0, its ID and URL, a flag that
  // ends the walk when set, and the error pointer of the enumeration. May call the store.
  using DocIDHandler = std::function<void(int64_t index, uint32_t docID, const TLURL& url,
                                          bool* stop, TLErrorOut error)>;

  virtual ~TALDocStore() = default;

  // Opens the store, empty if need be, once. Documents that another version of the software stored
  // are thrown away; the metadata and the top-K vocabulary stay.
  virtual bool openWithError(TLErrorOut error) = 0;
  virtual bool openWithError(TLErrorOut error, const std::string& version) = 0;
  // Waits for an operation that runs. For good: the top-K operations do nothing from now on.
  virtual void close() = 0;

  [[nodiscard]] virtual std::optional<std::string> metadataValueForKey(const std::string& key,
                                                                       TLErrorOut error) = 0;
  virtual bool setMetadataValue(const std::string& value, const std::string& forKey,
                                TLErrorOut error) = 0;

  [[nodiscard]] virtual uint32_t documentIDWithURL(const TLURL& url, TLErrorOut error) = 0;
  [[nodiscard]] virtual std::optional<TLURL> urlWithID(uint32_t docID, TLErrorOut error) = 0;

  // Items belong to the caller. A stored item that is damaged is logged and comes as far as it can
  // be read.
  [[nodiscard]] virtual std::shared_ptr<TLIndexableItem> documentWithID(uint32_t docID,
                                                                        TLErrorOut error) = 0;
  // Absent IDs have no entry.
  [[nodiscard]] virtual std::unordered_map<uint32_t, std::shared_ptr<TLIndexableItem>>
  documentsWithIDs(const std::vector<uint32_t>& docIDs, TLErrorOut error) = 0;
  [[nodiscard]] virtual std::shared_ptr<TLIndexableItem> documentWithURL(const TLURL& url,
                                                                         TLErrorOut error) = 0;
  // `docID` may be null and is written only when the document is found.
  [[nodiscard]] virtual std::shared_ptr<TLIndexableItem> documentWithURL(const TLURL& url,
                                                                         TLErrorOut error,
                                                                         uint32_t* docID) = 0;
  // `docIDs` may be null; it receives the ID of every document that is found. A URL of more than
  // 100,000 characters ends the look-up with what was found before the batch that it would begin.
  [[nodiscard]] virtual std::unordered_map<TLURL, std::shared_ptr<TLIndexableItem>>
  documentsWithURLs(const std::vector<TLURL>& urls, TLErrorOut error, TLDocumentIDs* docIDs) = 0;

  // All documents, newest first. Always true, also when a failed read ended the walk. Documents
  // stored or deleted meanwhile may or may not come.
  virtual bool enumerateDocIDs(TLErrorOut error, const DocIDHandler& withHandler) = 0;

  // Inserts new documents in one transaction; a URL that the store has already fails the batch.
  // `newIDs` may be null, receives the IDs, and after a failure still holds those set before it.
  // True also when only the commit failed, which the error tells.
  virtual bool storeOrUpdateDocuments(const TLDocumentBatch& documents, TLDocumentIDs* newIDs,
                                      TLErrorOut error) = 0;
  // Replaces the items of documents that the store has, at the IDs given for their URLs; the same
  // otherwise. A URL without an ID in `atDocIDs` fails the batch with code 4.
  virtual bool storeOrUpdateDocuments(const TLDocumentBatch& documents,
                                      const TLDocumentIDs& atDocIDs, TLDocumentIDs* newIDs,
                                      TLErrorOut error) = 0;
  // True also for an ID that has no document.
  virtual bool deleteDocument(uint32_t docID, TLErrorOut error) = 0;

  // Gives free space back to the file system. Always true.
  virtual bool vacuumWithError(TLErrorOut error) = 0;
  // Forgets everything but the version; the next document gets ID 1.
  virtual bool resetWithError(TLErrorOut error) = 0;

  // Numbers of distinct URLs: all, those without an item, those without an HTML body.
  [[nodiscard]] virtual int64_t count(TLErrorOut error) = 0;
  [[nodiscard]] virtual int64_t countWithoutDocBlob(TLErrorOut error) = 0;
  [[nodiscard]] virtual int64_t countWithoutHtmlBlob(TLErrorOut error) = 0;

  // The one serialised top-K vocabulary. Both do nothing once the store is closed.
  virtual void storeTopKVocab(const std::string& vocab, TLErrorOut error) = 0;
  [[nodiscard]] virtual std::optional<std::string> loadTopKVocab(TLErrorOut error) = 0;

  [[nodiscard]] virtual const std::string& storePath() const = 0;
  // Keys of the attributes that the retained copy of an item keeps.
  [[nodiscard]] virtual const std::set<TLAttributeKey>& retainedAttributes() const = 0;
};
