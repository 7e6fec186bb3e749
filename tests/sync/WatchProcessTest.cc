#include <fcntl.h>
#include <fmt/format.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <set>

#include "cli/Identifier.h"
#include "platform/Assert.h"
#include "platform/FileDescriptor.h"
#include "platform/Files.h"
#include "sync/Inventory.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/TemporaryDirectory.h"

// `tallow watch` as a process of its own, beside the daemon.

namespace fs = std::filesystem;

namespace {

constexpr size_t kMaximumLog = size_t{16} << 20;

class WatchProcessTest : public testing::Test {
 protected:
  WatchProcessTest() {
    makeFolder("a");
    makeFolder("b");
    startDaemon();
    startWatch();
  }
  ~WatchProcessTest() override {
    if (pid > 0) end(SIGKILL);
  }

  void startDaemon() {
    daemon.reset();
    daemon = std::make_unique<testsupport::DaemonProcess>(directory.path());
    TL_ASSERT(daemon->ready());
  }
  void startWatch() {
    const int log = open(logPath.c_str(), O_CREAT | O_WRONLY | O_APPEND | O_CLOEXEC, 0600);
    TL_ASSERT(inotify_add_watch(logChanges.get(), logPath.c_str(), IN_MODIFY) >= 0);
    pid = fork();
    TL_ASSERT(pid >= 0);
    if (pid == 0) {
      setenv("RUNTIME_DIRECTORY", daemon->runtimeDirectory().c_str(), 1);
      setenv("XDG_STATE_HOME", (directory / "client").c_str(), 1);
      setenv("XDG_CONFIG_HOME", (directory / "config").c_str(), 1);
      dup2(log, 2);
      execl(TALLOW_PROGRAM, TALLOW_PROGRAM, "watch", mail.c_str(), nullptr);
      _exit(127);
    }
    close(log);
  }
  // The exit status, or 128 and the number of the signal that ended it.
  int end(int signal) {
    kill(pid, signal);
    int status = 0;
    waitpid(pid, &status, 0);
    pid = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  }

  void makeFolder(const std::string& folder) const {
    for (const char* sub : {"cur", "new", "tmp"}) {
      fs::create_directories(mail + '/' + folder + '/' + sub);
    }
  }
  // As a delivery agent does.
  void deliver(const std::string& folder, const std::string& name) const {
    const std::string base = mail + '/' + folder;
    std::ofstream(base + "/tmp/" + name)
        << fmt::format("From: a@example.org\nSubject: {}\n\nText\n", name);
    fs::rename(base + "/tmp/" + name, base + "/new/" + name);
  }
  [[nodiscard]] std::string log() const {
    return platform::readFile(logPath, kMaximumLog, nullptr).value_or("");
  }
  [[nodiscard]] std::set<std::string> indexed() const {
    client::SearchServiceProxy service(daemon->runtimeDirectory());
    const auto found = mailsync::readInventory(service, "default", {mail}, {mail}, nullptr);
    return found ? std::set(found->begin(), found->end()) : std::set<std::string>{"no answer"};
  }
  [[nodiscard]] std::set<std::string> onDisk() const {
    std::set<std::string> found;
    for (const auto& entry : fs::recursive_directory_iterator(mail)) {
      const std::string path = entry.path().string();
      if (cli::isMaildirFile(path)) found.insert(cli::maildirIdentifier(path));
    }
    return found;
  }
  // Waits, from one line of the watch's log to the next, until `holds`. A watch that does not get
  // there is ended by the time limit of the test.
  template <typename Condition>
  void waitUntil(const Condition& holds) const {
    while (!holds()) {
      pollfd changes{logChanges.get(), POLLIN, 0};
      poll(&changes, 1, -1);
      std::array<char, 4096> events;
      while (read(logChanges.get(), events.data(), events.size()) > 0) {
      }
    }
  }
  void waitUntilInStep() const {
    waitUntil([this] { return indexed() == onDisk(); });
  }
  void waitUntilSaid(const std::string& text) const {
    waitUntil([&] { return log().find(text) != std::string::npos; });
  }

  testsupport::TemporaryDirectory directory;
  const std::string mail = directory / "mail";
  const std::string logPath = directory / "watch.log";
  const platform::FileDescriptor logChanges{inotify_init1(IN_CLOEXEC | IN_NONBLOCK)};
  std::unique_ptr<testsupport::DaemonProcess> daemon;
  pid_t pid = -1;
};

}  // namespace

TEST_F(WatchProcessTest, FollowsMailAndFolders) {
  deliver("a", "1");
  waitUntilInStep();
  // Read, flagged, and to another folder.
  fs::rename(mail + "/a/new/1", mail + "/b/cur/1:2,FS");
  deliver("a", "2");
  waitUntilInStep();
  // A folder with a name of any bytes, made with its mail and renamed.
  makeFolder("c");
  deliver("c", "\xfc\xff");
  fs::rename(mail + "/c", mail + "/\xe9t\xe9");
  waitUntilInStep();
  deliver("\xe9t\xe9", "4");
  waitUntilInStep();
  fs::remove(mail + "/b/cur/1:2,FS");
  waitUntilInStep();
  EXPECT_EQ(indexed().size(), 3U);
  // One that vanishes and comes back.
  fs::rename(mail + "/a", directory / "elsewhere");
  waitUntilSaid("is not there");
  EXPECT_EQ(indexed().size(), 3U);
  fs::rename(directory / "elsewhere", mail + "/a");
  deliver("a", "5");
  waitUntilInStep();
  EXPECT_EQ(indexed().size(), 4U);
  EXPECT_EQ(end(SIGTERM), 0);
}

TEST_F(WatchProcessTest, FindsWhatTheKernelCouldNotTell) {
  const auto text = platform::readFile("/proc/sys/fs/inotify/max_queued_events", 100, nullptr);
  const int queued = std::atoi(text.value_or("0").c_str());
  if (queued <= 0 || queued > 200000) GTEST_SKIP() << "a queue of " << queued << " events";
  deliver("a", "1");
  waitUntilInStep();
  kill(pid, SIGSTOP);
  for (int i = 0; i <= queued; ++i) {
    fs::rename(mail + "/a/new/1", mail + "/a/new/2");
    fs::rename(mail + "/a/new/2", mail + "/a/new/1");
  }
  deliver("b", "3");
  kill(pid, SIGCONT);
  waitUntilInStep();
  EXPECT_EQ(indexed().size(), 2U);
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
  waitUntilInStep();
  EXPECT_EQ(indexed().size(), static_cast<size_t>(kMany));
  EXPECT_EQ(end(SIGINT), 0);
}
