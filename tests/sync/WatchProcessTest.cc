#include "tests/sync/WatchProcessSupport.h"

namespace fs = std::filesystem;
using testsupport::WatchProcessTest;

TEST_F(WatchProcessTest, FollowsMailAndFolders) {
  deliver("a", "1");
  waitUntilInStep();
  // Marked read, flagged, and moved to another folder.
  fs::rename(mail + "/a/new/1", mail + "/b/cur/1:2,FS");
  deliver("a", "2");
  waitUntilInStep();
  // A folder with arbitrary bytes in its name, created with its mail and renamed.
  makeFolder("c");
  deliver("c", "\xfc\xff");
  fs::rename(mail + "/c", mail + "/\xe9t\xe9");
  waitUntilInStep();
  deliver("\xe9t\xe9", "4");
  waitUntilInStep();
  fs::remove(mail + "/b/cur/1:2,FS");
  EXPECT_EQ(waitUntilInStep(), 3U);
  // A folder that disappears and comes back.
  fs::rename(mail + "/a", directory / "elsewhere");
  waitUntilSaid("is not there");
  EXPECT_EQ(indexed().size(), 3U);
  fs::rename(directory / "elsewhere", mail + "/a");
  deliver("a", "5");
  EXPECT_EQ(waitUntilInStep(), 4U);
  EXPECT_EQ(watch->end(SIGTERM), 0);
}

TEST_F(WatchProcessTest, FindsChangesThatTheKernelDropped) {
  const auto text = platform::readFile("/proc/sys/fs/inotify/max_queued_events", 100, nullptr);
  const int queued = std::atoi(text.value_or("0").c_str());
  if (queued <= 0 || queued > 200000) GTEST_SKIP() << "a queue of " << queued << " events";
  deliver("a", "1");
  waitUntilInStep();
  watch->signal(SIGSTOP);
  for (int i = 0; i <= queued; ++i) {
    fs::rename(mail + "/a/new/1", mail + "/a/new/2");
    fs::rename(mail + "/a/new/2", mail + "/a/new/1");
  }
  deliver("b", "3");
  watch->signal(SIGCONT);
  EXPECT_EQ(waitUntilInStep(), 2U);
}

TEST_F(WatchProcessTest, AThousandRenamesWhileTheDaemonRestarts) {
  constexpr int kMany = 1000;
  for (int i = 0; i < kMany; ++i) deliver("a", std::to_string(i));
  waitUntilInStep();
  daemon->signal(SIGKILL);
  for (int i = 0; i < kMany; ++i) {
    const std::string name = std::to_string(i);
    fs::rename(mail + "/a/new/" + name, mail + "/b/cur/" + name + ":2,S");
  }
  waitUntilSaid("tried again");
  startDaemon();
  EXPECT_EQ(waitUntilInStep(), static_cast<size_t>(kMany));
  EXPECT_EQ(watch->end(SIGINT), 0);
}
