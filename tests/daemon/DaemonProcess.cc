#include "tests/daemon/DaemonProcess.h"

#include <algorithm>

#include "platform/Assert.h"
#include "platform/Files.h"

namespace testsupport {

DaemonProcess::DaemonProcess(const std::string& directory, Process::Variables environment,
                             const std::vector<int>& passedSockets)
    : _runtimeDirectory(directory + "/run") {
  TL_ASSERT(platform::createDirectories(_runtimeDirectory, nullptr));
  environment.emplace("STATE_DIRECTORY", directory + "/state");
  environment.emplace("RUNTIME_DIRECTORY", _runtimeDirectory);
  _process.emplace(std::vector<std::string>{TALLOW_DAEMON_PROGRAM}, std::move(environment),
                   directory + "/log", passedSockets);
  _ready = _process->awaitReady();
}

std::string DaemonProcess::endOfLog() const {
  constexpr size_t kBytes = 4000;
  const std::string all = log();
  return all.substr(all.size() - std::min(all.size(), kBytes));
}

}  // namespace testsupport
