#pragma once

#include <fmt/format.h>
#include <poll.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <array>
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
#include "tests/support/Process.h"
#include "tests/support/Programs.h"
#include "tests/support/ShellTest.h"

namespace testsupport {

// `tallow watch` as its own process, with a daemon and a mailbox of the test.
class WatchProcessTest : public ShellTest {
 protected:
  WatchProcessTest() {
    makeFolder("a");
    makeFolder("b");
    startDaemon();
    startWatch();
  }
  void startDaemon() {
    daemon.reset();
    daemon = std::make_unique<DaemonProcess>(directory.path());
    TL_ASSERT(daemon->ready());
  }
  void startWatch() {
    watch = std::make_unique<Process>(
        std::vector<std::string>{TALLOW_PROGRAM, "watch", mail},
        Process::Variables{{"RUNTIME_DIRECTORY", daemon->runtimeDirectory()},
                           {"XDG_STATE_HOME", directory / "client"},
                           {"XDG_CONFIG_HOME", directory / "config"}},
        logPath);
    TL_ASSERT(watch->awaitReady());
    TL_ASSERT(inotify_add_watch(logChanges.get(), logPath.c_str(), IN_MODIFY) >= 0);
  }

  void makeFolder(const std::string& folder) const { directory.makeMaildir("mail/" + folder); }
  // Delivers as a delivery agent does.
  void deliver(const std::string& folder, const std::string& name) const {
    const std::string base = mail + '/' + folder;
    std::ofstream(base + "/tmp/" + name)
        << fmt::format("From: a@example.org\nSubject: {}\n\nText\n", name);
    std::filesystem::rename(base + "/tmp/" + name, base + "/new/" + name);
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
      while (::read(logChanges.get(), events.data(), events.size()) > 0) {
      }
    }
  }
  // Waits until what is indexed is what is on the disk, and returns the number of messages.
  size_t waitUntilInStep() const {
    waitUntil([this] { return indexed() == onDisk(); });
    return indexed().size();
  }
  void waitUntilSaid(const std::string& text) const {
    waitUntil([&] { return watch->log().find(text) != std::string::npos; });
  }

  const std::string mail = directory / "mail";
  const std::string logPath = directory / "watch.log";
  const platform::FileDescriptor logChanges{inotify_init1(IN_CLOEXEC | IN_NONBLOCK)};
  std::unique_ptr<DaemonProcess> daemon;
  std::unique_ptr<Process> watch;
};

}  // namespace testsupport
