#include "desktop/Opener.h"

#include <fcntl.h>

#include <vector>

#include "cli/Identifier.h"
#include "cli/ShellCommand.h"
#include "desktop/MailSearch.h"
#include "platform/FileDescriptor.h"
#include "platform/Log.h"

namespace desktop {

namespace {

// Runs "$@" in the user's terminal.
constexpr const char* kInTerminal =
    "command -v xdg-terminal-exec >/dev/null && exec xdg-terminal-exec \"$@\"\n"
    "exec ${TERMINAL:-x-terminal-emulator} -e \"$@\"";

const platform::Log& log() {
  static const platform::Log handle(platform::kSubsystem, "DesktopOpener");
  return handle;
}

void start(const std::string& command, const std::vector<std::string>& arguments) {
  const platform::FileDescriptor nothing(open("/dev/null", O_RDONLY | O_CLOEXEC));
  pid_t process = -1;
  const int failure = cli::startShell(command, arguments, nothing.get(), process);
  if (failure != 0) log().error("No program: {}", platform::posixError(failure, "sh").message);
}

void startInTerminal(const cli::Settings& settings, const char* command,
                     const std::string& operand) {
  start(kInTerminal, {"tallow", command, "--class=" + settings.desktopClass, "--", operand});
}

}  // namespace

void openMail(const std::string& identifier) {
  const auto settings = settingsIfOn();
  if (!settings) return;
  const auto location = cli::parseIdentifier(identifier);
  const auto command = cli::openingCommand();
  if (!location || !command) return startInTerminal(*settings, "show", identifier);
  start(*command, {cli::findMaildirFile(location->path)});
}

void showMail(const std::string& identifier) {
  if (const auto settings = settingsIfOn()) startInTerminal(*settings, "show", identifier);
}

void searchOnScreen(const std::string& words) {
  if (const auto settings = settingsIfOn()) startInTerminal(*settings, "screen", words);
}

}  // namespace desktop
