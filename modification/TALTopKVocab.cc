#include "modification/TALTopKVocab.h"

#include <ctime>
#include <utility>

#include "modification/TopKVocabArchive.h"
#include "platform/Clock.h"
#include "salt/Search.h"
#include "salt/TopTokens.h"

using platform::MutexLock;

namespace {

constexpr const char* kQueueName = "com.quill.tallow.indexer.topkvocab.topkvocabqueue";
constexpr const char* kErrorDomain = "TALTopKVocab";
constexpr int kDamagedArchive = 1;

// Thresholds of a rebuild, in documents added since the last one.
constexpr int64_t kMinDocs = 51;           // required in any case
constexpr int64_t kSufficientDocs = 2001;  // sufficient in any case
constexpr float kGrowth = 0.5F;            // as a share of the documents before
constexpr float kOldSeconds = 432000;      // 5 days

TLError damaged(const char* what) {
  return {kErrorDomain, kDamagedArchive, std::string("the stored vocabulary has no ") + what};
}

std::string dateText(double secondsSince1970) {
  constexpr double kMaxTime = 253402300799.0;  // the last second of year 9999
  if (!(secondsSince1970 >= 0 && secondsSince1970 <= kMaxTime)) return "(none)";
  const auto seconds = static_cast<time_t>(secondsSince1970);
  tm local{};
  char text[64];
  localtime_r(&seconds, &local);
  strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &local);
  return text;
}

}  // namespace

const platform::Log& TALTopKVocab::log() {
  static const platform::Log handle(platform::kSubsystem, "TALTopKVocab");
  return handle;
}

TALTopKVocab::TALTopKVocab(std::shared_ptr<TALDocStore> docStore, const salt::Index* textStore,
                           int rest)
    : _docStore(std::move(docStore)),
      _textStore(textStore),
      _rest(rest),
      _lastTopKRebuildDate(platform::secondsSince1970()),
      _vocab(std::make_shared<const Words>()) {
  if (_docStore == nullptr || _textStore == nullptr) return;
  _topKVocabQueue.emplace(kQueueName, platform::QueuePriority::low);
  loadTopKVocabFromDocStore(nullptr);
  log().standard("Last topK rebuild date: {}.", dateText(_lastTopKRebuildDate));
  log().standard("Last topK rebuild docID: {}.", _lastTopKRebuildDocID.load());
  log().standard("Last topK has {} tokens.", vocab()->size());
}

TALTopKVocab::~TALTopKVocab() {
  shutdown();
}

void TALTopKVocab::shutdown() {
  {
    MutexLock lock(_restMutex);
    _isShutdown = true;
  }
  _restEnds.notify_all();
  if (_topKVocabQueue) _topKVocabQueue->drain();
}

std::shared_ptr<const TALTopKVocab::Words> TALTopKVocab::vocab() const {
  MutexLock lock(_vocabMutex);
  return _vocab;
}

void TALTopKVocab::setVocab(Words words) {
  auto made = std::make_shared<const Words>(std::move(words));
  MutexLock lock(_vocabMutex);
  _vocab = std::move(made);
}

void TALTopKVocab::setCounted(Words words) {
  auto made = std::make_shared<const Words>(std::move(words));
  MutexLock lock(_vocabMutex);
  _vocab = std::move(made);
  _newerThanStored = true;
  ++_counts;
}

bool TALTopKVocab::setStored(Words words, uint64_t counts) {
  auto made = std::make_shared<const Words>(std::move(words));
  MutexLock lock(_vocabMutex);
  if (_newerThanStored || counts != _counts) return false;
  _vocab = std::move(made);
  return true;
}

uint64_t TALTopKVocab::counts() const {
  MutexLock lock(_vocabMutex);
  return _counts;
}

void TALTopKVocab::loadTopKVocabFromDocStore(TLErrorOut error) {
  if (_docStore == nullptr) return;
  std::optional<TLError> failure;
  const uint64_t countsBefore = counts();
  const auto blob = _docStore->loadTopKVocab(&failure);
  if (failure) {
    log().standard("TopK is not loaded from docstore: {}", platform::printable(failure));
    platform::setError(error, *failure);
    return;
  }
  const auto entries = blob ? topkvocab::unarchive(*blob) : std::nullopt;
  if (!entries) {
    platform::setError(error, damaged("values"));
    return;
  }
  if (entries->size() != 3) return;
  auto words = topkvocab::unarchiveWords(entries->at(0));
  if (!setStored(words.value_or(Words()), countsBefore)) return;
  if (!words) {
    const TLError noWords = damaged("words");
    log().error("TopK cannot be unarchived: {}", platform::printable(noWords));
    platform::setError(error, noWords);
    return;
  }
  log().standard("TopK loaded from docstore.");
  if (const auto docID = topkvocab::unarchiveDocID(entries->at(1))) {
    _lastTopKRebuildDocID = *docID;
  } else {
    platform::setError(error, damaged("document ID"));
  }
  _maxDocID = _lastTopKRebuildDocID.load();
  if (const auto date = topkvocab::unarchiveDate(entries->at(2))) {
    _lastTopKRebuildDate = *date;
  } else {
    platform::setError(error, damaged("date"));
  }
}

bool TALTopKVocab::_needRebuildTopKVocab() const {
  const int64_t last = _lastTopKRebuildDocID;
  const int64_t delta = _maxDocID - last;
  if (delta < kMinDocs) return false;
  if (delta >= kSufficientDocs || vocab()->empty()) return true;
  if (static_cast<float>(last) * kGrowth < static_cast<float>(delta)) return true;
  const double age = platform::secondsSince1970() - _lastTopKRebuildDate;
  return static_cast<float>(age) > kOldSeconds;
}

void TALTopKVocab::checkAndRebuildTopKVocabWithCompletionHandler(Completion handler,
                                                                 bool forceRebuild) {
  if (!forceRebuild && !_needRebuildTopKVocab()) return;
  if (forceRebuild || handler) {
    _rebuildTopKVocabWithCompletionHandler(std::move(handler));
  } else {
    rebuildUnlessOneWaits();
  }
}

void TALTopKVocab::rebuildUnlessOneWaits() {
  if (!_topKVocabQueue || _rebuildWaits.exchange(true)) return;
  const bool submitted = _topKVocabQueue->async([this] {
    rest();
    _rebuildWaits = false;
    rebuild(true);
  });
  if (!submitted) _rebuildWaits = false;
}

void TALTopKVocab::rest() {
  MutexLock lock(_restMutex);
  while (!_isShutdown && _askedFor == 0 && std::chrono::steady_clock::now() < _restUntil) {
    _restEnds.wait_until(_restMutex, _restUntil);
  }
}

void TALTopKVocab::_rebuildTopKVocabWithCompletionHandler(Completion handler) {
  if (!_topKVocabQueue) return;
  {
    MutexLock lock(_restMutex);
    ++_askedFor;
  }
  _restEnds.notify_all();
  _topKVocabQueue->submit([this, completion = std::move(handler)] {
    {
      MutexLock lock(_restMutex);
      --_askedFor;
    }
    const std::optional<TLError> outcome = rebuild(false);
    if (completion) completion(outcome);
  });
}

// Updates the state first, so that a cancelled rebuild counts as done.
std::optional<TLError> TALTopKVocab::rebuild(bool routine) {
  log().standard("Starting to rebuild topK vocab from SALT.");
  _lastTopKRebuildDocID = _maxDocID.load();
  _lastTopKRebuildDate = platform::secondsSince1970();
  if (_isShutdown) {
    log().standard("TopKVocab is shutting down before TopKTokens.");
    return std::nullopt;
  }
  if (!count(routine)) {
    if (_isShutdown) log().standard("TopKVocab is shutting down before storeTopKVocab.");
    return std::nullopt;
  }
  log().standard("Rebuild date: {}.", dateText(_lastTopKRebuildDate));
  log().standard("Rebuild docID: {}.", _lastTopKRebuildDocID.load());
  log().standard("TopK vocab has {} tokens.", vocab()->size());
  log().standard("TopK vocab rebuild is done.");
  const std::string blob =
      topkvocab::archive(*vocab(), _lastTopKRebuildDocID, _lastTopKRebuildDate);
  if (_isShutdown) {
    log().standard("TopKVocab is shutting down before storeTopKVocab.");
    return std::nullopt;
  }
  return store(blob);
}

bool TALTopKVocab::count(bool routine) {
  const auto start = platform::threadProcessorTime();
  const auto goesOn = [this, routine] { return !_isShutdown && !(routine && _askedFor != 0); };
  const auto tokens = saltsearch::TopKTokens(*_textStore, kWords, saltsearch::ZoneScoreDefault,
                                             saltsearch::TokenizeSpace, goesOn);
  if (!goesOn()) return false;
  Words words;
  words.reserve(tokens.size());
  for (const auto& [token, weight] : tokens) words.push_back(token);
  setCounted(std::move(words));
  const auto taken = platform::threadProcessorTime() - start;
  MutexLock lock(_restMutex);
  _restUntil = std::chrono::steady_clock::now() + _rest * taken;
  return true;
}

std::optional<TLError> TALTopKVocab::store(const std::string& blob) {
  std::optional<TLError> failure;
  _docStore->storeTopKVocab(blob, &failure);
  if (failure) {
    log().error("Rebuilt topK vocab cannot be saved to docstore: {}", platform::printable(failure));
  } else {
    log().standard("Rebuilt topK vocab saved to docstore.");
    MutexLock lock(_vocabMutex);
    _newerThanStored = false;
  }
  return failure;
}
