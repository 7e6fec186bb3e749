#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "docstore/TALDocStore.h"
#include "indexer/DocDates.h"
#include "indexer/OpenText.h"
#include "indexer/TALZoneManager.h"
#include "indexer/WordReplacement.h"
#include "modification/TALStemRewrite.h"
#include "modification/TALSynonyms.h"
#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/Queue.h"
#include "platform/TLError.h"
#include "query/TALQueryProcessor.h"
#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"
#include "salt/Index.h"
#include "salt/Search.h"
#include "tokenizer/Tokenizer.h"

inline constexpr const char* kTALIndexerErrorDomain = "TALIndexer";

// Codes of the errors of the class.
enum class TALIndexerError {
  document = 1,          // "document has no identifier", "index failed"
  query = 3,             // the query gave no terms
  shuttingDown = 4,      // "shutting down"
  validationFailed = 5,  // "index validation failed"
};

// The heart of one protection class: one text index, one document store, and all work that changes
// them.
//
// Threads. The destructor waits for what is queued, so it must not run on the queue. Adds, deletes,
// reset and vacuum run one after the other on the indexer's own queue; the operations that start
// them return at once, from any thread, and completions run on the queue. Searches, statistics and
// the client state run on the caller's thread.
//
// Invariants.
// 1. The text index is opened and closed with `_indexMutex` held, by work on `_queue` and at the
// end
//    of a shutdown. Who reads it takes a reference from `_text`, which keeps it open.
// 2. A search holds `_indexMutex` for one pass, a batch for all its documents: they never overlap.
//    What changes the words of a query between two passes reads the index beside batches.
// 3. The document store is written before the text index. What a search finds in the index and not
// in the
//    store is left out.
// 4. After `shutdown` no work runs: what is queued, or comes later, completes with "shutting down".
class TALIndexer {
 public:
  using Items = std::vector<std::shared_ptr<TLIndexableItem>>;
  using Strings = std::vector<TLString>;
  using Completion = std::function<void(const std::optional<TLError>&)>;

  // Opens, or makes, the text index in the directory `path`, and reads the synonyms. The store is
  // open. Never fails: problems are logged, and an indexer without index or tokenizer reports them
  // with each call. See `openingError`.
  TALIndexer(std::string path, const std::string& protectionClass,
             std::shared_ptr<TALDocStore> docStore, std::string synonymFilePath);
  ~TALIndexer();
  TALIndexer(const TALIndexer&) = delete;
  TALIndexer& operator=(const TALIndexer&) = delete;

  // Ingest. A document can be found once the completion has been called without error. A batch that
  // fails in the text index stays stored; its rest is found once it is sent again.
  void addDocs(Items docs, std::string bundleID, Completion completionHandler);
  // Deletes first, then adds, then stores the state; each only when all before it has succeeded.
  void addDocs(Items docs, Strings deleteItemsByIdentifiers, std::optional<std::string> clientState,
               TLString clientStateName, std::string bundleID, Completion completionHandler);
  // An identifier that is not known ends the list with an error; earlier deletions stand.
  void deleteItemsByIdentifiers(Strings identifiers, std::string bundleID,
                                Completion completionHandler);
  void deleteItemsByDomainIdentifiers(Strings domainIdentifiers, Completion completionHandler);

  // Forgets all documents and all client states.
  void resetWithCompletionHandler(Completion completionHandler);
  void saltVacuumAndCompactWithCompletionHandler(Completion completionHandler);

  // Counts the frequent words anew, in the background. The handler runs on the vocabulary's queue
  // and must not wait for the indexer; without vocabulary it is not called.
  void forceRebuildTopKVocabWithCompletionHandler(Completion completionHandler);
  // The frequent words, most frequent first; null without vocabulary.
  [[nodiscard]] std::shared_ptr<const TALTopKVocab::Words> topKVocabulary();
  // The same, read from the store again.
  std::shared_ptr<const TALTopKVocab::Words> loadTopKVocabFromDocStore(TLErrorOut error);

  // The bytes stored under a client's name, none when there are none. Synchronous.
  void fetchLastClientStateforName(
      const TLString& name,
      const std::function<void(const std::optional<std::string>&, const std::optional<TLError>&)>&
          completionHandler);

  // 18 figures by their statistics keys; null without index or store. Reads all stored text.
  [[nodiscard]] nlohmann::json docStats();
  // The metrics of the text index for people; empty without index. Reads all stored text.
  [[nodiscard]] std::string saltMetrics();

  // Ranked items, at most "salt.maxTopK", each with its card. Writes the resolved parameters into
  // the query. With a failure the result is empty and the error set. Where the words as typed find
  // no more than "queryModification.sufficentRetrievalThreshold" items, the results are those of
  // changed words, if any can be found.
  //
  // The items are the best `most`; `count`, which may be null, receives how many were ranked.
  // `replaced`, which may be null, receives the words that were changed for these results.
  [[nodiscard]] Items search(TLQuery& query, TLErrorOut error, size_t most = SIZE_MAX,
                             size_t* count = nullptr, WordReplacements* replaced = nullptr);

  // Every stored document whose subject is one of `subjects`, in the store's order, without scores;
  // none with an error set when the store fails. Reads every document.
  [[nodiscard]] std::optional<Items> iterateAllDocsToFindMatchingSubjects(const Strings& subjects,
                                                                          TLErrorOut error);

  // Refuses further work, waits for what runs, closes index and store. Not from the indexer's
  // queue.
  void shutdown();

  // Why there is no text index, none where there is one. What is on the disk is as it was: it is
  // tried again with the next add, or by an indexer made anew.
  [[nodiscard]] std::optional<TLError> openingError();

  [[nodiscard]] const std::string& path() const { return _path; }
  [[nodiscard]] std::shared_ptr<TALDocStore> docStore() const;

  // The key of a document in the store; none for an empty identifier or one that makes no valid
  // URL.
  [[nodiscard]] static std::optional<TLURL> documentURLForIdentifier(
      const std::optional<TLString>& identifier, const std::string& bundleID);

  // True when there are at most that many results; a threshold below 0 counts as huge.
  [[nodiscard]] static bool _notSufficientRetrieval(size_t results, int64_t threshold);
  [[nodiscard]] static bool _shouldRunQueryModification(size_t results, int64_t retrievalThreshold);

  // -1, 0 or 1; 1 also when either is not a number.
  [[nodiscard]] static int _floatCompare(float a, float b);
  // 0 for a document up to a day old, falling to -1 at about 366 days. Seconds since 1970.
  [[nodiscard]] static double _computeFreshnessPenalty(double documentTime, double queryTime);

  static const platform::Log& log();

 private:
  using Task = std::function<std::optional<TLError>()>;

  // The maps of one batch.
  struct Batch;

  void _init() TL_REQUIRES(_indexMutex);
  // Has the class start empty, since its index is damaged.
  bool setTextStoreAside(TLErrorOut error) TL_REQUIRES(_indexMutex);
  // Whether the store has no documents; none, with an error, where it cannot be read.
  std::optional<bool> storeIsEmpty(int64_t* stored, TLErrorOut error);
  // False when the system does not let the index be opened or made: then `_openingError` tells.
  bool openTextStore(int64_t storedDocuments) TL_REQUIRES(_indexMutex);
  std::unique_ptr<salt::Index> loadTextStore(TLErrorOut error) TL_REQUIRES(_indexMutex);
  std::unique_ptr<salt::Index> createTextStore(int64_t storedDocuments, TLErrorOut error)
      TL_REQUIRES(_indexMutex);
  void makeQueryObjects();
  // Waits for all who read the index, a count of the vocabulary included.
  void closeTextStore() TL_REQUIRES(_indexMutex);
  std::shared_ptr<TALTopKVocab> topKVocab();
  // For work on the queue: starts a rebuild of the vocabulary if enough documents have come.
  void checkVocabulary();

  void _scheduleWork(std::string name, Task task, Completion completionHandler);
  std::optional<TLError> runWork(const Task& task);
  bool _resetWithError(TLErrorOut error) TL_REQUIRES(_indexMutex);
  bool _resetSALT(TLErrorOut error) TL_REQUIRES(_indexMutex);
  // The key of a client's state in the store's metadata.
  static std::string clientStateKey(const TLString& name);
  static TLError _errorWithCode(TALIndexerError code, const char* message, TLErrorOut error);
  // The error of a call that needs the index where there is none.
  [[nodiscard]] TLError noIndexError() const TL_REQUIRES(_indexMutex);

  // Waits while the text index wants nothing added. On `_queue`.
  void holdBack() TL_EXCLUDES(_indexMutex);
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
  // Deletes it from the store. None when that did not happen.
  [[nodiscard]] std::optional<uint32_t> deleteStored(const TLString& identifier,
                                                     const std::string& bundleID,
                                                     std::optional<TLError>* failure)
      TL_REQUIRES(_indexMutex);
  bool _deleteItemsByDomainIdentifier(const TLString& domain, TLErrorOut error)
      TL_REQUIRES(_indexMutex);
  // Hides what was deleted from the store in the text index, and clears the list.
  void hideDeleted(std::vector<uint32_t>* docIDs);

  // What a pass has found: the best items, and how many were ranked.
  struct Found {
    Items items;
    size_t count = 0;
  };
  // What one pass ranks by.
  struct RankParams;
  struct RankKey;

  Found searchOnce(const TLQuery& query, std::vector<saltsearch::Term>& saltQueryTerms, size_t most,
                   TLErrorOut error) TL_REQUIRES(_indexMutex);
  // One for each result, in their order, with an item only where its date was not known or all are
  // wanted. Results that the store has no document for are left out.
  std::vector<RankKey> rankKeys(const std::vector<saltsearch::DocResult>& results,
                                const RankParams& params, size_t most, TLErrorOut error)
      TL_REQUIRES(_indexMutex);
  bool retrieveItems(const std::vector<RankKey*>& keys, const RankParams& params, TLErrorOut error)
      TL_REQUIRES(_indexMutex);
  Found bestItems(std::vector<RankKey>& keys, const RankParams& params, size_t most,
                  TLErrorOut error) TL_REQUIRES(_indexMutex);
  static std::vector<saltsearch::Term> _populateQueryTerms(const std::vector<TALTerm>& terms);
  static void _fillScores(TLIndexableItem& item, const saltsearch::DocResult& indexerResult,
                          const RankParams& params);
  static float _lightWeightScoring(const TLIndexableItem& item, const RankParams& params);
  // The second pass: with changed terms where a modifier finds some, else `firstResults`. Drops
  // them when the second pass fails.
  Found searchModified(const TLQuery& query, const std::vector<saltsearch::Term>& saltQueryTerms,
                       Found firstResults, size_t most, TLErrorOut error,
                       WordReplacements* replaced);
  // Tries one way after the other to change terms that found too little; the first that changes
  // something ends it. True when `modifiedQueryTerms` and `reason` are filled.
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
  TALZoneManager _zoneManager;                         // self-synchronised
  TALSynonyms _synonymModel;                           // loaded at construction, then read only
  std::unique_ptr<tokenizer::Tokenizer> tk;            // fixed after construction
  std::unique_ptr<TALQueryProcessor> _queryProcessor;  // fixed after construction

  // Fair: a search that waits for a batch does not wait for those behind it.
  platform::FairMutex _indexMutex;
  OpenTextHolder _text;  // self-synchronised; see invariant 1
  DocDates _docDates TL_GUARDED_BY(_indexMutex);
  std::optional<TLError> _openingError TL_GUARDED_BY(_indexMutex);
  bool _shutdown TL_GUARDED_BY(_indexMutex) = false;
  mutable platform::Mutex _docStoreMutex;
  std::shared_ptr<TALDocStore> _docStore TL_GUARDED_BY(_docStoreMutex);

  // Validation at load is switched off; `_validated` falls to false only through one.
  const bool _shouldRunValidation = false;
  std::atomic<bool> _validated{true};

  std::function<void()> _logStateCaptureCancellationBlock;
  platform::SerialQueue _queue;  // last, so that it ends before what its work uses
};
