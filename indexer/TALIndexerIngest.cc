#include <algorithm>
#include <cerrno>
#include <span>
#include <unordered_map>
#include <unordered_set>
#include <utility>

#include "indexer/Snippet.h"
#include "indexer/TALIndexer.h"
#include "indexer/ZoneFilling.h"
#include "platform/Clock.h"
#include "platform/Concurrent.h"
#include "platform/Redaction.h"
#include "platform/Signpost.h"

using platform::MutexLock;
using platform::Signpost;

namespace {

// A document of a batch.
struct PendingDoc {
  TLURL url;
  // The version in the store; then, what will be stored.
  std::shared_ptr<TLIndexableItem> item = nullptr;
  uint32_t docID = 0;
  bool isStored = false;   // a version is in the store
  bool mustIndex = false;  // its text has to be indexed
};

// The store syncs its file for each transaction, and the index rewrites the whole set of deleted
// documents, so this many are deleted together. If the process is killed in between, as many may
// remain in the index without being in the store.
constexpr size_t kDeletedAtATime = 100;

// Sets the plain text and the snippet of one item, and touches nothing else.
void prepareText(TLIndexableItem& item) {
  std::optional<TLString> body;
  const auto& html = item.attributeForKey(TLAttributeKey::HTML_CONTENT_DATA);
  if (html != nullptr && html->hasBytesValue() && !html->bytesValue()->empty()) {
    body = plainTextOfHTML(*html->bytesValue());
    if (body) html->setStringValue(body);
  }
  auto snippet = snippetOfBody(body ? body : item.stringValueForKey(TLAttributeKey::TEXT_CONTENT));
  if (snippet && !snippet->empty()) {
    item.addAttributeWithKeyStringValue(TLAttributeKey::CONTENT_SNIPPET, std::move(snippet));
  }
}

// How log lines describe a document: identifier, bundle, redacted subject, URL.
std::string describe(const TLIndexableItem& doc, const std::string& bundleID,
                     const std::optional<TLURL>& url) {
  return fmt::format("(identifier: {}, bundleID: {}, subject: {}, docURL: {})",
                     platform::printable(doc.identifier()), bundleID,
                     platform::redacted(doc.stringValueForKey(TLAttributeKey::SUBJECT)),
                     url ? url->absoluteString() : "(null)");
}

}  // namespace

struct TALIndexer::Batch {
  std::vector<PendingDoc> docs;   // each URL once, in the order of its first item
  std::vector<size_t> docOfItem;  // for each item, its place in `docs`
  TLDocumentIDs oldDocIDs;

  [[nodiscard]] std::vector<TLURL> urls() const {
    std::vector<TLURL> result;
    result.reserve(docs.size());
    for (const auto& doc : docs) result.push_back(doc.url);
    return result;
  }
};

std::optional<TLURL> TALIndexer::documentURLForIdentifier(const std::optional<TLString>& identifier,
                                                          const std::string& bundleID) {
  if (!identifier || identifier->empty()) return std::nullopt;
  return TLURL::parse("tlw://" + bundleID + "/" + platform::toUTF8(*identifier));
}

void TALIndexer::addDocs(Items docs, std::string bundleID, Completion completionHandler) {
  _scheduleWork(
      "addDocs",
      [this, docs = std::move(docs), bundleID = std::move(bundleID)] {
        std::optional<TLError> error;
        waitForMaintenance();
        {
          MutexLock lock(_indexMutex);
          const uint64_t signpost = Signpost::identifierForObject(&docs);
          Signpost::begin(signpost, "addDocs", "index {} items", docs.size());
          _addDocs(docs, bundleID, &error);
          Signpost::end(signpost, "addDocs", "");
        }
        checkVocabulary();
        return error;
      },
      std::move(completionHandler));
}

void TALIndexer::addDocs(Items docs, Strings deleteItemsByIdentifiers,
                         std::optional<std::string> clientState, TLString clientStateName,
                         std::string bundleID, Completion completionHandler) {
  _scheduleWork(
      "addDocs:deleteDoscsByIdentifiers:clientStates:",
      [this, docs = std::move(docs), identifiers = std::move(deleteItemsByIdentifiers),
       state = std::move(clientState), name = std::move(clientStateName),
       bundleID = std::move(bundleID)] {
        std::optional<TLError> error;
        if (!identifiers.empty()) {
          const uint64_t signpost = Signpost::identifierForObject(&identifiers);
          Signpost::begin(signpost, "deleteItemsByIdentifiers", "delete {} items",
                          identifiers.size());
          _deleteItemsByIdentifiers(identifiers, bundleID, &error);
          Signpost::end(signpost, "deleteItemsByIdentifiers", "");
        }
        if (!error) error = addAndStoreState(docs, state, name, bundleID);
        checkVocabulary();
        return error;
      },
      std::move(completionHandler));
}

std::optional<TLError> TALIndexer::addAndStoreState(const Items& docs,
                                                    const std::optional<std::string>& clientState,
                                                    const TLString& clientStateName,
                                                    const std::string& bundleID) {
  std::optional<TLError> error;
  if (!docs.empty()) waitForMaintenance();
  MutexLock lock(_indexMutex);
  if (!docs.empty()) {
    const uint64_t signpost = Signpost::identifierForObject(&docs);
    Signpost::begin(signpost, "addDocs", "index {} items", docs.size());
    _addDocs(docs, bundleID, &error);
    Signpost::end(signpost, "addDocs", "");
    if (error) return error;
  }
  if (clientState) {
    // A client continues from its state, so everything before it must survive a power loss.
    if (const auto text = _text.get(); text != nullptr && !text->index->Sync()) {
      return platform::posixError(EIO, "the text index cannot be written to the disk");
    }
    log().standard("storing client state name: {} (length {})", platform::toUTF8(clientStateName),
                   clientState->size());
    docStore()->setMetadataValue(*clientState, clientStateKey(clientStateName), &error);
  }
  return error;
}

// Holds no lock, so searches go on meanwhile.
void TALIndexer::waitForMaintenance() {
  if (const auto text = _text.get()) text->index->WaitForMaintenance();
}

bool TALIndexer::_addDocs(const Items& docs, const std::string& bundleID, TLErrorOut error) {
  const uint64_t start = platform::monotonicTicks();
  log().debug("Starting to index {} docs with bundleID: {}", docs.size(), bundleID);
  if (bundleID.empty()) {
    log().error("bundleID not set");
    return true;
  }
  const auto text = _text.get();
  if (_shutdown || text == nullptr || docStore() == nullptr) {
    platform::setError(error, noIndexError());
    return false;
  }
  platform::concurrentApply(docs.size(), [&docs](size_t i) { prepareText(*docs[i]); });

  Batch batch;
  if (!makeDocURLs(docs, bundleID, batch, error)) return false;
  if (!fetchOldDocs(batch, error)) return false;
  mergeDocs(docs, batch);
  if (!storeDocs(batch, error)) return false;
  return indexDocs(*text, bundleID, batch, start, error);
}

bool TALIndexer::makeDocURLs(const Items& docs, const std::string& bundleID, Batch& batch,
                             TLErrorOut error) {
  std::unordered_map<TLURL, size_t> places;
  batch.docs.reserve(docs.size());
  batch.docOfItem.reserve(docs.size());
  for (const auto& doc : docs) {
    auto url = documentURLForIdentifier(doc->identifier(), bundleID);
    if (!url) {
      log().error("Aborting indexing of {} docs as invalid docURL generated for doc {}",
                  docs.size(), describe(*doc, bundleID, url));
      _errorWithCode(TALIndexerError::document, "document has no identifier", error);
      return false;
    }
    const auto [place, isNew] = places.emplace(*url, batch.docs.size());
    if (isNew) batch.docs.push_back({.url = std::move(*url)});
    batch.docOfItem.push_back(place->second);
  }
  return true;
}

bool TALIndexer::fetchOldDocs(Batch& batch, TLErrorOut error) {
  const uint64_t start = platform::monotonicTicks();
  std::optional<TLError> failure;
  auto stored = docStore()->documentsWithURLs(batch.urls(), &failure, &batch.oldDocIDs);
  if (failure) {
    log().error(
        "Aborting indexing of {} docs as failed to fetch old documents from docstore with error: "
        "{}",
        batch.docOfItem.size(), platform::printable(failure));
    platform::setError(error, *failure);
    return false;
  }
  for (auto& doc : batch.docs) {
    const auto found = stored.find(doc.url);
    if (found == stored.end()) continue;
    doc.isStored = true;
    doc.item = std::move(found->second);
  }
  log().debug("Fetched {} old docs, queried {} docURLs in docstore in time: {} ms", stored.size(),
              batch.docOfItem.size(), elapsedMillisSinceMonotonicTime(start));
  return true;
}

void TALIndexer::mergeDocs(const Items& docs, Batch& batch) {
  const uint64_t start = platform::monotonicTicks();
  int merges = 0;
  for (size_t i = 0; i < docs.size(); ++i) {
    PendingDoc& doc = batch.docs[batch.docOfItem[i]];
    if (doc.item == nullptr && !doc.isStored) {
      doc.item = docs[i];
      doc.mustIndex = true;
      continue;
    }
    bool shouldIndexNewDoc = false;
    doc.item = _zoneManager.mergeNewDoc(*docs[i], doc.item.get(), &shouldIndexNewDoc);
    if (shouldIndexNewDoc) doc.mustIndex = true;
    ++merges;
  }
  log().debug("Checked merging for {} docs and merged {} docs in time: {} ms", docs.size(), merges,
              elapsedMillisSinceMonotonicTime(start));
}

bool TALIndexer::storeDocs(Batch& batch, TLErrorOut error) {
  if (!writeDocs(batch, error)) {
    _docDates.forgetAll();
    return false;
  }
  for (const auto& doc : batch.docs) {
    if (doc.docID == 0) continue;
    _docDates.set(doc.docID, doc.item->doubleValueForKey(TLAttributeKey::MAIL_DATE_RECEIVED));
  }
  return true;
}

bool TALIndexer::writeDocs(Batch& batch, TLErrorOut error) {
  const uint64_t start = platform::monotonicTicks();
  TLDocumentBatch docsToUpdate;
  TLDocumentBatch docsToInsert;
  TLDocumentIDs newDocIDs;
  for (const auto& doc : batch.docs) {
    (doc.isStored ? docsToUpdate : docsToInsert).emplace_back(doc.url, doc.item);
  }
  // A failed commit is reported through the error only.
  std::optional<TLError> failure;
  const bool updated =
      docsToUpdate.empty() ||
      docStore()->storeOrUpdateDocuments(docsToUpdate, batch.oldDocIDs, &newDocIDs, &failure);
  if (!updated || failure) {
    log().error(
        "Aborting indexing of {} docs as failed to update {} docs in docstore with error: {}",
        batch.docOfItem.size(), docsToUpdate.size(), platform::printable(failure));
    platform::setError(error, failure.value_or(TLError{kDocStoreErrorDomain, 0, ""}));
    return false;
  }
  const bool inserted = docsToInsert.empty() ||
                        docStore()->storeOrUpdateDocuments(docsToInsert, &newDocIDs, &failure);
  if (!inserted || failure) {
    log().error(
        "Aborting indexing of {} docs as failed to store {} new docs in docstore with error: {}",
        batch.docOfItem.size(), docsToInsert.size(), platform::printable(failure));
    platform::setError(error, failure.value_or(TLError{kDocStoreErrorDomain, 0, ""}));
    return false;
  }
  for (auto& doc : batch.docs) {
    if (const auto found = newDocIDs.find(doc.url); found != newDocIDs.end())
      doc.docID = found->second;
  }
  log().debug("Inserted {} new docs and updated {} old docs in docstore in time: {} ms",
              docsToInsert.size(), docsToUpdate.size(), elapsedMillisSinceMonotonicTime(start));
  return true;
}

bool TALIndexer::indexDocs(const OpenText& text, const std::string& bundleID, Batch& batch,
                           uint64_t batchStart, TLErrorOut error) {
  const uint64_t start = platform::monotonicTicks();
  uint64_t textStoreMillis = 0;
  int64_t indexed = 0;
  auto remaining = std::ranges::count_if(batch.docs, &PendingDoc::mustIndex);
  for (auto& doc : batch.docs) {
    if (!doc.mustIndex) continue;
    --remaining;
    if (doc.docID == 0) {
      log().fault(
          "Skipping indexing of doc with docURL: {} as failed to retrieve its internal docID",
          doc.url.absoluteString());
      continue;
    }
    if (doc.item == nullptr) {
      log().fault("Skipping indexing of doc with docURL: {} as failed to retrieve merged doc",
                  doc.url.absoluteString());
      continue;
    }
    uint64_t docParsingTime = 0;
    if (!_indexDoc(*text.index, *doc.item, doc.docID, &docParsingTime)) {
      log().error("Failed to index document in salt {}", describe(*doc.item, bundleID, doc.url));
      const TLError failure = _errorWithCode(TALIndexerError::document, "index failed", error);
      log().error(
          "Indexed {} docs in SALT, aborting indexing of remaining {} docs due to error: {}",
          indexed, remaining - indexed, platform::printable(failure));
      return false;
    }
    if (text.vocab != nullptr && text.vocab->maxDocID() < doc.docID) {
      text.vocab->setMaxDocID(doc.docID);
    }
    doc.item.reset();
    textStoreMillis += docParsingTime;
    ++indexed;
  }
  log().standard("Indexed {} docs in time: {} ms (indexing time: {} ms, textstore time: {} ms)",
                 indexed, elapsedMillisSinceMonotonicTime(batchStart),
                 elapsedMillisSinceMonotonicTime(start), textStoreMillis);
  return true;
}

bool TALIndexer::_indexDoc(salt::Index& index, const TLIndexableItem& doc, uint32_t docID,
                           uint64_t* docParsingTime) {
  zone::Zones zones;
  populateZones(zones, doc, _zoneManager, tk.get());
  const uint64_t start = platform::monotonicTicks();
  for (auto& [zoneID, zone] : zones) {
    if (zone.text.empty() || zone.offsets.empty()) continue;
    // AddZone may change the offsets; this is their last use.
    if (!index.AddZone(docID, zoneID, zone.text, zone.offsets, true)) return false;
  }
  *docParsingTime = elapsedMillisSinceMonotonicTime(start);
  return true;
}

void TALIndexer::deleteItemsByIdentifiers(Strings identifiers, std::string bundleID,
                                          Completion completionHandler) {
  _scheduleWork(
      "deleteItemsByIdentifiers",
      [this, identifiers = std::move(identifiers), bundleID = std::move(bundleID)] {
        std::optional<TLError> error;
        const uint64_t signpost = Signpost::identifierForObject(this);
        Signpost::begin(signpost, "deleteItemsByIdentifiers", "delete {} items",
                        identifiers.size());
        _deleteItemsByIdentifiers(identifiers, bundleID, &error);
        Signpost::end(signpost, "deleteItemsByIdentifiers", "");
        return error;
      },
      std::move(completionHandler));
}

bool TALIndexer::_deleteItemsByIdentifiers(const Strings& identifiers, const std::string& bundleID,
                                           TLErrorOut error) {
  if (bundleID.empty()) {
    log().error("bundleID not set");
    return true;
  }
  const std::span<const TLString> all(identifiers);
  for (size_t at = 0; at < all.size(); at += kDeletedAtATime) {
    MutexLock lock(_indexMutex);
    std::optional<TLError> unknown;
    const auto docIDs =
        storedIDs(all.subspan(at, std::min(kDeletedAtATime, all.size() - at)), bundleID, &unknown);
    std::optional<TLError> failure;
    if (const auto failed = deleteDocs(docIDs, &failure)) {
      log().error("Failed to delete document with ID {} in docstore: {}", *failed,
                  platform::printable(failure));
    } else {
      failure = unknown;
    }
    if (failure) {
      platform::setError(error, *failure);
      return false;
    }
  }
  return true;
}

std::vector<uint32_t> TALIndexer::storedIDs(std::span<const TLString> identifiers,
                                            const std::string& bundleID, TLErrorOut error) {
  std::vector<uint32_t> docIDs;
  for (const TLString& identifier : identifiers) {
    const auto url = documentURLForIdentifier(identifier, bundleID);
    const std::string shown = url ? url->absoluteString() : "(null)";
    std::optional<TLError> failure;
    const uint32_t docID = url ? docStore()->documentIDWithURL(*url, &failure) : 0;
    const bool repeated = std::find(docIDs.begin(), docIDs.end(), docID) != docIDs.end();
    if (!failure && (docID == 0 || repeated)) {
      failure = TLError{kDocStoreErrorDomain, static_cast<int>(TALDocStoreError::notFound),
                        "no document with URL " + shown};
    }
    if (failure) {
      log().error("Failed to fetch document ID in docstore for URL {}: {}", shown,
                  platform::printable(failure));
      platform::setError(error, *failure);
      break;
    }
    docIDs.push_back(docID);
  }
  return docIDs;
}

std::optional<uint32_t> TALIndexer::deleteDocs(std::span<const uint32_t> docIDs, TLErrorOut error) {
  while (!docIDs.empty()) {
    const auto piece = docIDs.first(std::min(kDeletedAtATime, docIDs.size()));
    if (const auto failed = deleteTogether({piece.begin(), piece.end()}, error)) return failed;
    docIDs = docIDs.subspan(piece.size());
  }
  return std::nullopt;
}

std::optional<uint32_t> TALIndexer::deleteTogether(std::vector<uint32_t> docIDs, TLErrorOut error) {
  const auto store = docStore();
  for (const uint32_t docID : docIDs) _docDates.forget(docID);
  std::optional<uint32_t> failed;
  if (!store->deleteDocuments(docIDs, nullptr)) {
    // One by one, so that those before the one that fails are deleted.
    const auto end = std::find_if_not(docIDs.begin(), docIDs.end(), [&](uint32_t docID) {
      return store->deleteDocument(docID, error);
    });
    if (end != docIDs.end()) failed = *end;
    docIDs.erase(end, docIDs.end());
  }
  // A document that is still in the index but no longer in the store is not a result.
  const auto text = _text.get();
  if (text != nullptr && !docIDs.empty()) text->index->DeleteDocs(docIDs);
  return failed;
}

void TALIndexer::deleteItemsByDomainIdentifiers(Strings domainIdentifiers,
                                                Completion completionHandler) {
  _scheduleWork(
      "deleteItemsByDomainIdentifiers",
      [this, domains = std::move(domainIdentifiers)] {
        std::optional<TLError> error;
        MutexLock lock(_indexMutex);
        const uint64_t signpost = Signpost::identifierForObject(this);
        Signpost::begin(signpost, "deleteItemsByDomainIdentifiers", "delete {} domains",
                        domains.size());
        _deleteItemsByDomainIdentifier(domains, &error);
        Signpost::end(signpost, "deleteItemsByDomainIdentifiers", "");
        return error;
      },
      std::move(completionHandler));
}

// Scans the store once for all domains.
bool TALIndexer::_deleteItemsByDomainIdentifier(const Strings& domains, TLErrorOut error) {
  const std::unordered_set<TLString> wanted(domains.begin(), domains.end());
  std::vector<uint32_t> found;
  const auto store = docStore();
  store->enumerateDocIDs(error, [&](int64_t, uint32_t docID, const TLURL&, bool*, TLErrorOut) {
    const auto doc = store->documentWithID(docID, nullptr);
    if (doc == nullptr || !doc->domainIdentifier()) return;
    if (wanted.contains(*doc->domainIdentifier())) found.push_back(docID);
  });
  std::optional<TLError> failure;
  const auto failed = deleteDocs(found, &failure);
  if (!failed) return true;
  log().error("Failed to delete document with doc ID {} in docstore: {}", *failed,
              platform::printable(failure));
  if (failure) platform::setError(error, *failure);
  return false;
}
