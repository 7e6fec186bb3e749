#include <fmt/format.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <systemd/sd-daemon.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <csignal>
#include <limits>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "cli/Commands.h"
#include "cli/Mailboxes.h"
#include "cli/SyncCommand.h"
#include "platform/FileDescriptor.h"
#include "sync/DirectoryWatch.h"
#include "sync/MailWatch.h"

namespace cli {

namespace {

using Clock = std::chrono::steady_clock;

// Written to by the signal handler.
int stopDescriptor = -1;
std::atomic<bool> wasStopped{false};

void takeStop(int signal) {
  wasStopped = true;
  std::signal(signal, SIG_DFL);  // a second one ends the process at once
  eventfd_write(stopDescriptor, 1);
}

// Reports the state of the program to systemd, if systemd has started it.
class Supervisor {
 public:
  Supervisor() {
    uint64_t microseconds = 0;
    if (sd_watchdog_enabled(0, &microseconds) > 0) {
      _interval = std::chrono::microseconds(microseconds / 2);
    }
  }
  void tell(const std::string& state) { sd_notify(0, state.c_str()); }
  // Sends the watchdog message when it is due.
  void touch(Clock::time_point now) {
    if (!_interval || now < _next) return;
    _next = now + *_interval;
    sd_notify(0, "WATCHDOG=1");
  }
  [[nodiscard]] Clock::time_point next() const {
    return _interval ? _next : Clock::time_point::max();
  }

 private:
  std::optional<std::chrono::microseconds> _interval;
  Clock::time_point _next;
};

// One watch for each protection class.
class WatchLoop {
 public:
  explicit WatchLoop(const Options& options) : _options(options) {}

  bool add(const MailboxGroup& group, TLErrorOut error) {
    mailsync::WatchSettings settings;
    settings.sync = syncSettings(_options, group);
    settings.sync.patience = rpc::Patience(0);  // the watch has its own
    settings.roots = group.roots;
    settings.onBattery = group.onBattery || _options.onBattery;
    const mailsync::WatchObserver observer{
        [](const std::string& line) { complain(line); },
        [this](const mailsync::SyncReport& report) { tell(report); },
        [this] {
          _supervisor.touch(Clock::now());
          return wasStopped.load();
        }};
    auto watch = mailsync::MailWatch::start(std::move(settings),
                                            std::make_unique<mailsync::DirectoryWatch>(), observer,
                                            Clock::now(), error);
    if (watch == nullptr) return false;
    for (const std::string& root : group.roots) complain("watching " + root);
    _watches.push_back(std::move(watch));
    return true;
  }

  void run() {
    _supervisor.tell("READY=1");
    while (!wasStopped) {
      wait();
      const auto now = Clock::now();
      _supervisor.touch(now);
      for (const auto& watch : _watches) {
        if (!wasStopped) watch->turn(now);
      }
    }
    _supervisor.tell("STOPPING=1");
  }

 private:
  // Waits for a change, a due time or the end of the program.
  void wait() {
    auto due = _supervisor.next();
    std::vector<pollfd> descriptors{{stopDescriptor, POLLIN, 0}};
    for (const auto& watch : _watches) {
      due = std::min(due, watch->next());
      descriptors.push_back({watch->descriptor(), POLLIN, 0});
    }
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(due - Clock::now()).count();
    const int64_t most = std::numeric_limits<int>::max();
    poll(descriptors.data(), descriptors.size(),
         static_cast<int>(std::clamp<int64_t>(left, 0, most)));
  }

  void tell(const mailsync::SyncReport& report) {
    const std::string summary = summaryOf(report, false);
    if (_options.verbose || report.toSend + report.toDelete > 0) complain(summary);
    _supervisor.tell("STATUS=" + cleanForTerminal(summary));
  }

  const Options& _options;
  Supervisor _supervisor;
  std::vector<std::unique_ptr<mailsync::MailWatch>> _watches;
};

}  // namespace

ExitStatus runWatch(const Options& options) {
  const auto groups = mailboxGroups(options);
  if (!groups) return ExitStatus::failure;
  const platform::FileDescriptor stop(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
  stopDescriptor = stop.get();
  std::signal(SIGINT, takeStop);
  std::signal(SIGTERM, takeStop);
  WatchLoop loop(options);
  for (const MailboxGroup& group : *groups) {
    std::optional<TLError> error;
    if (!loop.add(group, &error)) return complain(error);
  }
  loop.run();
  return ExitStatus::done;
}

}  // namespace cli
