#include "cli/UserUnits.h"

#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <system_error>
#include <vector>

#include "cli/ChildProgram.h"

namespace cli {

namespace {

using Words = std::vector<std::string>;

// A watch ends after the batch in hand; systemd kills it after 90 seconds unless configured.
constexpr std::chrono::seconds kUnitPatience{120};
constexpr std::chrono::seconds kQuestionPatience{10};

const Words kSockets{"tallowsearchd.socket", "tallowsearchd-debug.socket"};
const Words kWatch{"tallow-watch.service"};

Words allUnits() {
  Words all = kSockets;
  all.insert(all.end(), kWatch.begin(), kWatch.end());
  return all;
}

ProgramRun systemctl(const char* verb, const Words& units, std::chrono::seconds patience) {
  Words words{"systemctl", "--user", verb};
  words.insert(words.end(), units.begin(), units.end());
  return runProgram(words, patience);
}

// The first line of what it wrote.
std::string complaint(const ProgramRun& run, const char* verb) {
  const std::string line = run.output.substr(0, run.output.find('\n'));
  return line.empty() ? fmt::format("systemctl --user {} ended with status {}", verb, run.status)
                      : line;
}

std::optional<std::string> failureOf(const char* verb, const Words& units) {
  const ProgramRun run = systemctl(verb, units, kUnitPatience);
  if (run.succeeded()) return std::nullopt;
  if (run.end == ProgramRun::End::timedOut) {
    return fmt::format("systemctl --user {} gave no answer for {} seconds", verb,
                       kUnitPatience.count());
  }
  if (run.end == ProgramRun::End::exited) return complaint(run, verb);
  return run.status == ENOENT ? "there is no systemctl"
                              : "systemctl: " + std::system_category().message(run.status);
}

// Whether systemctl answers `verb` with this word for each unit.
bool allAre(const char* verb, const char* word) {
  const Words units = allUnits();
  const ProgramRun run = systemctl(verb, units, kQuestionPatience);
  std::string expected;
  for (size_t i = 0; i < units.size(); ++i) expected += std::string(word) + '\n';
  return run.succeeded() && run.output == expected;
}

}  // namespace

bool unitsAreOn() {
  return allAre("is-active", "active") && allAre("is-enabled", "enabled");
}

std::optional<std::string> enableUnits() {
  // Without a manager, `enable` alone would succeed.
  if (auto failure = failureOf("start", kSockets)) return failure;
  if (auto failure = failureOf("stop", kWatch)) return failure;
  return failureOf("enable", allUnits());
}

std::optional<std::string> startWatchUnit() {
  return failureOf("start", kWatch);
}

}  // namespace cli
