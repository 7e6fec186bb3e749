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

// The vocabulary: the most frequent words of an index, most frequent first. They are counted in the
// background and kept in the document store.
//
// Threads. All operations may be called on any thread except the queue's own, where the handlers
// run. Rebuilds run on the queue one after another, concurrently with searches and indexing. The
// index must outlive `shutdown`, which waits for the running rebuild; none begins after it.
class TALTopKVocab {
 public:
  using Words = std::vector<std::string>;
  using Completion = std::function<void(const std::optional<TLError>&)>;

  static constexpr size_t kWords = 5000;
  static constexpr int kRest = 19;

  // Loads the stored words. Without a store or an index the vocabulary stays empty. A routine
  // rebuild first rests for `rest` times the processor time of the last count.
  TALTopKVocab(std::shared_ptr<TALDocStore> docStore, const salt::Index* textStore,
               int rest = kRest);
  ~TALTopKVocab();
  TALTopKVocab(const TALTopKVocab&) = delete;
  TALTopKVocab& operator=(const TALTopKVocab&) = delete;

  // Replaces words and state by the stored ones, unless those in memory are newer. Sets the error
  // when nothing is stored or it is damaged; an archive of another form is ignored without one.
  void loadTopKVocabFromDocStore(TLErrorOut error);

  // Starts a rebuild when it is due or forced. The handler, which may be empty, receives the
  // outcome; it is not called when no rebuild starts.
  void checkAndRebuildTopKVocabWithCompletionHandler(Completion handler, bool forceRebuild);

  // Whether enough documents were added since the last rebuild: at least 51, and in addition the
  // vocabulary is empty, or they are more than half as many as before, or at least 2001, or 5 days
  // have passed.
  [[nodiscard]] bool _needRebuildTopKVocab() const;

  // Cancels the running and the waiting rebuilds without a change, and returns when none is left.
  void shutdown();

  // Never null and immutable.
  [[nodiscard]] std::shared_ptr<const Words> vocab() const TL_EXCLUDES(_vocabMutex);
  void setVocab(Words words) TL_EXCLUDES(_vocabMutex);

  // The highest DocID seen; the code that adds documents updates it.
  [[nodiscard]] uint32_t maxDocID() const { return _maxDocID; }
  void setMaxDocID(uint32_t docID) { _maxDocID = docID; }
  [[nodiscard]] bool isShutdown() const { return _isShutdown; }
  // The value of maxDocID and the time, in seconds since 1970, at which the last rebuild began.
  [[nodiscard]] uint32_t lastTopKRebuildDocID() const { return _lastTopKRebuildDocID; }
  void setLastTopKRebuildDocID(uint32_t docID) { _lastTopKRebuildDocID = docID; }
  [[nodiscard]] double lastTopKRebuildDate() const { return _lastTopKRebuildDate; }
  void setLastTopKRebuildDate(double date) { _lastTopKRebuildDate = date; }

  static const platform::Log& log();

 private:
  void _rebuildTopKVocabWithCompletionHandler(Completion handler);
  // A routine rebuild, which nobody requested: starts none while another routine one waits, because
  // the second would repeat the whole scan for nothing; begins with a rest.
  void rebuildUnlessOneWaits();
  // Throttles counting to a small share of all time, however fast documents arrive. Runs on the
  // queue; ends early for a requested rebuild and at shutdown.
  void rest() TL_EXCLUDES(_restMutex);
  // The body of a rebuild, on the queue. A routine rebuild gives way to a requested one.
  std::optional<TLError> rebuild(bool routine);
  // False, with the words unchanged, when the count was interrupted.
  [[nodiscard]] bool count(bool routine) TL_EXCLUDES(_restMutex, _vocabMutex);
  void setCounted(Words words) TL_EXCLUDES(_vocabMutex);
  // Sets the words that were stored after `counts` counts; false when newer words are in memory.
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
  std::atomic<size_t> _askedFor{0};  // requested rebuilds waiting; changed under the mutex
  mutable platform::Mutex _vocabMutex;
  std::shared_ptr<const Words> _vocab TL_GUARDED_BY(_vocabMutex);
  bool _newerThanStored TL_GUARDED_BY(_vocabMutex) = false;  // counted but not stored yet
  uint64_t _counts TL_GUARDED_BY(_vocabMutex) = 0;  // number of counts that have set the words
  // Nullopt without store or index. Last, so that it ends before what its work uses.
  std::optional<platform::SerialQueue> _topKVocabQueue;
};
