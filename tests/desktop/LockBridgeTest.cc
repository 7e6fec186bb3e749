#include <gmock/gmock.h>
#include <systemd/sd-bus.h>

#include <csignal>
#include <memory>

#include "platform/Files.h"
#include "tests/desktop/Bus.h"
#include "tests/desktop/MockLogind.h"
#include "tests/support/Programs.h"
#include "tests/support/TemporaryDirectory.h"

using testing::HasSubstr;
using testsupport::MockLogind;
using testsupport::Process;

namespace {

constexpr const char* kOpen = "0 1\n";
constexpr const char* kLocked = "1 1\n";

// The bridge on a bus of the test, where logind may be.
class LockBridgeTest : public testing::Test {
 protected:
  void SetUp() override {
    NEED_PROGRAMS("dbus-daemon")
    ASSERT_TRUE(platform::createDirectories(runtime, nullptr));
    bus = std::make_unique<testsupport::Bus>(directory.path(), "system");
  }

  void startLogind(MockLogind::State state) {
    logind = std::make_unique<MockLogind>(bus->address(), state);
  }
  void startBridge() {
    bridge =
        std::make_unique<Process>(std::vector<std::string>{TALLOW_BRIDGE_PROGRAM},
                                  Process::Variables{{"RUNTIME_DIRECTORY", runtime},
                                                     {"DBUS_SYSTEM_BUS_ADDRESS", bus->address()}},
                                  directory / "bridge.log");
  }
  void start(MockLogind::State state) {
    startLogind(state);
    startBridge();
    ASSERT_TRUE(bridge->awaitReady()) << bridge->log();
  }

  [[nodiscard]] std::string status() const {
    return platform::readFile(runtime + "/lock_status", 64, nullptr).value_or("none");
  }
  void await(const std::string& status) const {
    testsupport::awaitFile(runtime, "lock_status", status);
  }
  // The bridge answers calls in order with the signals of the same sender.
  void awaitSignalsOf(sd_bus* sender) const {
    sd_bus_message* reply = nullptr;
    EXPECT_GE(sd_bus_call_method(sender, logind->delayer().c_str(), "/",
                                 "org.freedesktop.DBus.Peer", "Ping", nullptr, &reply, ""),
              0);
    sd_bus_message_unref(reply);
  }

  const testsupport::TemporaryDirectory directory;
  const std::string runtime = directory / "run";
  std::unique_ptr<testsupport::Bus> bus;
  std::unique_ptr<MockLogind> logind;
  std::unique_ptr<Process> bridge;
};

}  // namespace

TEST_F(LockBridgeTest, FollowsSignalsAndHintOfItsSession) {
  start({true, true});
  EXPECT_EQ(status(), kLocked);
  logind->setHint(false);
  await(kOpen);
  logind->signalSession("Lock");
  await(kLocked);
  logind->signalSession("Unlock");
  await(kOpen);
  logind->setHint(true);
  await(kLocked);
  logind->signalSession("Unlock", true);  // another session's, which arrives before the next signal
  logind->prepareForSleep(true);
  logind->awaitDelayReleased();
  EXPECT_EQ(status(), kLocked);
  logind->prepareForSleep(false);
  logind->setHint(false);
  await(kOpen);
  EXPECT_EQ(bridge->end(SIGTERM), 0);
  EXPECT_EQ(status(), kLocked);
}

// The status is on the disk before the bridge lets the device go to sleep.
TEST_F(LockBridgeTest, SleepWaitsForTheStatus) {
  start({true, false});
  logind->awaitDelayTaken();
  for (int i = 0; i < 3; ++i) {
    ASSERT_EQ(status(), kOpen);
    logind->prepareForSleep(true);
    logind->awaitDelayReleased();
    EXPECT_EQ(status(), kLocked);
    logind->prepareForSleep(false);
    logind->awaitDelayTaken();
    await(kOpen);
  }
}

TEST_F(LockBridgeTest, FollowsSessionsAndIsLockedWithoutOne) {
  start({false, false});
  EXPECT_EQ(status(), kLocked);
  logind->beginSession(false);
  await(kOpen);
  logind->endSession();
  await(kLocked);
  logind->beginSession(false);
  await(kOpen);
  logind->beginSession(true);
  await(kLocked);
  logind->setHint(false);
  await(kOpen);
  // logind is restarted.
  logind.reset();
  startLogind({false, false});
  await(kLocked);
  logind->beginSession(false);
  await(kOpen);
}

// Every process may send any signal on the system bus to the bridge.
TEST_F(LockBridgeTest, IgnoresForgedSignals) {
  start({true, true});
  sd_bus* const forger = testsupport::connectTo(bus->address());
  for (const char* member : {"Lock", "Unlock"}) {
    sd_bus_message* signal = nullptr;
    ASSERT_GE(sd_bus_message_new_signal(forger, &signal, logind->sessionPath().c_str(),
                                        "org.freedesktop.login1.Session", member),
              0);
    ASSERT_GE(sd_bus_send_to(forger, signal, logind->delayer().c_str(), nullptr), 0);
    sd_bus_message_unref(signal);
  }
  awaitSignalsOf(forger);
  EXPECT_EQ(status(), kLocked);
  sd_bus_flush_close_unref(forger);
}

TEST_F(LockBridgeTest, WithoutLogindTheReasonIsTold) {
  startBridge();
  EXPECT_EQ(bridge->end(), 1);
  EXPECT_THAT(bridge->log(), HasSubstr("tallow-lock-bridge: logind does not answer"));
  EXPECT_EQ(status(), kLocked);
  startLogind({true, false});
  startBridge();
  ASSERT_TRUE(bridge->awaitReady());
  EXPECT_EQ(status(), kOpen);
  bus->end();
  EXPECT_EQ(bridge->end(), 1);
  EXPECT_THAT(bridge->log(), HasSubstr("the system bus has gone away"));
  EXPECT_EQ(status(), kLocked);
}

TEST_F(LockBridgeTest, WrongUse) {
  Process wrong({TALLOW_BRIDGE_PROGRAM, "--now"}, {}, directory / "wrong.log");
  EXPECT_EQ(wrong.end(), 2);
  EXPECT_THAT(wrong.log(), HasSubstr("takes no arguments"));
}
