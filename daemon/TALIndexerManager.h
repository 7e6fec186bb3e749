#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "indexer/TALIndexer.h"
#include "platform/Files.h"
#include "platform/Log.h"
#include "platform/Queue.h"
#include "platform/TLError.h"

// The strictest protection class: its data cannot be read while the device is locked.
inline constexpr const char* SysFileProtectionComplete = "SysFileProtectionComplete";

// Owns the indexers, one for each data-protection class, made on first use and kept; and refuses
// one while the device's state does not allow access to the class.
//
// A class is any string that can name one directory: its data lies below the data root under that
// name.
//
// Threads: any. Lookups and creations run one at a time on the manager's queue; a creation opens
// the class's databases there, and requests for other classes wait behind it.
class TALIndexerManager {
 public:
  // What the manager asks the device.
  struct LockState {
    bool unlockedSinceBoot;
    bool protectedDataAvailable;
  };
  using LockStateSource = std::function<LockState()>;
  using FreeBytesSource = std::function<uint64_t(const std::string& path)>;

  explicit TALIndexerManager(std::string path);
  TALIndexerManager(std::string path, LockStateSource lockState,
                    FreeBytesSource freeBytes = platform::freeBytes);

  [[nodiscard]] std::vector<std::shared_ptr<TALIndexer>> allIndexers();

  // The indexer of the class, or null with an error: indexerUnavailableError, or that of the file
  // system or of the store, and then nothing is kept and the next request tries again. A class is
  // not opened on a disk that is nearly full (ENOSPC): recovering its databases takes room, and an
  // index that cannot be recovered starts empty.
  [[nodiscard]] std::shared_ptr<TALIndexer> indexerWithProtectionClass(
      const std::string& protectionClass, TLErrorOut error);

  // The data root.
  [[nodiscard]] const std::string& path() const { return _path; }

  [[nodiscard]] static TLError indexerUnavailableError();
  static const platform::Log& log();

 private:
  std::shared_ptr<TALIndexer> _createIndexerWithProtectionType(const std::string& protectionClass,
                                                               TLErrorOut error);

  const std::string _path;
  const LockStateSource _lockState;
  const FreeBytesSource _freeBytes;
  std::unordered_map<std::string, std::shared_ptr<TALIndexer>> _indexers;  // of the queue's thread
  platform::SerialQueue _indexersQueue;
};
