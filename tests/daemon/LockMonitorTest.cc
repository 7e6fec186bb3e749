#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <semaphore>

#include "daemon/TLDeviceLockMonitor.h"
#include "platform/Files.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

class FakeVault : public DeviceVault {
 public:
  uint32_t DVLGetDeviceLockState(int) override { return state; }
  int DVLDeviceUnlockedSinceBoot() override { return unlocked; }
  uint32_t registerNotification(const std::string& name, platform::SerialQueue& queue,
                                std::function<void()> handler, int32_t* token) override {
    EXPECT_EQ(name, "com.quill.mobile.lockstated.lock_status");
    if (status == 0) *token = 7;
    onQueue = &queue;
    notify = std::move(handler);
    return status;
  }
  void cancel(int32_t token) override { cancelled = token; }

  // Changes the state and waits until its handler has run.
  void change(uint32_t newState) {
    state = newState;
    onQueue->sync(notify);
  }

  std::atomic<uint32_t> state{0};
  int unlocked = 1;
  uint32_t status = 0;
  int32_t cancelled = 0;
  platform::SerialQueue* onQueue = nullptr;
  std::function<void()> notify;
};

struct Observer : TLDeviceLockObserver {
  std::vector<std::string> calls;
  void protectedDataDidBecomeAvailable() override { calls.push_back("available"); }
  void protectedDataWillBecomeUnavailable() override { calls.push_back("will be unavailable"); }
  void protectedDataDidBecomeUnavailable() override { calls.push_back("unavailable"); }
};

}  // namespace

TEST(LockMonitor, FollowsTheStates) {
  const struct {
    uint32_t state;
    bool available;
    bool unlocked;
    const char* line;  // its begin
  } rows[] = {
      {1, false, false, "default TLDeviceLockMonitor: Device locked with"},
      {3, true, true, "default TLDeviceLockMonitor: Device unlocked with"},
      {2, false, true, "default TLDeviceLockMonitor: Device locking with"},
      {0, true, true, "default TLDeviceLockMonitor: Device unlocked with"},
      {4, false, true, "fault TLDeviceLockMonitor: Device lock state changed to unexpected"},
  };
  FakeVault vault;
  vault.unlocked = 0;
  vault.state = 9;
  testsupport::LogCapture log;
  {
    TLDeviceLockMonitor monitor(vault);
    EXPECT_TRUE(log.has("fault TLDeviceLockMonitor: Unexpected device lock state: 9"));
    EXPECT_TRUE(
        log.has("default TLDeviceLockMonitor: lockState: 9, unlockedSinceBoot: 0, "
                "protectedDataAvailable: 0"));
    for (const auto& row : rows) {
      vault.change(row.state);
      EXPECT_EQ(monitor.protectedDataAvailable(), row.available) << row.state;
      EXPECT_EQ(monitor.deviceUnlockedSinceBoot(), row.unlocked) << row.state;
      EXPECT_TRUE(
          log.has(fmt::format("{} state: {}, unlockedSinceBoot: {:d}, protectedDataAvailable {:d}",
                              row.line, row.state, row.unlocked, row.available)));
    }
  }
  EXPECT_EQ(vault.cancelled, 7);
}

TEST(LockMonitor, CallsTheDelegateDirectlyOrOnItsQueue) {
  FakeVault vault;
  TLDeviceLockMonitor monitor(vault);
  const auto observer = std::make_shared<Observer>();
  monitor.setDelegate(observer, nullptr);
  for (const uint32_t state : {1u, 2u, 9u, 3u}) vault.change(state);
  EXPECT_EQ(observer->calls,
            (std::vector<std::string>{"unavailable", "will be unavailable", "available"}));
  observer->calls.clear();
  const auto queue = std::make_shared<platform::SerialQueue>("observer");
  monitor.setDelegate(observer, queue);
  for (const uint32_t state : {2u, 1u, 0u}) vault.change(state);
  queue->drain();
  EXPECT_EQ(observer->calls,
            (std::vector<std::string>{"will be unavailable", "unavailable", "available"}));
}

TEST(LockMonitor, WorksWithoutNotifications) {
  FakeVault vault;
  vault.status = 5;
  testsupport::LogCapture log;
  {
    const TLDeviceLockMonitor monitor(vault);
    EXPECT_TRUE(monitor.protectedDataAvailable());
  }
  EXPECT_TRUE(
      log.has("fault TLDeviceLockMonitor: Failed to setup notification handler for "
              "com.quill.mobile.lockstated.lock_status, error status: 5"));
  EXPECT_EQ(vault.cancelled, 0);
}

TEST(FileDeviceVault, ReadsItsFileAndSeesChangesAlsoInANewDirectory) {
  const testsupport::TemporaryDirectory directory;
  const std::string runtime = directory / "run";
  const std::string path = runtime + "/lock_status";
  ASSERT_TRUE(platform::createDirectories(runtime, nullptr));
  const auto vault = platform::makeFileDeviceVault(path);
  EXPECT_EQ(vault->DVLGetDeviceLockState(0), 0u);
  EXPECT_EQ(vault->DVLDeviceUnlockedSinceBoot(), 1);
  std::atomic<uint32_t> awaited{2};
  std::binary_semaphore seen{0};
  platform::SerialQueue queue("vault");
  int32_t token = -1;
  const auto handler = [&] {
    uint32_t state = vault->DVLGetDeviceLockState(0);
    if (awaited.compare_exchange_strong(state, 9)) seen.release();
  };
  ASSERT_EQ(vault->registerNotification("n", queue, handler, &token), 0u);
  EXPECT_NE(token, -1);
  ASSERT_TRUE(platform::writeFileAtomically(path, "2 1\n", nullptr));
  seen.acquire();
  awaited = 1;
  std::filesystem::rename(runtime, directory / "old");
  ASSERT_TRUE(platform::createDirectories(runtime, nullptr));
  ASSERT_TRUE(platform::writeFileAtomically(path, "1 1\n", nullptr));
  seen.acquire();
  vault->cancel(token);
  for (const char* garbled : {"", "x", "1", "1 2", "-1 1", "0 1 1", "99999999999 1"}) {
    ASSERT_TRUE(platform::writeFileAtomically(path, garbled, nullptr));
    EXPECT_EQ(vault->DVLGetDeviceLockState(0), 1u) << garbled;
    EXPECT_EQ(vault->DVLDeviceUnlockedSinceBoot(), 0) << garbled;
  }
}
