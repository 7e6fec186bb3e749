#include <gtest/gtest.h>

#include <cstdlib>
#include <future>

#include "client/DebugServiceProxy.h"
#include "client/SearchServiceProxy.h"
#include "daemon/IdleExit.h"
#include "platform/FileDescriptor.h"
#include "platform/Files.h"
#include "rpc/Names.h"
#include "rpc/Server.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/daemon/DaemonSupport.h"
#include "tests/support/LogCapture.h"
#include "tests/support/RawMessages.h"
#include "tests/support/TemporaryDirectory.h"

using testsupport::connectTo;
using testsupport::DaemonProcess;

namespace {

// The two sockets of the daemon as systemd holds them.
class Sockets {
 public:
  explicit Sockets(const std::string& directory) : _directory(directory) {
    EXPECT_TRUE(platform::createDirectories(directory + "/run", nullptr));
    for (const char* const name : {rpc::kSearchServiceName, rpc::kDebugServiceName}) {
      _sockets.emplace_back(testsupport::listenAt(directory + "/run/" + name));
    }
  }

  // `count` of the sockets are passed.
  [[nodiscard]] DaemonProcess startDaemon(size_t count = 2) const {
    std::string names = rpc::kSearchServiceName;
    if (count > 1) names += std::string(":") + rpc::kDebugServiceName;
    std::vector<int> passed;
    for (size_t i = 0; i < count; ++i) passed.push_back(_sockets[i].get());
    return DaemonProcess(_directory, {{"LISTEN_FDNAMES", names}}, passed);
  }

 private:
  const std::string _directory;
  std::vector<platform::FileDescriptor> _sockets;
};

}  // namespace

TEST(IdleExitTest, TheTimeBeginsWhenTheLastConnectionEnds) {
  platform::RunLoop loop;
  bool ended = false;
  IdleExit exit(loop, 1, [&] {
    ended = true;
    loop.stop();
  });
  exit.connectionsChanged(2);
  exit.connectionsChanged(1);
  // Timers run in the order of their times, so the exit would be first.
  const auto later = loop.addTimer(20, [&] {
    EXPECT_FALSE(ended);
    exit.connectionsChanged(0);
  });
  loop.run();
  EXPECT_TRUE(ended);
}

TEST(IdleExitTest, APausedListenerLeavesAConnectionInTheSocket) {
  const testsupport::TemporaryDirectory directory;
  platform::RunLoop loop;
  const auto listener = rpc::makeListener(loop, directory.path(), rpc::kDebugServiceName);
  listener->setDelegate([](rpc::Listener&, rpc::Connection&) { return true; });
  platform::FileDescriptor client;
  std::unique_ptr<platform::RunLoop::Source> later;
  std::vector<size_t> open;
  listener->setConnectionsHandler([&](size_t count) {
    open.push_back(count);
    if (later != nullptr) return;
    if (count == 1) return client.reset();
    listener->pause();
    client = connectTo(directory / rpc::kDebugServiceName);
    // A connection that is accepted would be counted first.
    later = loop.addTimer(20, [&] { loop.stop(); });
  });
  ASSERT_TRUE(listener->resume(nullptr));
  client = connectTo(directory / rpc::kDebugServiceName);
  loop.run();
  EXPECT_EQ(open, (std::vector<size_t>{1, 0}));
}

TEST(IdleExitTest, OnlyANumberOfSecondsIsALimit) {
  unsetenv("TALLOW_IDLE_EXIT");
  EXPECT_EQ(IdleExit::limitSeconds(), std::nullopt);
  setenv("TALLOW_IDLE_EXIT", "600", 1);
  EXPECT_EQ(IdleExit::limitSeconds(), 600u);
  for (const char* const bad : {"0", "-1", "10min", " 5", "31622401", "99999999999999999999"}) {
    setenv("TALLOW_IDLE_EXIT", bad, 1);
    const testsupport::LogCapture log;
    EXPECT_EQ(IdleExit::limitSeconds(), std::nullopt) << bad;
    EXPECT_TRUE(log.contains("TALLOW_IDLE_EXIT is no number of seconds")) << bad;
  }
}

TEST(IdleExitTest, ACallThatArrivesDuringTheExitIsAnsweredByTheNextDaemon) {
  const testsupport::TemporaryDirectory directory;
  setenv("TALLOW_IDLE_EXIT", "1", 1);
  const Sockets sockets(directory.path());
  DaemonProcess first = sockets.startDaemon();
  ASSERT_TRUE(first.ready());
  {
    client::SearchServiceProxy service(first.runtimeDirectory());
    ASSERT_TRUE(service.indexItems(testsupport::mails("a", 20), "test", "default", nullptr));
  }
  ASSERT_TRUE(first.waitForLog("No connection for a while: ending."));
  auto late = std::async(std::launch::async, [&] {
    client::SearchServiceProxy service(first.runtimeDirectory());
    return testsupport::search(service, "word");
  });
  EXPECT_EQ(first.wait(), 0);
  EXPECT_TRUE(platform::fileExists(first.socketOf(rpc::kDebugServiceName)));
  const DaemonProcess second = sockets.startDaemon();
  EXPECT_EQ(late.get(), 20);
  client::DebugServiceProxy debug(second.runtimeDirectory());
  EXPECT_TRUE(debug.ping("x", nullptr));
}

TEST(IdleExitTest, ADaemonWithASocketOfItsOwnStays) {
  const testsupport::TemporaryDirectory directory;
  setenv("TALLOW_IDLE_EXIT", "1", 1);
  const Sockets sockets(directory.path());
  platform::removeItem(directory / "run/" + rpc::kDebugServiceName, nullptr);
  DaemonProcess daemon = sockets.startDaemon(1);
  ASSERT_TRUE(daemon.ready());
  EXPECT_TRUE(daemon.waitForLog("TALLOW_IDLE_EXIT is ignored"));
}
