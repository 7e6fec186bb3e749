#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "docstore/TALDocStore.h"
#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/Queue.h"
#include "platform/TLError.h"
#include "salt/Index.h"

// The most frequent words of an index, most frequent first, counted in the background and kept in
// the document store.
//
// Threads. All operations may be called on any thread but the queue's, on which the handlers run.
// Rebuilds run there one after the other, beside searches and indexing. The index must outlive
// `shutdown`, which waits for a rebuild that runs; after it none begins.
class TALTopKVocab {
 public:
  using Words = std::vector<std::string>;
  using Completion = std::function<void(const std::optional<TLError>&)>;

  static constexpr size_t kWords = 5000;
  static constexpr int kRest = 19;

  // Loads what the store has. Without store or index there are no words, ever. A rebuild that
  // nobody asks for rests for `rest` times the processor time of the last count.
  TALTopKVocab(std::shared_ptr<TALDocStore> docStore, const salt::Index* textStore,
               int rest = kRest);
  ~TALTopKVocab();
  TALTopKVocab(const TALTopKVocab&) = delete;
  TALTopKVocab& operator=(const TALTopKVocab&) = delete;

  // Replaces words and figures by the stored ones, unless those in memory are newer. None stored,
  // or damaged ones, is an error; words of another shape are passed over without one.
  void loadTopKVocabFromDocStore(TLErrorOut error);

  // Starts a rebuild when it is due, or forced. The handler, which may be empty, gets the outcome;
  // it is not called when no rebuild starts.
  void checkAndRebuildTopKVocabWithCompletionHandler(Completion handler, bool forceRebuild);

  // Whether enough documents have come since the last rebuild: at least 51, and either there are no
  // words, or they are half as many as there were before, or 2001, or 5 days have passed.
  [[nodiscard]] bool _needRebuildTopKVocab() const;

  // Ends a rebuild that runs, and those that wait, without a change, and returns when none is left.
  void shutdown();

  // Never null and never changed.
  [[nodiscard]] std::shared_ptr<const Words> vocab() const TL_EXCLUDES(_vocabMutex);
  void setVocab(Words words) TL_EXCLUDES(_vocabMutex);

  // The highest document ID seen; raised by who adds documents.
  [[nodiscard]] uint32_t maxDocID() const { return _maxDocID; }
  void setMaxDocID(uint32_t docID) { _maxDocID = docID; }
  [[nodiscard]] bool isShutdown() const { return _isShutdown; }
  // maxDocID when the last rebuild began, and when that was, in seconds since 1970.
  [[nodiscard]] uint32_t lastTopKRebuildDocID() const { return _lastTopKRebuildDocID; }
  void setLastTopKRebuildDocID(uint32_t docID) { _lastTopKRebuildDocID = docID; }
  [[nodiscard]] double lastTopKRebuildDate() const { return _lastTopKRebuildDate; }
  void setLastTopKRebuildDate(double date) { _lastTopKRebuildDate = date; }

  static const platform::Log& log();

 private:
  void _rebuildTopKVocabWithCompletionHandler(Completion handler);
  // The same for one that nobody asked for: not while such a one waits, as it would have a whole
  // walk for nothing, and after a rest.
  void rebuildUnlessOneWaits();
  // On the queue: sees to it that counting stays a small part of all time, however fast documents
  // come. Ends early for a rebuild that was asked for and at shutdown.
  void rest() TL_EXCLUDES(_restMutex);
  // The body of a rebuild, on the queue. A routine one gives way to one that was asked for.
  std::optional<TLError> rebuild(bool routine);
  // False, with the words as they were, when the count was cut short.
  [[nodiscard]] bool count(bool routine) TL_EXCLUDES(_restMutex, _vocabMutex);
  void setCounted(Words words) TL_EXCLUDES(_vocabMutex);
  // Sets what the store had after `counts` counts; false where newer words are in memory.
  [[nodiscard]] bool setStored(Words words, uint64_t counts) TL_EXCLUDES(_vocabMutex);
  [[nodiscard]] uint64_t counts() const TL_EXCLUDES(_vocabMutex);
  std::optional<TLError> store(const std::string& blob);

  const std::shared_ptr<TALDocStore> _docStore;
  const salt::Index* const _textStore;
  const int _rest;
  std::atomic<bool> _isShutdown{false};
  std::atomic<bool> _rebuildWaits{false};
  std::atomic<uint32_t> _maxDocID{0};
  std::atomic<uint32_t> _lastTopKRebuildDocID{0};
  std::atomic<double> _lastTopKRebuildDate;
  platform::Mutex _restMutex;
  std::condition_variable_any _restEnds;
  std::chrono::steady_clock::time_point _restUntil TL_GUARDED_BY(_restMutex);
  std::atomic<size_t> _askedFor{
      0};  // rebuilds that wait and were asked for; changed under the mutex
  mutable platform::Mutex _vocabMutex;
  std::shared_ptr<const Words> _vocab TL_GUARDED_BY(_vocabMutex);
  bool _newerThanStored TL_GUARDED_BY(_vocabMutex) = false;  // counted, and not in the store yet
  uint64_t _counts TL_GUARDED_BY(_vocabMutex) = 0;           // that have set the words
  // None without store or index. Last, so that it ends before what its work uses.
  std::optional<platform::SerialQueue> _topKVocabQueue;
};
