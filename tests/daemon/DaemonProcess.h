#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace testsupport {

// The daemon as its own process, with state and sockets in a directory of the test.
class DaemonProcess {
 public:
  // Starts it and waits until it reports that it is ready, or has ended.
  explicit DaemonProcess(const std::string& directory, const std::vector<int>& passedSockets = {},
                         const std::string& socketNames = "");
  // Kills the process if it is still running.
  ~DaemonProcess();
  DaemonProcess(const DaemonProcess&) = delete;
  DaemonProcess& operator=(const DaemonProcess&) = delete;

  [[nodiscard]] bool ready() const { return _ready; }
  [[nodiscard]] pid_t pid() const { return _pid; }
  [[nodiscard]] const std::string& runtimeDirectory() const { return _runtimeDirectory; }
  [[nodiscard]] std::string socketOf(const std::string& service) const {
    return _runtimeDirectory + "/" + service;
  }

  void signal(int number) const;
  // Waits for the end. Returns the exit status, or 128 plus the number of the signal that ended it.
  int wait();
  // Its standard error so far.
  [[nodiscard]] std::string log() const;
  // Waits until the log contains `text`; false if the daemon ended first.
  bool waitForLog(const std::string& text) const;

 private:
  bool waitUntilReady(int notifySocket);

  const std::string _directory;
  const std::string _runtimeDirectory;
  pid_t _pid = -1;
  bool _ready = false;
  int _ended = -1;  // pidfd of the process, which can be polled
};

}  // namespace testsupport
