#include "indexer/TALIndexer.h"

#include <cerrno>
#include <new>
#include <system_error>
#include <utility>

#include "platform/Clock.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "platform/Signpost.h"
#include "platform/StateCapture.h"
#include "records/TLDebugServiceKeys.h"
#include "salt/Quarantine.h"
#include "tokenizer/TLLexemonAssetManager.h"

using platform::MutexLock;
using platform::Signpost;

namespace {

constexpr const char* kQueueName = "com.quill.tallow.indexer.queue";
constexpr const char* kClientStateKey = "clientstate";

salt::Index::Options newIndexOptions(const std::string& path) {
  salt::Index::Options options;
  options.ValidateOnLoad = false;
  options.MinMatchLen = 32;
  options.MaxMatchLen = 100;
  options.MaxZoneSize = 200000;
  options.MaxPageSuffixes = 50;
  options.MaxShardSuffixes = 1000000;
  options.MaxShards = 16;
  options.MaxHotSuffixes = 500000;
  options.CompactAfterVacuum = false;
  options.ThrottleFactor = 0;
  options.MaxBatchBytes = 1000000;
  options.Path = path;
  return options;
}

uint64_t zoneCount(const salt::Index::Metrics& metrics, TLAttributeKey key) {
  const auto entry = metrics.ZoneCounts.find(static_cast<uint16_t>(key));
  return entry == metrics.ZoneCounts.end() ? 0 : entry->second;
}

}  // namespace

const platform::Log& TALIndexer::log() {
  static const platform::Log handle(platform::kSubsystem, "TALIndexer");
  return handle;
}

TALIndexer::TALIndexer(std::string path, const std::string& protectionClass,
                       std::shared_ptr<TALDocStore> docStore, std::string synonymFilePath)
    : _path(std::move(path)),
      _synonymFilePath(std::move(synonymFilePath)),
      _docStore(std::move(docStore)),
      _queue(kQueueName) {
  {
    MutexLock lock(_indexMutex);
    _init();
  }
  _logStateCaptureCancellationBlock =
      TLLogRegisterStateCaptureBlock(_queue, protectionClass + " index stats", [this] {
        const nlohmann::json stats = docStats();
        const auto value = [&stats](const char* key) {
          return stats.is_null() ? nlohmann::json(0) : stats.at(key);
        };
        return nlohmann::json{{"DocStoreNumItems", value(TLDebugServiceDocStoreNumOfItems)},
                              {"SaltNumItems", value(TLDebugServiceTextStoreNumOfItems)}};
      });
}

TALIndexer::~TALIndexer() {
  _logStateCaptureCancellationBlock();
}

std::shared_ptr<TALDocStore> TALIndexer::docStore() const {
  MutexLock lock(_docStoreMutex);
  return _docStore;
}

void TALIndexer::closeTextStore() {
  _docDates.forgetAll();  // a new index has new DocIDs
  _text.close();
}

// Creates only what is missing, so that zone manager, tokenizer, synonyms and query processor
// survive a reset.
void TALIndexer::_init() {
  const uint64_t start = platform::monotonicTicks();
  makeQueryObjects();
  log().standard("Initializing text store from path: {} ...", _path);
  if (_path.empty()) {
    log().fault("No path specified for index.");
  } else {
    std::optional<TLError> error;
    _openingError.reset();
    if (salt::hasCrashedTwice(_path) && !setTextStoreAside(&error)) {
      log().error("Could not set the text index aside: {}", platform::printable(error));
      _openingError = error;
      return;
    }
    int64_t stored = 0;
    const std::optional<bool> empty = storeIsEmpty(&stored, &error);
    if (!empty) {
      // Data that cannot be read may still be there, so neither index nor store is touched.
      log().error("Could not get docstore count: {}", platform::printable(error));
      _openingError = error;
      return;
    }
    if (*empty) {
      log().standard("Docstore is empty, resetting SALT...");
      if (_resetSALT(&error)) {
        log().standard("SALT was reset");
      } else {
        log().error("Could not reset SALT: {}", platform::printable(error));
      }
    }
    if (!platform::createDirectories(_path, &error)) {
      log().error("Could not create intermediate directory {}: {}", _path,
                  platform::printable(error));
      _openingError = error;
      return;
    }
    if (!openTextStore(stored)) return;
  }
  log().standard("Finished initing indexer in time: {} ms", elapsedMillisSinceMonotonicTime(start));
}

// Empties the store first: an index with an empty store is recreated whatever happens in between.
// With a full store and its client states no client would send its mail again.
bool TALIndexer::setTextStoreAside(TLErrorOut error) {
  const auto store = docStore();
  if (store != nullptr && !store->resetWithError(error)) return false;
  const auto aside = salt::setAside(_path, error);
  if (!aside) return false;
  log().fault("The text index has ended the process twice within an hour and is set aside as {}.",
              *aside);
  return true;
}

// The count is also 0 if the store cannot be read; only an enumeration can tell.
std::optional<bool> TALIndexer::storeIsEmpty(int64_t* stored, TLErrorOut error) {
  const auto store = docStore();
  std::optional<TLError> failure;
  if (store != nullptr) *stored = store->count(&failure);
  bool empty = *stored == 0;
  if (store != nullptr && empty && !failure) {
    store->enumerateDocIDs(&failure, [&](int64_t, uint32_t, const TLURL&, bool* stop, TLErrorOut) {
      empty = false;
      *stop = true;
    });
  }
  if (!failure) return empty;
  platform::setError(error, *failure);
  return std::nullopt;
}

bool TALIndexer::openTextStore(int64_t storedDocuments) {
  std::optional<TLError> error;
  log().standard("Loading textstore...");
  closeTextStore();
  std::unique_ptr<salt::Index> index = loadTextStore(&error);
  if (index == nullptr && !error) index = createTextStore(storedDocuments, &error);
  if (error) {
    log().error("Could not open the text index: {}", platform::printable(error));
    _openingError = error;
  }
  if (index == nullptr) return !error;
  auto text = std::make_unique<OpenText>(std::move(index));
  if (const auto store = docStore()) {
    text->vocab = std::make_shared<TALTopKVocab>(store, text->index.get());
  }
  text->spelling = std::make_unique<TALSpellCorrection>(text->vocab);
  _text.open(std::move(text));
  return !error;
}

std::optional<TLError> TALIndexer::openingError() {
  MutexLock lock(_indexMutex);
  return _openingError;
}

TLError TALIndexer::noIndexError() const {
  if (_shutdown) return _errorWithCode(TALIndexerError::shuttingDown, "shutting down", nullptr);
  return _openingError.value_or(platform::posixError(ENOENT, "there is no text index at " + _path));
}

void TALIndexer::makeQueryObjects() {
  if (tk == nullptr) {
    const std::string& locale = bestLexemonLocale();
    log().info("Creating Lexemon tokenizer for locale: {}", locale);
    tk = tokenizer::NewFastLexemonTokenizer(locale);
    if (tk == nullptr) log().error("Failed to create lexemon tokenizer for locale: {}", locale);
  }
  if (_queryProcessor == nullptr) {
    if (!_synonymModel.loadSynonymsFromFile(_synonymFilePath, nullptr))
      log().error("Failed to load synonym file: {}", _synonymFilePath);
    _queryProcessor = TALQueryProcessor::initWithZoneManager(_zoneManager, &_synonymModel);
  }
}

std::unique_ptr<salt::Index> TALIndexer::loadTextStore(TLErrorOut error) {
  const uint64_t start = platform::monotonicTicks();
  std::unique_ptr<salt::Index> index(salt::LoadIndex(_path, error));
  if (index == nullptr) return nullptr;
  log().standard("Loaded textstore from path: {} in time: {} ms", _path,
                 elapsedMillisSinceMonotonicTime(start));
  if (!_shouldRunValidation) {
    log().standard("Validation disabled, skipping...");
    return index;
  }
  log().standard("Running validation...");
  _scheduleWork(
      "validateOnLoad",
      [this]() -> std::optional<TLError> {
        const auto text = _text.get();
        _validated = text != nullptr && text->index->Validate();
        if (_validated) {
          log().standard("Index passed validation");
        } else {
          log().fault("Index failed validation");
        }
        return std::nullopt;
      },
      nullptr);
  return index;
}

// A newly created text index empties the document store, so that both hold the same documents.
std::unique_ptr<salt::Index> TALIndexer::createTextStore(int64_t storedDocuments,
                                                         TLErrorOut error) {
  log().standard("Could not find path, creating new textstore at path {}", _path);
  uint64_t start = platform::monotonicTicks();
  std::unique_ptr<salt::Index> index(salt::NewIndex(newIndexOptions(_path), error));
  if (index == nullptr) return nullptr;
  log().standard("Created new textstore at path: {} in time: {} ms", _path,
                 elapsedMillisSinceMonotonicTime(start));
  if (docStore() == nullptr) return index;
  log().standard("Resetting docstore after creating a new textstore...");
  start = platform::monotonicTicks();
  std::optional<TLError> failure;
  if (docStore()->resetWithError(&failure)) {
    log().standard("Reset docstore with {} items in time: {} ms", storedDocuments,
                   elapsedMillisSinceMonotonicTime(start));
  } else {
    log().error("Error resetting docstore: {}", platform::printable(failure));
  }
  return index;
}

std::string TALIndexer::clientStateKey(const TLString& name) {
  return std::string(kClientStateKey) + "_" + platform::toUTF8(name);
}

TLError TALIndexer::_errorWithCode(TALIndexerError code, const char* message, TLErrorOut error) {
  TLError made{kTALIndexerErrorDomain, static_cast<int>(code), message};
  platform::setError(error, made);
  return made;
}

void TALIndexer::_scheduleWork(std::string name, Task task, Completion completionHandler) {
  log().debug("{} requested", name);
  _queue.submit([this, name = std::move(name), task = std::move(task),
                 completion = std::move(completionHandler)] {
    const uint64_t start = platform::monotonicTicks();
    log().debug("{} started", name);
    const std::optional<TLError> outcome = runWork(task);
    if (completion) completion(outcome);
    if (outcome) {
      log().error("{} completed with error: {}", name, platform::printable(outcome));
    } else {
      log().debug("{} completed successfully", name);
    }
    log().debug("{} ended, time taken: {} ms", name, elapsedMillisSinceMonotonicTime(start));
  });
}

std::optional<TLError> TALIndexer::runWork(const Task& task) {
  if (!_validated) {
    return _errorWithCode(TALIndexerError::validationFailed, "index validation failed", nullptr);
  }
  {
    MutexLock lock(_indexMutex);
    if (_shutdown) return _errorWithCode(TALIndexerError::shuttingDown, "shutting down", nullptr);
    if (_text.get() == nullptr && _openingError) _init();
    if (_openingError) return _openingError;
  }
  try {
    return task();
  } catch (const std::bad_alloc&) {
    return platform::posixError(ENOMEM, "not enough memory for the work");
  } catch (const std::system_error& failure) {
    return platform::posixError(failure.code().value(), "no thread for the work");
  }
}

void TALIndexer::resetWithCompletionHandler(Completion completionHandler) {
  _scheduleWork(
      "resetWithCompletionHandler",
      [this] {
        MutexLock lock(_indexMutex);
        const uint64_t signpost = Signpost::identifierForObject(this);
        Signpost::begin(signpost, "resetWithCompletionHandler", "");
        std::optional<TLError> error;
        _resetWithError(&error);
        log().standard("Reinitializing TALIndexer");
        _init();
        Signpost::end(signpost, "resetWithCompletionHandler", "");
        return error;
      },
      std::move(completionHandler));
}

bool TALIndexer::_resetWithError(TLErrorOut error) {
  const auto store = docStore();
  if (!_resetSALT(error)) return false;
  // An index that was set aside contains mail too.
  for (const std::string& aside : salt::indexesSetAside(_path)) {
    if (!platform::removeItem(aside, error)) return false;
  }
  if (store == nullptr) return true;
  log().standard("Resetting docstore...");
  std::optional<TLError> failure;
  if (!store->resetWithError(&failure)) {
    log().error("Error resetting docstore: {}", platform::printable(failure));
    if (error != nullptr) *error = std::move(failure);
    return false;
  }
  log().standard("Docstore was reset");
  return true;
}

bool TALIndexer::_resetSALT(TLErrorOut error) {
  std::optional<TLError> failure;
  const auto names = platform::listDirectory(_path, &failure);
  if (!names) {
    log().error("Failed to list files in directory {}: {}", _path, platform::printable(failure));
    platform::setError(error, *failure);
    return false;
  }
  closeTextStore();
  for (const std::string& name : *names) {
    const std::string file = platform::joinPath(_path, name);
    log().standard("Removing file {}", file);
    if (!platform::removeItem(file, &failure)) {
      log().error("Failed to remove file {}: {}", name, platform::printable(failure));
      platform::setError(error, *failure);
      return false;
    }
  }
  return true;
}

void TALIndexer::saltVacuumAndCompactWithCompletionHandler(Completion completionHandler) {
  _scheduleWork(
      "saltVacuum",
      [this]() -> std::optional<TLError> {
        if (const auto text = _text.get()) {
          text->index->Vacuum();
          if (!text->index->Compact()) {
            return platform::posixError(ENOSPC, "the disk lacks the room for a compaction");
          }
        }
        return std::nullopt;
      },
      std::move(completionHandler));
}

std::shared_ptr<TALTopKVocab> TALIndexer::topKVocab() {
  const auto text = _text.get();
  return text == nullptr ? nullptr : text->vocab;
}

void TALIndexer::checkVocabulary() {
  if (const auto vocab = topKVocab()) {
    vocab->checkAndRebuildTopKVocabWithCompletionHandler(nullptr, false);
  }
}

void TALIndexer::forceRebuildTopKVocabWithCompletionHandler(Completion completionHandler) {
  if (const auto vocab = topKVocab()) {
    vocab->checkAndRebuildTopKVocabWithCompletionHandler(std::move(completionHandler), true);
  }
}

std::shared_ptr<const TALTopKVocab::Words> TALIndexer::topKVocabulary() {
  const auto vocab = topKVocab();
  return vocab == nullptr ? nullptr : vocab->vocab();
}

std::shared_ptr<const TALTopKVocab::Words> TALIndexer::loadTopKVocabFromDocStore(TLErrorOut error) {
  const auto vocab = topKVocab();
  if (vocab == nullptr || docStore() == nullptr) return nullptr;
  vocab->loadTopKVocabFromDocStore(error);
  return vocab->vocab();
}

void TALIndexer::fetchLastClientStateforName(
    const TLString& name,
    const std::function<void(const std::optional<std::string>&, const std::optional<TLError>&)>&
        completionHandler) {
  log().debug("fetchLastClientStateWithCompletionHandler requested");
  if (!completionHandler) return;
  log().debug("fetchLastClientStateWithCompletionHandler started");
  std::optional<TLError> error;
  std::optional<std::string> value;
  if (const auto store = docStore())
    value = store->metadataValueForKey(clientStateKey(name), &error);
  if (error) {
    log().error("fetchLastClientStateWithCompletionHandler name: {} error: {}",
                platform::toUTF8(name), platform::printable(error));
  } else {
    log().standard(
        "fetchLastClientStateWithCompletionHandler successfully fetched client state name: {} "
        "(length "
        "{})",
        platform::toUTF8(name), value ? value->size() : 0);
  }
  completionHandler(value, error);
}

nlohmann::json TALIndexer::docStats() {
  const auto store = docStore();
  if (store == nullptr) return nullptr;
  const int64_t documents = store->count(nullptr);
  const auto text = _text.get();
  if (text == nullptr) return nullptr;
  const salt::Index::Metrics m = text->index->GetMetrics();
  return {
      {TLDebugServiceDocStoreNumOfItems, documents},
      {TLDebugServiceTextStoreNumOfItems, m.Docs},
      {TLDebugServiceTextStoreNumOfItemsWithHtmlBody,
       zoneCount(m, TLAttributeKey::HTML_CONTENT_DATA)},
      {TLDebugServiceTextStoreNumOfItemsWithTextBody, zoneCount(m, TLAttributeKey::TEXT_CONTENT)},
      {TLDebugServiceTextStoreSize, m.TextBytes},
      {TLDebugServiceSaltMaxDocID, m.MaxDocID},
      {TLDebugServiceSaltLastDocID, m.LastDocID},
      {TLDebugServiceSaltTotalSuffixes, m.Suffixes},
      {TLDebugServiceSaltNumOfPages, m.Pages},
      {TLDebugServiceSaltHotSuffixes, m.HotSuffixes},
      {TLDebugServiceSaltScanPrefixSearched, m.Scans},
      {TLDebugServiceSaltScanTimeSecs, m.ScanSeconds},
      {TLDebugServiceSaltScanResults, m.ScanResults},
      {TLDebugServiceSaltScanPageLoads, m.ScanPageReads},
      {TLDebugServiceSaltScanDocTextFetches, m.ScanTextFetches},
      {TLDebugServiceSaltIndexTimeSecs, m.IndexingSeconds},
      {TLDebugServiceSaltVacuumNumOfPhases, m.Vacuums},
      {TLDebugServiceSaltVacuumTimeSecs, m.VacuumSeconds},
  };
}

std::string TALIndexer::saltMetrics() {
  const auto text = _text.get();
  return text == nullptr ? std::string() : std::string(text->index->GetMetrics());
}

void TALIndexer::shutdown() {
  log().standard("Shutting down indexer...");
  {
    MutexLock lock(_indexMutex);
    _shutdown = true;
  }
  if (const auto text = _text.get()) text->index->Interrupt();
  _queue.drain();
  std::shared_ptr<TALDocStore> store;
  {
    MutexLock lock(_indexMutex);
    closeTextStore();
    MutexLock storeLock(_docStoreMutex);
    store = std::exchange(_docStore, nullptr);
  }
  if (store != nullptr) store->close();
  log().standard("Indexer has shut down");
}
