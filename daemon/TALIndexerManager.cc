#include "daemon/TALIndexerManager.h"

#include <cerrno>
#include <utility>

#include "daemon/TLDeviceLockMonitor.h"
#include "docstore/TALSqliteDocStore.h"
#include "platform/Paths.h"
#include "records/TLErrorCodes.h"

namespace {

// More than the recovery of a class's two databases writes.
constexpr uint64_t kOpeningRoom = 32 * 1024 * 1024;
constexpr size_t kOpeningDescriptors = 16;  // more than opening the two databases needs at a time

bool createClassDirectory(const std::string& root, const std::string& protectionClass,
                          TLErrorOut error) {
  if (!platform::namesOneDirectory(protectionClass)) {
    const bool tooLong = protectionClass.size() > platform::kMaxNameBytes;
    platform::setError(error, platform::posixError(tooLong ? ENAMETOOLONG : EINVAL,
                                                   "a protection class must name one directory"));
    return false;
  }
  return platform::createDirectories(platform::joinPath(root, protectionClass), error,
                                     protectionClass);
}

}  // namespace

const platform::Log& TALIndexerManager::log() {
  static const platform::Log handle(platform::kSubsystem, "TALIndexerManager");
  return handle;
}

TLError TALIndexerManager::indexerUnavailableError() {
  return {kTALIndexerManagerErrorDomain, static_cast<int>(TALIndexerManagerError::unavailable),
          "Indexer unavailable."};
}

TALIndexerManager::TALIndexerManager(std::string path)
    : TALIndexerManager(std::move(path), [] {
        return LockState{TLDeviceUnlockedSinceBoot(), TLProtectedDataAvailable()};
      }) {}

TALIndexerManager::TALIndexerManager(std::string path, LockStateSource lockState,
                                     FreeBytesSource freeBytes)
    : _path(std::move(path)),
      _lockState(std::move(lockState)),
      _freeBytes(std::move(freeBytes)),
      _indexersQueue("com.quill.tallow.IndexerManager", platform::QueuePriority::background) {}

std::vector<std::shared_ptr<TALIndexer>> TALIndexerManager::allIndexers() {
  std::vector<std::shared_ptr<TALIndexer>> all;
  _indexersQueue.sync([&] {
    for (const auto& [protectionClass, indexer] : _indexers) all.push_back(indexer);
  });
  return all;
}

std::shared_ptr<TALIndexer> TALIndexerManager::indexerWithProtectionClass(
    const std::string& protectionClass, TLErrorOut error) {
  const LockState lock = _lockState();
  if (!lock.unlockedSinceBoot) {
    log().error("Not providing a requested {} indexer prior to first unlock.", protectionClass);
    platform::setError(error, indexerUnavailableError());
    return nullptr;
  }
  if (protectionClass == SysFileProtectionComplete && !lock.protectedDataAvailable) {
    log().error(
        "Not providing an SysFileProtectionComplete indexer without protected data available.");
    platform::setError(error, indexerUnavailableError());
    return nullptr;
  }
  std::shared_ptr<TALIndexer> indexer;
  _indexersQueue.sync([&] {
    const auto entry = _indexers.find(protectionClass);
    if (entry != _indexers.end()) {
      indexer = entry->second;
      return;
    }
    log().standard(
        "No existing indexer with type {}. Attempting to create a new one with "
        "DeviceUnlockedSinceBoot={}, ProtectedDataAvailable={}.",
        protectionClass, platform::yesNo(lock.unlockedSinceBoot),
        platform::yesNo(lock.protectedDataAvailable));
    indexer = _createIndexerWithProtectionType(protectionClass, error);
    if (indexer != nullptr) _indexers.emplace(protectionClass, indexer);
  });
  return indexer;
}

std::shared_ptr<TALIndexer> TALIndexerManager::_createIndexerWithProtectionType(
    const std::string& protectionClass, TLErrorOut error) {
  std::optional<TLError> failure;
  if (!createClassDirectory(_path, protectionClass, &failure)) {
    log().fault("Could not create {} protected directory: {}", protectionClass,
                platform::printable(failure));
    platform::setError(error, *failure);
    return nullptr;
  }
  const std::string directory = platform::joinPath(_path, protectionClass);
  if (const uint64_t free = _freeBytes(directory); free < kOpeningRoom) {
    log().error("Not opening {}: {} bytes are left on the disk", directory, free);
    platform::setError(error, platform::posixError(ENOSPC, directory));
    return nullptr;
  }
  if (platform::freeDescriptors() < kOpeningDescriptors + platform::descriptorReserve()) {
    log().error("Not opening {}: too few file descriptors are left", directory);
    platform::setError(error, platform::posixError(EMFILE, directory));
    return nullptr;
  }
  const std::string docStorePath = platform::joinPath(directory, "docstore/docstore.db");
  auto docStore = std::make_shared<TALSqliteDocStore>(docStorePath);
  if (!docStore->openWithError(&failure)) {
    log().error("Could not create doc store in {}: {}", docStorePath, platform::printable(failure));
    platform::setError(error, failure.value_or(indexerUnavailableError()));
    return nullptr;
  }
  const std::string saltPath = platform::textIndexPath(_path, protectionClass);
  const std::string synonymPath = platform::synonymFilePath();
  log().standard("Creating indexer saltPath={} docStorePath: {} synonymPath: {}", saltPath,
                 docStorePath, synonymPath);
  auto indexer = std::make_shared<TALIndexer>(saltPath, protectionClass, docStore, synonymPath);
  if (const auto opening = indexer->openingError()) {
    log().error("Could not open {}: {}", protectionClass, platform::printable(opening));
    platform::setError(error, *opening);
    indexer->shutdown();
    return nullptr;
  }
  return indexer;
}
