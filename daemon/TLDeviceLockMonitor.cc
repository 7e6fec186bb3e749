#include "daemon/TLDeviceLockMonitor.h"

#include <array>

namespace {

constexpr const char* kNotification = "com.quill.mobile.lockstated.lock_status";

// The meaning of a lock state, by its number.
struct StateRow {
  const char* word;
  bool available;  // protected data can be read; the device has been unlocked
  void (TLDeviceLockObserver::*call)();
};
constexpr std::array<StateRow, 4> kStates{{
    {"Device unlocked", true, &TLDeviceLockObserver::protectedDataDidBecomeAvailable},
    {"Device locked", false, &TLDeviceLockObserver::protectedDataDidBecomeUnavailable},
    {"Device locking", false, &TLDeviceLockObserver::protectedDataWillBecomeUnavailable},
    {"Device unlocked", true, &TLDeviceLockObserver::protectedDataDidBecomeAvailable},
}};

}  // namespace

const platform::Log& TLDeviceLockMonitor::log() {
  static const platform::Log handle(platform::kSubsystem, "TLDeviceLockMonitor");
  return handle;
}

TLDeviceLockMonitor& TLDeviceLockMonitor::sharedInstance() {
  static TLDeviceLockMonitor instance(platform::deviceVault());
  return instance;
}

TLDeviceLockMonitor::TLDeviceLockMonitor(DeviceVault& vault)
    : _vault(vault),
      _deviceUnlockedSinceBoot(vault.DVLDeviceUnlockedSinceBoot() != 0),
      _dispatchQueue("com.quill.tallow.deviceLockMonitor") {
  // Before reading the state, so that no change in between is lost.
  _deviceLockSetupNotification();
  const uint32_t state = _vault.DVLGetDeviceLockState(0);
  if (state >= kStates.size()) {
    log().fault("Unexpected device lock state: {}", state);
  } else {
    _protectedDataAvailable = kStates[state].available;
  }
  log().standard("lockState: {}, unlockedSinceBoot: {:d}, protectedDataAvailable: {:d}", state,
                 deviceUnlockedSinceBoot(), protectedDataAvailable());
}

TLDeviceLockMonitor::~TLDeviceLockMonitor() {
  if (_lockStateNotifyToken != -1) _vault.cancel(_lockStateNotifyToken);
  _lockStateNotifyToken = -1;
}

void TLDeviceLockMonitor::_deviceLockSetupNotification() {
  const uint32_t status = _vault.registerNotification(
      kNotification, _dispatchQueue, [this] { lockStateChanged(); }, &_lockStateNotifyToken);
  if (status != 0) {
    log().fault("Failed to setup notification handler for {}, error status: {}", kNotification,
                status);
  }
}

void TLDeviceLockMonitor::lockStateChanged() {
  const uint32_t state = _vault.DVLGetDeviceLockState(0);
  if (state >= kStates.size()) {
    _protectedDataAvailable = false;
    log().fault(
        "Device lock state changed to unexpected state: {}, unlockedSinceBoot: {:d}, "
        "protectedDataAvailable {:d}",
        state, deviceUnlockedSinceBoot(), protectedDataAvailable());
    return;
  }
  const StateRow& row = kStates[state];
  _protectedDataAvailable = row.available;
  if (row.available) _deviceUnlockedSinceBoot = true;
  log().standard("{} with state: {}, unlockedSinceBoot: {:d}, protectedDataAvailable {:d}",
                 row.word, state, deviceUnlockedSinceBoot(), protectedDataAvailable());
  notifyDelegate(row.call, row.available);
}

void TLDeviceLockMonitor::notifyDelegate(Call call, bool readDelegateAgain) {
  const auto observer = _delegate->lock();
  if (observer == nullptr) return;
  const auto queue = _delegate->lockQueue();
  if (queue == nullptr) {
    ((*observer).*call)();
  } else if (!readDelegateAgain) {
    queue->submit([observer, call] { ((*observer).*call)(); });
  } else {
    queue->submit([delegate = _delegate, call] {
      if (const auto current = delegate->lock()) ((*current).*call)();
    });
  }
}

void TLDeviceLockMonitor::setDelegate(const std::shared_ptr<TLDeviceLockObserver>& delegate,
                                      const std::shared_ptr<platform::SerialQueue>& delegateQueue) {
  _dispatchQueue.sync([&] {
    platform::MutexLock lock(_delegate->mutex);
    _delegate->observer = delegate;
    _delegate->queue = delegateQueue;
  });
}

bool TLDeviceUnlockedSinceBoot() {
  return TLDeviceLockMonitor::sharedInstance().deviceUnlockedSinceBoot();
}

bool TLProtectedDataAvailable() {
  return TLDeviceLockMonitor::sharedInstance().protectedDataAvailable();
}
