#pragma once

#include <fcntl.h>
#include <fmt/format.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "cli/Identifier.h"
#include "platform/Assert.h"
#include "platform/FileDescriptor.h"
#include "platform/Files.h"
#include "sync/Inventory.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/TemporaryDirectory.h"

namespace testsupport {

// `tallow watch` as its own process, with a daemon and a mailbox of the test.
class WatchProcessTest : public testing::Test {
 protected:
  static constexpr size_t kMaxLog = size_t{16} << 20;

  WatchProcessTest() {
    makeFolder("a");
    makeFolder("b");
    startDaemon();
    startWatch();
  }
  ~WatchProcessTest() override {
    if (pid > 0) end(SIGKILL);
  }

  // Whether the programs are installed. Without them the test is skipped, but fails with CI=true;
  // scripts/ci-packages.list has them.
  static bool hasPrograms(const std::vector<std::string>& paths) {
    for (const std::string& path : paths) {
      if (std::filesystem::exists(path)) continue;
      const char* const ci = std::getenv("CI");
      if (ci != nullptr && std::string(ci) == "true") ADD_FAILURE() << path << " is not installed";
      [&path] { GTEST_SKIP() << path << " is not installed"; }();
      return false;
    }
    return true;
  }
  void startDaemon() {
    daemon.reset();
    daemon = std::make_unique<DaemonProcess>(directory.path());
    TL_ASSERT(daemon->ready());
  }
  void startWatch() {
    const int log = open(logPath.c_str(), O_CREAT | O_WRONLY | O_APPEND | O_CLOEXEC, 0600);
    TL_ASSERT(inotify_add_watch(logChanges.get(), logPath.c_str(), IN_MODIFY) >= 0);
    pid = fork();
    TL_ASSERT(pid >= 0);
    if (pid == 0) {
      prctl(PR_SET_PDEATHSIG, SIGKILL);
      setenv("RUNTIME_DIRECTORY", daemon->runtimeDirectory().c_str(), 1);
      setenv("XDG_STATE_HOME", (directory / "client").c_str(), 1);
      setenv("XDG_CONFIG_HOME", (directory / "config").c_str(), 1);
      dup2(log, 2);
      execl(TALLOW_PROGRAM, TALLOW_PROGRAM, "watch", mail.c_str(), nullptr);
      _exit(127);
    }
    close(log);
  }
  // The exit status, or 128 plus the number of the signal that ended it.
  int end(int signal) {
    kill(pid, signal);
    int status = 0;
    waitpid(pid, &status, 0);
    pid = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  }

  void makeFolder(const std::string& folder) const {
    for (const char* sub : {"cur", "new", "tmp"}) {
      std::filesystem::create_directories(mail + '/' + folder + '/' + sub);
    }
  }
  // Delivers as a delivery agent does.
  void deliver(const std::string& folder, const std::string& name) const {
    const std::string base = mail + '/' + folder;
    std::ofstream(base + "/tmp/" + name)
        << fmt::format("From: a@example.org\nSubject: {}\n\nText\n", name);
    std::filesystem::rename(base + "/tmp/" + name, base + "/new/" + name);
  }
  [[nodiscard]] std::string log() const {
    return platform::readFile(logPath, kMaxLog, nullptr).value_or("");
  }
  [[nodiscard]] std::set<std::string> indexed() const {
    client::SearchServiceProxy service(daemon->runtimeDirectory());
    const auto found = mailsync::readInventory(service, "default", {mail}, {mail}, nullptr);
    if (!found) return {"no answer"};
    std::set<std::string> identifiers;
    for (const auto& message : *found) identifiers.insert(message.identifier);
    return identifiers;
  }
  [[nodiscard]] std::set<std::string> onDisk() const {
    std::set<std::string> found;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(mail)) {
      const std::string path = entry.path().string();
      if (cli::isMaildirFile(path)) found.insert(cli::maildirIdentifier(path));
    }
    return found;
  }
  // Waits until `holds`, checking after each line of the watch's log. The time limit of the test
  // ends a wait that never succeeds.
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

  TemporaryDirectory directory;
  const std::string mail = directory / "mail";
  const std::string logPath = directory / "watch.log";
  const platform::FileDescriptor logChanges{inotify_init1(IN_CLOEXEC | IN_NONBLOCK)};
  std::unique_ptr<DaemonProcess> daemon;
  pid_t pid = -1;
};

}  // namespace testsupport
