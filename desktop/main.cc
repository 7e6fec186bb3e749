#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>

#include "desktop/CommandLine.h"
#include "desktop/DesktopService.h"
#include "platform/RunLoop.h"

namespace {

constexpr const char* kProgram = "tallow-desktop";
constexpr const char* kHelp =
    "Shows mail in the searches of GNOME and KDE. The desktop starts it by itself, and it finds\n"
    "nothing until desktop_search is true in config.toml. See tallow-desktop(1).\n";

constexpr std::array<int, 3> kEndingSignals{SIGHUP, SIGINT, SIGTERM};

int fail(const std::optional<TLError>& error) {
  std::fprintf(stderr, "%s: %s\n", kProgram, error ? error->message.c_str() : "could not start");
  return 1;
}

// Programs that were started and have ended leave no zombies.
void reapChildren() {
  struct sigaction action {};
  action.sa_handler = SIG_DFL;
  action.sa_flags = SA_NOCLDWAIT;
  sigaction(SIGCHLD, &action, nullptr);
}

}  // namespace

// Mail in the searches of the desktop.
int main(int argc, char** argv) {
  if (const auto status = desktop::answerCommandLine(argc, argv, kProgram, kHelp)) return *status;
  std::signal(SIGPIPE, SIG_IGN);
  reapChildren();
  for (const int signal : kEndingSignals) platform::takeSignalFromProcess(signal);
  platform::RunLoop& loop = platform::mainRunLoop();
  if (!loop.good()) return fail(std::nullopt);
  std::array<std::unique_ptr<platform::RunLoop::Source>, kEndingSignals.size()> sources;
  for (size_t i = 0; i < kEndingSignals.size(); ++i) {
    sources[i] = loop.addSignal(kEndingSignals[i], [&loop](int) { loop.stop(); });
  }
  std::optional<TLError> error;
  const auto service = desktop::DesktopService::start(loop, &error);
  if (service == nullptr) return fail(error);
  loop.run();
  return 0;
}
