#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "platform/Queue.h"
#include "platform/TLError.h"

// The device's key store: whether the device is locked, and whether it has been unlocked since
// boot.
//
// Threads: all operations may be called from any thread. A handler runs on the queue given with it
// and is not called again once `cancel` has returned and the queue has drained.
class DeviceVault {
 public:
  virtual ~DeviceVault() = default;

  // 0 and 3 unlocked, 1 locked, 2 locking. `index` is always 0.
  [[nodiscard]] virtual uint32_t DVLGetDeviceLockState(int index) = 0;

  // Non-zero when the device has been unlocked since boot.
  [[nodiscard]] virtual int DVLDeviceUnlockedSinceBoot() = 0;

  // Calls `handler` on `queue` after each change. The result is 0 on success, and then `token` is
  // set to a value that is not -1; otherwise it is an errno value.
  [[nodiscard]] virtual uint32_t registerNotification(const std::string& name,
                                                      platform::SerialQueue& queue,
                                                      std::function<void()> handler,
                                                      int32_t* token) = 0;
  virtual void cancel(int32_t token) = 0;
};

namespace platform {

// The process-wide vault.
[[nodiscard]] DeviceVault& deviceVault();

// A vault over a text file that holds the lock state and 0 or 1 for unlocked-since-boot, separated
// by spaces. Without the file the device counts as unlocked; an invalid file counts as locked and
// not yet unlocked. The vault owns and joins a thread that watches the directory with inotify, also
// after the directory has been replaced.
[[nodiscard]] std::unique_ptr<DeviceVault> makeFileDeviceVault(std::string path);

// Replaces that file in one step. The device counts as unlocked since boot.
bool writeLockStatus(const std::string& path, bool locked, TLErrorOut error);

}  // namespace platform
