#pragma once

#include <csignal>
#include <optional>
#include <string>
#include <vector>

#include "tests/support/Process.h"

namespace testsupport {

// The daemon as its own process, with state and sockets in a directory of the test. It ends at the
// latest with this object.
class DaemonProcess {
 public:
  // Starts it and waits until it reports that it is ready, or has ended.
  explicit DaemonProcess(const std::string& directory, Process::Variables environment = {},
                         const std::vector<int>& passedSockets = {});
  [[nodiscard]] bool ready() const { return _ready; }
  [[nodiscard]] pid_t pid() const { return _process->pid(); }
  [[nodiscard]] const std::string& runtimeDirectory() const { return _runtimeDirectory; }
  [[nodiscard]] std::string socketOf(const std::string& service) const {
    return _runtimeDirectory + "/" + service;
  }

  void signal(int number) const { _process->signal(number); }
  // Waits for the end. Returns the exit status, or 128 plus the number of the signal that ended it.
  int wait() { return _process->end(); }
  // Ends it in order; the result is that of `wait`.
  int stop() { return _process->end(SIGTERM); }
  [[nodiscard]] std::string log() const { return _process->log(); }
  [[nodiscard]] std::string endOfLog() const;
  [[nodiscard]] size_t anonymousKilobytes() const { return _process->anonymousKilobytes(); }
  bool waitForLog(const std::string& text) const { return _process->waitForLog(text); }

 private:
  const std::string _runtimeDirectory;
  std::optional<Process> _process;
  bool _ready = false;
};

}  // namespace testsupport
