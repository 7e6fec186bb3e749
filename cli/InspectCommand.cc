#include <fcntl.h>
#include <fmt/format.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <functional>
#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "cli/ErrorText.h"
#include "cli/HelperProgram.h"
#include "cli/Results.h"
#include "cli/StateDirectory.h"
#include "cli/SyncCommand.h"
#include "platform/FileDescriptor.h"
#include "platform/SpawnPlan.h"

// Dump, validate and purge. The daemon's text index is read by a separate program, tallow-inspect.
// These commands run it and clean its output for the terminal.
namespace cli {

namespace {

constexpr const char* kProgram = "tallow-inspect";
constexpr size_t kPieceBytes = 64 * 1024;

// The running program; ends before this object.
class Inspector {
 public:
  Inspector() = default;
  ~Inspector() { end(); }
  Inspector(const Inspector&) = delete;
  Inspector& operator=(const Inspector&) = delete;

  // False, after a message, if it cannot be run.
  [[nodiscard]] bool start(const char* command, const Options& options);

  // Passes its output to `take` in pieces, until it ends or `take` returns false.
  void read(const std::function<bool(std::string_view)>& take);

  // Its wait status, as from waitpid. If it is still writing, it ends by SIGPIPE.
  int end();

 private:
  pid_t _pid = -1;
  platform::FileDescriptor _output;
};

bool Inspector::start(const char* command, const Options& options) {
  const std::string program = helperProgramPath(kProgram);
  const std::string state = stateDirectory(options);
  std::array<int, 2> pipe{-1, -1};
  int result = pipe2(pipe.data(), O_CLOEXEC) == 0 ? 0 : errno;
  _output = platform::FileDescriptor(pipe[0]);
  const platform::FileDescriptor input(pipe[1]);
  platform::SpawnPlan plan;
  plan.pass(input.get(), STDOUT_FILENO).resetSignals({SIGPIPE});
  if (result == 0) result = plan.run({program, command, state, options.protectionClass}, _pid);
  if (result == 0) return true;
  _pid = -1;
  complain(platform::posixError(result, program).message);
  return false;
}

void Inspector::read(const std::function<bool(std::string_view)>& take) {
  std::array<char, kPieceBytes> piece;
  for (;;) {
    const ssize_t size = ::read(_output.get(), piece.data(), piece.size());
    if (size < 0 && errno == EINTR) continue;
    if (size <= 0 || !take({piece.data(), static_cast<size_t>(size)})) return;
  }
}

int Inspector::end() {
  _output.reset();
  int status = 0;
  while (_pid > 0 && waitpid(_pid, &status, 0) < 0 && errno == EINTR) {
  }
  _pid = -1;
  return status;
}

// A corrupt index can make the program fail an assertion, which it has then reported.
bool metAssertion(int status) {
  return WIFSIGNALED(status) && WTERMSIG(status) == SIGABRT;
}

ExitStatus statusOf(int status) {
  if (WIFEXITED(status)) return static_cast<ExitStatus>(WEXITSTATUS(status));
  complain(metAssertion(status) ? "the index is corrupt"
                                : fmt::format("{} ended by signal {}", kProgram, WTERMSIG(status)));
  return ExitStatus::failure;
}

std::string sizeText(uint64_t bytes) {
  constexpr uint64_t kMegabyte = 1000000;
  if (bytes < kMegabyte) return fmt::format("{} kB", bytes / 1000);
  return fmt::format("{:.1f} MB", static_cast<double>(bytes) / kMegabyte);
}

std::string purgeText(const nlohmann::ordered_json& outcome) {
  const auto before = outcome.value("bytesBefore", uint64_t{0});
  const auto after = outcome.value("bytesAfter", uint64_t{0});
  const auto documents = outcome.value("documents", uint64_t{0});
  const std::string given = sizeText(before - std::min(before, after));
  const char* const messages = documents == 1 ? "deleted message" : "deleted messages";
  if (outcome.value("estimate", false)) {
    return fmt::format("{} {} would be removed from the disk, and about {} given back\n", documents,
                       messages, given);
  }
  std::string text =
      fmt::format("{} {} removed from the disk, {} given back\n", documents, messages, given);
  if (outcome.value("damagedIndexRemoved", false)) {
    text += "the damaged index that had been set aside is removed, too\n";
  }
  return text;
}

std::string outcomeText(const nlohmann::ordered_json& outcome) {
  std::string text = outcome.value("valid", false) ? "valid\n" : "not valid\n";
  for (const auto& [key, value] : outcome.items()) {
    if (key != "valid") text += fmt::format("{:20} {:>14}\n", key, value.dump());
  }
  return text;
}

}  // namespace

ExitStatus runDump(const Options& options) {
  Inspector inspector;
  if (!inspector.start("dump", options)) return ExitStatus::failure;
  std::string lines;
  bool written = true;
  inspector.read([&](std::string_view piece) {
    lines += piece;
    const size_t whole = lines.rfind('\n') + 1;
    written =
        print(cleanLinesForTerminal(std::string_view(lines).substr(0, whole))) == ExitStatus::done;
    lines.erase(0, whole);
    return written;
  });
  const int status = inspector.end();
  if (!written) return ExitStatus::failure;
  return print(cleanLinesForTerminal(lines), statusOf(status));
}

ExitStatus runPurge(const Options& options) {
  Inspector inspector;
  if (!inspector.start(options.dryRun ? "estimate-purge" : "purge", options)) {
    return ExitStatus::failure;
  }
  std::string text;
  inspector.read([&text](std::string_view piece) {
    text += piece;
    return true;
  });
  const ExitStatus status = statusOf(inspector.end());
  const auto outcome = nlohmann::ordered_json::parse(text, nullptr, false);
  if (status == ExitStatus::inUse) {
    complain(
        std::string("a purge needs the daemon to be stopped: "
                    "systemctl --user stop 'tallowsearchd*', and start it afterwards"));
  }
  if (status != ExitStatus::done || !outcome.is_object()) return status;
  std::optional<TLError> failure;
  if (!options.dryRun && !mailsync::forgetDeleted(syncSettings(options), &failure)) {
    complain("the names of deleted messages stay in the catalogue of tallow sync: " +
             plainText(*failure));
  }
  return print(options.format == OutputFormat::json ? outcome.dump(2) + '\n' : purgeText(outcome),
               status);
}

ExitStatus runValidate(const Options& options) {
  Inspector inspector;
  if (!inspector.start("validate", options)) return ExitStatus::failure;
  std::string text;
  inspector.read([&text](std::string_view piece) {
    text += piece;
    return true;
  });
  const int ended = inspector.end();
  if (metAssertion(ended)) text = R"({"valid": false})";
  const auto outcome = nlohmann::ordered_json::parse(text, nullptr, false);
  if (!outcome.is_object()) return statusOf(ended);
  const bool valid = outcome.value("valid", false);
  return print(options.format == OutputFormat::json ? outcome.dump(2) + '\n' : outcomeText(outcome),
               valid ? ExitStatus::done : ExitStatus::nothingFound);
}

}  // namespace cli
