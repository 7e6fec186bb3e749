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

// The strictest protection class: its data is unreadable while the device is locked.
inline constexpr const char* SysFileProtectionComplete = "SysFileProtectionComplete";

// Owns the indexers, one for each data-protection class, created at first use and kept. Refuses
// access to a class that the lock state of the device does not allow.
//
// A class is any string that is a valid directory name; its data lies in the data root under that
// name.
//
// Threads: any. Look-ups and creations run one at a time on the manager's queue. A creation opens
// the databases of the class there, and requests for other classes wait for it.
class TALIndexerManager {
 public:
  // The lock state of the device.
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

  // The indexer of the class, or null with an error: indexerUnavailableError, or an error of the
  // file system or the store. After an error nothing is kept, and the next request tries again. A
  // class is not opened on a nearly full disk (ENOSPC), because recovering its databases needs
  // space, and an index that cannot be recovered starts empty.
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
  std::unordered_map<std::string, std::shared_ptr<TALIndexer>> _indexers;  // used on the queue only
  platform::SerialQueue _indexersQueue;
};
