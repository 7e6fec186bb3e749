#pragma once

#include <atomic>
#include <memory>

#include "platform/DeviceVault.h"
#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/Queue.h"

// Called when the state of the device changes, for what has to close then. The daemon has no such
// part: it asks for the state at each request.
class TLDeviceLockObserver {
 public:
  virtual ~TLDeviceLockObserver() = default;
  virtual void protectedDataDidBecomeAvailable() = 0;
  virtual void protectedDataWillBecomeUnavailable() = 0;
  virtual void protectedDataDidBecomeUnavailable() = 0;
};

// Tracks whether the device has been unlocked at least once since boot, and whether protected data
// is readable now.
//
// Threads: both values may be read on any thread without a lock, and may lag by one notification.
// They are written on the monitor's own queue. The observer is called there, or on the queue given
// with it.
class TLDeviceLockMonitor {
 public:
  static TLDeviceLockMonitor& sharedInstance();

  // The vault must outlive the monitor.
  explicit TLDeviceLockMonitor(DeviceVault& vault);
  ~TLDeviceLockMonitor();
  TLDeviceLockMonitor(const TLDeviceLockMonitor&) = delete;
  TLDeviceLockMonitor& operator=(const TLDeviceLockMonitor&) = delete;

  // Becomes true once and stays true.
  [[nodiscard]] bool deviceUnlockedSinceBoot() const { return _deviceUnlockedSinceBoot; }
  [[nodiscard]] bool protectedDataAvailable() const { return _protectedDataAvailable; }

  // Both arguments are held weakly. Not from the monitor's queue.
  void setDelegate(const std::shared_ptr<TLDeviceLockObserver>& delegate,
                   const std::shared_ptr<platform::SerialQueue>& delegateQueue);

  static const platform::Log& log();

 private:
  using Call = void (TLDeviceLockObserver::*)();

  void _deviceLockSetupNotification();
  void lockStateChanged();
  void notifyDelegate(Call call, bool readDelegateAgain);

  DeviceVault& _vault;
  int32_t _lockStateNotifyToken = -1;
  std::atomic<bool> _deviceUnlockedSinceBoot;
  std::atomic<bool> _protectedDataAvailable{false};
  // The arguments of setDelegate, shared with calls on the delegate's queue, which may outlive the
  // monitor.
  struct Delegate {
    platform::Mutex mutex;
    std::weak_ptr<TLDeviceLockObserver> observer TL_GUARDED_BY(mutex);
    std::weak_ptr<platform::SerialQueue> queue TL_GUARDED_BY(mutex);

    std::shared_ptr<TLDeviceLockObserver> lock() TL_EXCLUDES(mutex) {
      platform::MutexLock held(mutex);
      return observer.lock();
    }
    std::shared_ptr<platform::SerialQueue> lockQueue() TL_EXCLUDES(mutex) {
      platform::MutexLock held(mutex);
      return queue.lock();
    }
  };
  const std::shared_ptr<Delegate> _delegate = std::make_shared<Delegate>();
  platform::SerialQueue _dispatchQueue;  // last, so that it ends before what its items use
};

// The values of the shared monitor, which the first call creates.
[[nodiscard]] bool TLDeviceUnlockedSinceBoot();
[[nodiscard]] bool TLProtectedDataAvailable();
