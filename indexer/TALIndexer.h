#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "docstore/TALDocStore.h"
#include "indexer/DocDates.h"
#include "indexer/OpenText.h"
#include "indexer/WordReplacement.h"
#include "modification/TALStemRewrite.h"
#include "modification/TALSynonyms.h"
#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/Queue.h"
#include "platform/TLError.h"
#include "query/TALQueryProcessor.h"
#include "records/TLErrorCodes.h"
#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"
#include "salt/Index.h"
#include "salt/Search.h"
#include "tokenizer/Tokenizer.h"
#include "zones/TALZoneManager.h"

// Indexes and searches the documents of one protection class: owns its text index and its document
// store, and performs all work that changes them.
//
// Threads. Adds, deletes, reset and vacuum run one after another on the indexer's own queue; the
// functions that start them return at once, may be called on any thread, and call their completion
// on the queue. Searches, statistics and the client state run on the caller's thread. The
// destructor waits for queued work, so it must not run on the queue.
//
// Invariants.
// 1. The text index is opened and closed with `_indexMutex` held, by work on `_queue` and at the
//    end of a shutdown. A reader takes a reference from `_text`, which keeps the index open.
// 2. A search holds `_indexMutex` for one pass, and a batch for all its documents, so they never
//    overlap. Query modification between two passes reads the index concurrently with batches.
// 3. The document store is written before the text index. A result that is not in the store is
//    dropped.
// 4. After `shutdown` no work runs: work that is queued or submitted later completes with
//    "shutting down".
class TALIndexer {
 public:
  using Items = std::vector<std::shared_ptr<TLIndexableItem>>;
  using Strings = std::vector<TLString>;
  using Completion = std::function<void(const std::optional<TLError>&)>;

  // Opens or creates the text index in the directory `path`, and reads the synonyms. The store must
  // be open. Never fails: problems are logged, and an indexer without an index or tokenizer reports
  // this at each call. See `openingError`.
  TALIndexer(std::string path, const std::string& protectionClass,
             std::shared_ptr<TALDocStore> docStore, std::string synonymFilePath);
  ~TALIndexer();
  TALIndexer(const TALIndexer&) = delete;
  TALIndexer& operator=(const TALIndexer&) = delete;

  // Adds documents. They can be found once the completion is called without an error. If the text
  // index fails during a batch, the batch is stored, and the documents from the failure on can be
  // found only after they are sent again.
  void addDocs(Items docs, std::string bundleID, Completion completionHandler);
  // Deletes first, then adds, then stores the client state; each step only if all before it
  // succeeded.
  void addDocs(Items docs, Strings deleteItemsByIdentifiers, std::optional<std::string> clientState,
               TLString clientStateName, std::string bundleID, Completion completionHandler);
  // An unknown identifier ends the operation with an error; earlier deletions remain.
  void deleteItemsByIdentifiers(Strings identifiers, std::string bundleID,
                                Completion completionHandler);
  void deleteItemsByDomainIdentifiers(Strings domainIdentifiers, Completion completionHandler);

  // Removes all documents and all client states.
  void resetWithCompletionHandler(Completion completionHandler);
  void saltVacuumAndCompactWithCompletionHandler(Completion completionHandler);

  // Rebuilds the vocabulary in the background. The handler runs on the vocabulary's queue and must
  // not wait for the indexer; without a vocabulary it is not called.
  void forceRebuildTopKVocabWithCompletionHandler(Completion completionHandler);
  // The vocabulary, most frequent word first; null if there is none.
  [[nodiscard]] std::shared_ptr<const TALTopKVocab::Words> topKVocabulary();
  // The vocabulary, reloaded from the store.
  std::shared_ptr<const TALTopKVocab::Words> loadTopKVocabFromDocStore(TLErrorOut error);

  // Passes the bytes stored under a client's name to the handler, nullopt if there are none.
  // Synchronous.
  void fetchLastClientStateforName(
      const TLString& name,
      const std::function<void(const std::optional<std::string>&, const std::optional<TLError>&)>&
          completionHandler);

  // 18 statistics by key; null without index or store. Reads all stored text.
  [[nodiscard]] nlohmann::json docStats();
  // The metrics of the text index as text; empty without an index. Reads all stored text.
  [[nodiscard]] std::string saltMetrics();

  // Ranked items, at most "salt.maxTopK", each with its card. Writes the resolved parameters into
  // the query. On failure the result is empty and the error is set. If the words as typed find no
  // more than "queryModification.sufficentRetrievalThreshold" items, the query is modified, and the
  // results are those of the modified words, if any.
  //
  // Returns the best `maxItems`. `count` and `replaced` may be null: they receive how many items
  // were ranked, and the words that were replaced for these results.
  [[nodiscard]] Items search(TLQuery& query, TLErrorOut error, size_t maxItems = SIZE_MAX,
                             size_t* count = nullptr, WordReplacements* replaced = nullptr);

  // Every stored document whose subject is one of `subjects`, in the store's order and without
  // scores; nullopt with an error when the store fails. Reads every document.
  [[nodiscard]] std::optional<Items> iterateAllDocsToFindMatchingSubjects(const Strings& subjects,
                                                                          TLErrorOut error);

  // Refuses further work, waits for running work, closes index and store. Not from the indexer's
  // queue.
  void shutdown();

  // Why there is no open text index; nullopt if there is one. The files are unchanged: the next
  // add, or a new indexer, tries again.
  [[nodiscard]] std::optional<TLError> openingError();

  [[nodiscard]] const std::string& path() const { return _path; }
  [[nodiscard]] std::shared_ptr<TALDocStore> docStore() const;

  // The key of a document in the store; nullopt for an empty identifier or one that does not form a
  // valid URL.
  [[nodiscard]] static std::optional<TLURL> documentURLForIdentifier(
      const std::optional<TLString>& identifier, const std::string& bundleID);

  // True when there are at most `threshold` results; a negative threshold counts as huge.
  [[nodiscard]] static bool _notSufficientRetrieval(size_t results, int64_t threshold);
  [[nodiscard]] static bool _shouldRunQueryModification(size_t results, int64_t retrievalThreshold);

  // -1, 0 or 1; also 1 if either is NaN.
  [[nodiscard]] static int _floatCompare(float a, float b);
  // 0 for a document up to a day old, falling to -1 at about 366 days. Seconds since 1970.
  [[nodiscard]] static double _computeFreshnessPenalty(double documentTime, double queryTime);

  static const platform::Log& log();

 private:
  using Task = std::function<std::optional<TLError>()>;

  // The working data of one batch.
  struct Batch;

  void _init() TL_REQUIRES(_indexMutex);
  // Makes the class start empty because its index is damaged.
  bool setTextStoreAside(TLErrorOut error) TL_REQUIRES(_indexMutex);
  // Whether the store has no documents; nullopt with an error if it cannot be read.
  std::optional<bool> storeIsEmpty(int64_t* stored, TLErrorOut error);
  // False if the system refuses to open or create the index; `_openingError` then has the reason.
  bool openTextStore(int64_t storedDocuments) TL_REQUIRES(_indexMutex);
  std::unique_ptr<salt::Index> loadTextStore(TLErrorOut error) TL_REQUIRES(_indexMutex);
  std::unique_ptr<salt::Index> createTextStore(int64_t storedDocuments, TLErrorOut error)
      TL_REQUIRES(_indexMutex);
  void makeQueryObjects();
  // Waits for all readers of the index, including a count of the vocabulary.
  void closeTextStore() TL_REQUIRES(_indexMutex);
  std::shared_ptr<TALTopKVocab> topKVocab();
  // Starts a rebuild of the vocabulary if enough documents were added. On `_queue`.
  void checkVocabulary();

  void _scheduleWork(std::string name, Task task, Completion completionHandler);
  std::optional<TLError> runWork(const Task& task);
  bool _resetWithError(TLErrorOut error) TL_REQUIRES(_indexMutex);
  bool _resetSALT(TLErrorOut error) TL_REQUIRES(_indexMutex);
  // The key of a client's state in the store's metadata.
  static std::string clientStateKey(const TLString& name);
  static TLError _errorWithCode(TALIndexerError code, const char* message, TLErrorOut error);
  // The error of a call that needs the index when there is none.
  [[nodiscard]] TLError noIndexError() const TL_REQUIRES(_indexMutex);

  // Backpressure: waits while the text index is busy with a merge or compaction. On `_queue`.
  void waitForMaintenance() TL_EXCLUDES(_indexMutex);
  bool _addDocs(const Items& docs, const std::string& bundleID, TLErrorOut error)
      TL_REQUIRES(_indexMutex);
  bool makeDocURLs(const Items& docs, const std::string& bundleID, Batch& batch, TLErrorOut error);
  bool fetchOldDocs(Batch& batch, TLErrorOut error);
  void mergeDocs(const Items& docs, Batch& batch);
  bool storeDocs(Batch& batch, TLErrorOut error) TL_REQUIRES(_indexMutex);
  bool writeDocs(Batch& batch, TLErrorOut error);
  bool indexDocs(const OpenText& text, const std::string& bundleID, Batch& batch,
                 uint64_t batchStart, TLErrorOut error) TL_REQUIRES(_indexMutex);
  bool _indexDoc(salt::Index& index, const TLIndexableItem& doc, uint32_t docID,
                 uint64_t* docParsingTime) TL_REQUIRES(_indexMutex);
  std::optional<TLError> addAndStoreState(const Items& docs,
                                          const std::optional<std::string>& clientState,
                                          const TLString& clientStateName,
                                          const std::string& bundleID);
  bool _deleteItemsByIdentifiers(const Strings& identifiers, const std::string& bundleID,
                                 TLErrorOut error);
  // The IDs of the identifiers up to the first that is not stored, which is an error. So is one
  // that is repeated, because it is gone by then.
  std::vector<uint32_t> storedIDs(std::span<const TLString> identifiers,
                                  const std::string& bundleID, TLErrorOut error);
  // Deletes documents from the store and hides them in the text index, in order, up to the first
  // that fails. Returns that one; nullopt when all are deleted.
  std::optional<uint32_t> deleteDocs(std::span<const uint32_t> docIDs, TLErrorOut error)
      TL_REQUIRES(_indexMutex);
  // The same for as many as go into one transaction.
  std::optional<uint32_t> deleteTogether(std::vector<uint32_t> docIDs, TLErrorOut error)
      TL_REQUIRES(_indexMutex);
  bool _deleteItemsByDomainIdentifier(const Strings& domains, TLErrorOut error)
      TL_REQUIRES(_indexMutex);

  // The result of a pass: the best items, and the number of items ranked.
  struct Found {
    Items items;
    size_t count = 0;
  };
  // The inputs of ranking in one pass.
  struct RankParams;
  struct RankKey;

  Found searchOnce(const TLQuery& query, std::vector<saltsearch::Term>& saltQueryTerms,
                   size_t maxItems, TLErrorOut error) TL_REQUIRES(_indexMutex);
  // One key for each result, in the same order, with an item only if its date was unknown or all
  // items are wanted. Results without a document in the store are dropped.
  std::vector<RankKey> rankKeys(const std::vector<saltsearch::DocResult>& results,
                                const RankParams& params, size_t maxItems, TLErrorOut error)
      TL_REQUIRES(_indexMutex);
  bool retrieveItems(const std::vector<RankKey*>& keys, const RankParams& params, TLErrorOut error)
      TL_REQUIRES(_indexMutex);
  Found bestItems(std::vector<RankKey>& keys, const RankParams& params, size_t maxItems,
                  TLErrorOut error) TL_REQUIRES(_indexMutex);
  static std::vector<saltsearch::Term> _populateQueryTerms(const std::vector<TALTerm>& terms);
  static void _fillScores(TLIndexableItem& item, const saltsearch::DocResult& indexerResult,
                          const RankParams& params);
  static float _lightWeightScoring(const TLIndexableItem& item, const RankParams& params);
  // The second pass: searches with modified terms if a modifier finds some, otherwise returns
  // `firstResults`. Drops these if the second pass fails.
  Found searchModified(const TLQuery& query, const std::vector<saltsearch::Term>& saltQueryTerms,
                       Found firstResults, size_t maxItems, TLErrorOut error,
                       WordReplacements* replaced);
  // Tries the modifiers in turn on terms that found too little; the first that changes a term wins.
  // True when `modifiedQueryTerms` and `reason` are set.
  bool _modifyQueryTerms(const std::vector<saltsearch::Term>& queryTerms,
                         std::vector<saltsearch::Term>& modifiedQueryTerms,
                         const TLParameters& searchParams, WordReplacement::Reason& reason);
  bool modifyWithSpelling(const std::vector<saltsearch::Term>& queryTerms, const OpenText& text,
                          std::vector<saltsearch::Term>& modifiedQueryTerms);
  bool modifyWithSynonyms(const std::vector<saltsearch::Term>& queryTerms, const OpenText& text,
                          std::vector<saltsearch::Term>& modifiedQueryTerms);
  static bool modifyWithStems(const std::vector<saltsearch::Term>& queryTerms, const OpenText& text,
                              std::vector<saltsearch::Term>& modifiedQueryTerms);
  static void logRanking(const TLQuery& query, const Found& found);

  const std::string _path;
  const std::string _synonymFilePath;
  TALZoneManager _zoneManager;                         // thread-safe
  TALSynonyms _synonymModel;                           // loaded at construction, then read only
  std::unique_ptr<tokenizer::Tokenizer> tk;            // fixed after construction
  std::unique_ptr<TALQueryProcessor> _queryProcessor;  // fixed after construction

  // Fair, so that a search waits for the current batch only, not for those that follow.
  platform::FairMutex _indexMutex;
  OpenTextHolder _text;  // thread-safe; see invariant 1
  DocDates _docDates TL_GUARDED_BY(_indexMutex);
  std::optional<TLError> _openingError TL_GUARDED_BY(_indexMutex);
  bool _shutdown TL_GUARDED_BY(_indexMutex) = false;
  mutable platform::Mutex _docStoreMutex;
  std::shared_ptr<TALDocStore> _docStore TL_GUARDED_BY(_docStoreMutex);

  // Validation at load is switched off; only a failed validation clears `_validated`.
  const bool _shouldRunValidation = false;
  std::atomic<bool> _validated{true};

  std::function<void()> _logStateCaptureCancellationBlock;
  platform::SerialQueue _queue;  // last, so that it ends before what its work uses
};
