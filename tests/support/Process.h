#pragma once

#include <sys/types.h>

#include <map>
#include <string>
#include <vector>

namespace testsupport {

// A program that the test runs. It ends at the latest with the test.
class Process {
 public:
  using Variables = std::map<std::string, std::string>;

  // Adds to the environment. Standard error is appended to the file `log`. The sockets are passed
  // as systemd passes them; LISTEN_FDNAMES is the caller's.
  Process(const std::vector<std::string>& arguments, Variables environment, std::string log,
          const std::vector<int>& passedSockets = {});
  ~Process();
  Process(const Process&) = delete;
  Process& operator=(const Process&) = delete;

  // Waits until it reports by NOTIFY_SOCKET that it is ready; false if it ended first. Once.
  [[nodiscard]] bool awaitReady();
  // Waits for a line on the standard output, and returns it; empty if it ended first.
  [[nodiscard]] std::string readLine() const;
  // Where its standard output can be read.
  [[nodiscard]] int output() const { return _output; }
  [[nodiscard]] pid_t pid() const { return _pid; }
  void signal(int number) const;
  // Sends the signal, if given, and waits for the end. The exit status, or 128 plus the number of
  // the signal that ended it.
  int end(int signal = 0);
  // RssAnon; 0 if it has ended.
  [[nodiscard]] size_t anonymousKilobytes() const;
  // Its standard error so far.
  [[nodiscard]] std::string log() const;
  // Waits until the log contains `text`; false if the process ended first.
  [[nodiscard]] bool waitForLog(const std::string& text) const;

 private:
  [[noreturn]] void run(const std::vector<std::string>& arguments, const Variables& environment,
                        int output, const std::vector<int>& passedSockets) const;

  const std::string _log;
  const std::string _notifyPath;
  pid_t _pid = -1;
  int _notify = -1;
  int _output = -1;
  int _ended = -1;  // pidfd, which can be polled
};

// Waits until the file, which is replaced in one step, has this content.
void awaitFile(const std::string& directory, const std::string& name, const std::string& content);

}  // namespace testsupport
