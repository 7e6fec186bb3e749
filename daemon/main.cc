#include <sys/stat.h>
#include <systemd/sd-daemon.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string_view>

#include "daemon/IdleExit.h"
#include "daemon/TALDaemon.h"
#include "daemon/TLDeviceLockMonitor.h"
#include "platform/CrashNote.h"
#include "platform/Files.h"
#include "platform/Memory.h"
#include "platform/Paths.h"
#include "platform/ProcessLock.h"
#include "platform/Queue.h"
#include "platform/StateCapture.h"

namespace {

constexpr std::array<int, 4> kEndingSignals{SIGHUP, SIGINT, SIGPIPE, SIGTERM};
constexpr int kCaptureSignal = SIGUSR1;
constexpr mode_t kPrivateUmask = 0077;

const platform::Log& log() {
  static const platform::Log handle(platform::kSubsystem, "main");
  return handle;
}

void end() {
  sd_notify(0, "STOPPING=1");
  if (TALDaemon* daemon = TALDaemon::sharedInstance()) daemon->shutdown();
  log().standard("Stopping main run loop.");
  platform::mainRunLoop().stop();
}

void handleEndingSignal(int signal) {
  log().standard("Received signal {}.", strsignal(signal));
  end();
}

// Null unless an idle daemon is to end.
std::unique_ptr<IdleExit> makeIdleExit(TALDaemon& daemon) {
  const auto seconds = IdleExit::limitSeconds();
  if (!seconds) return nullptr;
  if (!daemon.activated()) {
    log().standard("TALLOW_IDLE_EXIT is ignored: systemd did not pass the sockets.");
    return nullptr;
  }
  auto exit = std::make_unique<IdleExit>(platform::mainRunLoop(), *seconds * 1000, [&daemon] {
    daemon.pause();  // a call that arrives from now on waits for the next daemon
    log().standard("No connection for a while: ending.");
    end();
  });
  daemon.setConnectionsHandler(
      [exit = exit.get()](size_t open) { exit->connectionsChanged(open); });
  return exit;
}

int fail(const std::optional<TLError>& error) {
  std::fprintf(stderr, "tallowsearchd: %s\n", error ? error->message.c_str() : "could not start");
  return 1;
}

constexpr const char* kUsage =
    "Usage: tallowsearchd [--help | --version]\n"
    "\n"
    "Keeps a private full-text index of mail and answers queries over local sockets, until it "
    "gets\n"
    "SIGTERM, SIGINT or SIGHUP. Data is kept in $STATE_DIRECTORY, sockets are in\n"
    "$RUNTIME_DIRECTORY; see tallowsearchd(8) for where they are unless set.\n";

// The exit status: 2 for unknown arguments, so that a mistyped option never leaves a daemon
// running.
int answerCommandLine(int argc, char** argv) {
  const std::string_view argument = argv[1];
  if (argc == 2 && argument == "--help") {
    std::fputs(kUsage, stdout);
    return 0;
  }
  if (argc == 2 && argument == "--version") {
    std::puts("tallowsearchd " TALLOW_VERSION);
    return 0;
  }
  std::fprintf(stderr, "tallowsearchd: unexpected argument: %s\n%s", argv[argc == 2 ? 1 : 2],
               kUsage);
  return 2;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc > 1) return answerCommandLine(argc, argv);
  umask(kPrivateUmask);
  platform::CrashNote::begin();
  platform::limitMemoryArenas();
  platform::raiseDescriptorLimit();  // each class may have a thousand table files open
  // Before any thread starts, so that all threads inherit it.
  for (const int signal : kEndingSignals) platform::takeSignalFromProcess(signal);
  platform::takeSignalFromProcess(kCaptureSignal);

  std::optional<TLError> error;
  if (!platform::createDirectories(platform::runtimeDirectory(), &error)) return fail(error);
  log().standard("Starting main with UnlockedSinceBoot:{}, ProtectedDataAvailable:{}",
                 platform::yesNo(TLDeviceUnlockedSinceBoot()),
                 platform::yesNo(TLProtectedDataAvailable()));

  platform::RunLoop& loop = platform::mainRunLoop();
  if (!loop.good()) return fail(TLError{kPOSIXErrorDomain, ENOMEM, "no event loop"});
  std::array<std::unique_ptr<platform::RunLoop::Source>, kEndingSignals.size()> sources;
  for (size_t i = 0; i < kEndingSignals.size(); ++i) {
    sources[i] = loop.addSignal(kEndingSignals[i], handleEndingSignal);
  }
  platform::SerialQueue captureQueue("com.quill.tallow.capture");
  auto captureSource = loop.addSignal(kCaptureSignal, [&captureQueue](int) {
    if (!captureQueue.async(platform::logCapturedState)) {
      log().error("No thread to capture the state");
    }
  });

  const auto lock = platform::ProcessLock::acquire(platform::processLockPath(), &error);
  // An interrupted purge leaves either its copy or the directory that it replaced.
  if (lock != nullptr) platform::removeItem(platform::purgeDirectory(), nullptr);
  TALDaemon* daemon = TALDaemon::sharedInstance();
  std::unique_ptr<IdleExit> idleExit;
  if (daemon != nullptr) {
    if (lock == nullptr || !daemon->run(&error)) return fail(error);
    idleExit = makeIdleExit(*daemon);
    sd_notify(0, "READY=1");
  }
  log().standard("Starting run loop");
  loop.run();

  for (auto& source : sources) source.reset();
  captureSource.reset();
  if (daemon != nullptr) daemon->invalidate();
  return 0;
}
