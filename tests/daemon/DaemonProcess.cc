#include "tests/daemon/DaemonProcess.h"

#include <csignal>

#include "platform/Assert.h"
#include "platform/Files.h"

namespace testsupport {

DaemonProcess::DaemonProcess(const std::string& directory, const std::vector<int>& passedSockets,
                             const std::string& socketNames)
    : _runtimeDirectory(directory + "/run") {
  TL_ASSERT(platform::createDirectories(_runtimeDirectory, nullptr));
  Process::Variables environment{{"STATE_DIRECTORY", directory + "/state"},
                                 {"RUNTIME_DIRECTORY", _runtimeDirectory}};
  if (!passedSockets.empty()) environment.emplace("LISTEN_FDNAMES", socketNames);
  _process.emplace(std::vector<std::string>{TALLOW_DAEMON_PROGRAM}, std::move(environment),
                   directory + "/log", passedSockets);
  _ready = _process->awaitReady();
}

}  // namespace testsupport
