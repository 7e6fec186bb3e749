#include <sys/stat.h>
#include <systemd/sd-daemon.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>

#include "desktop/CommandLine.h"
#include "desktop/LockBridge.h"
#include "platform/Files.h"
#include "platform/Paths.h"

namespace {

constexpr const char* kProgram = "tallow-lock-bridge";
constexpr const char* kHelp =
    "Tells tallowsearchd when the screen is locked, so that it refuses the protection class\n"
    "SysFileProtectionComplete until the screen is unlocked. See tallow-lock-bridge(1).\n";

constexpr std::array<int, 3> kEndingSignals{SIGHUP, SIGINT, SIGTERM};

int fail(const std::optional<TLError>& error) {
  std::fprintf(stderr, "%s: %s\n", kProgram, error ? error->message.c_str() : "could not start");
  return 1;
}

}  // namespace

// Tells the daemon whether the screen is locked.
int main(int argc, char** argv) {
  if (const auto status = desktop::answerCommandLine(argc, argv, kProgram, kHelp)) return *status;
  umask(0077);
  for (const int signal : kEndingSignals) platform::takeSignalFromProcess(signal);
  platform::RunLoop& loop = platform::mainRunLoop();
  std::optional<TLError> error;
  if (!loop.good() || !platform::createDirectories(platform::runtimeDirectory(), &error)) {
    return fail(error);
  }
  bool ended = false;
  std::array<std::unique_ptr<platform::RunLoop::Source>, kEndingSignals.size()> sources;
  for (size_t i = 0; i < kEndingSignals.size(); ++i) {
    sources[i] = loop.addSignal(kEndingSignals[i], [&](int) {
      ended = true;
      loop.stop();
    });
  }
  const auto bridge = desktop::LockBridge::start(loop, platform::lockStatusPath(), &error);
  if (bridge == nullptr) return fail(error);
  sd_notify(0, "READY=1");
  loop.run();
  sd_notify(0, "STOPPING=1");
  if (ended || !bridge->good()) return ended ? 0 : 1;
  return fail(TLError{kPOSIXErrorDomain, ENOTCONN, "the system bus has gone away"});
}
