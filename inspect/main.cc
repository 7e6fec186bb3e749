#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>
#include <string_view>

#include "inspect/Purge.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "platform/ProcessLock.h"
#include "salt/Inspection.h"
#include "salt/Quarantine.h"

// Inspects the text index of one protection class while no daemon uses it, or purges the class:
//
//   tallow-inspect dump|validate|estimate-purge|purge STATE_DIRECTORY CLASS
//
// Only purge changes anything. The result goes to standard output: the dump as it is, including
// control characters from mail, and the other results as JSON; tallow(1), which runs this program,
// formats both for people. Validation logs its findings to standard error.
namespace {

enum ExitStatus : int { kDone = 0, kNotValid = 1, kFailure = 2, kInUse = 3 };

int complain(const std::string& message, ExitStatus status = kFailure) {
  fmt::print(stderr, "tallow-inspect: {}\n", message);
  return status;
}

bool write(std::string_view text) {
  return std::fwrite(text.data(), 1, text.size(), stdout) == text.size();
}

int dump(salt::Inspection& inspection) {
  if (inspection.load() == nullptr) return complain("the index cannot be opened");
  const bool whole = inspection.dump(write);
  return std::fflush(stdout) == 0 && whole ? kDone : kFailure;
}

// A corrupt page ends the process with an assertion.
int validate(salt::Inspection& inspection) {
  const salt::Index* const index = inspection.load();
  const bool valid = index != nullptr && index->Validate();
  nlohmann::ordered_json outcome{{"valid", valid}};
  if (index != nullptr) {
    const salt::Index::Metrics m = index->GetMetrics();
    outcome.update({{"documents", m.Docs},
                    {"deletedDocuments", m.DeletedDocs},
                    {"zones", m.Zones},
                    {"textBytes", m.TextBytes},
                    {"suffixes", m.Suffixes},
                    {"hotSuffixes", m.HotSuffixes},
                    {"pages", m.Pages},
                    {"shards", m.Shards}});
  }
  if (!write(outcome.dump() + '\n') || std::fflush(stdout) != 0) return kFailure;
  return valid ? kDone : kNotValid;
}

// Captures the files while no daemon can start. The lock is released right afterwards, because
// holding it longer would keep the service down.
std::unique_ptr<salt::Inspection> capture(const std::string& state,
                                          const std::string& protectionClass, TLErrorOut error) {
  const auto lock = platform::ProcessLock::acquireShared(platform::processLockPath(state), error);
  if (lock == nullptr) return nullptr;
  return salt::Inspection::capture(
      platform::textIndexPath(platform::dataRoot(state), protectionClass), error);
}

int complainOf(const TLError& error) {
  if (error.domain != kPOSIXErrorDomain || error.code != EWOULDBLOCK)
    return complain(error.message);
  return complain(error.message + "; stop it first", kInUse);
}

// Reports the current step if standard error is a terminal.
void tellStep(const char* step) {
  static const bool shown = isatty(STDERR_FILENO) == 1;
  static const char* last = nullptr;
  if (shown && step != last) fmt::print(stderr, "{} ...\n", step);
  last = step;
}

int purge(const std::string& state, const std::string& protectionClass, bool estimate) {
  constexpr mode_t kPrivateUmask = 0077;  // same as the daemon's
  umask(kPrivateUmask);
  std::optional<TLError> error;
  const auto report = estimate ? inspect::estimatePurge(state, protectionClass, &error)
                               : inspect::purge(state, protectionClass, tellStep, &error);
  if (!report) return complainOf(*error);
  const nlohmann::ordered_json outcome{{"estimate", estimate},
                                       {"documents", report->documents},
                                       {"bytesBefore", report->bytesBefore},
                                       {"bytesAfter", report->bytesAfter},
                                       {"damagedIndexRemoved", !estimate && report->hadSetAside}};
  return write(outcome.dump() + '\n') && std::fflush(stdout) == 0 ? kDone : kFailure;
}

}  // namespace

int main(int argc, char** argv) {
  const std::string_view command = argc == 4 ? argv[1] : "";
  const bool purges = command == "purge" || command == "estimate-purge";
  if (command != "dump" && command != "validate" && !purges) {
    return complain(
        "usage: tallow-inspect dump|validate|estimate-purge|purge STATE_DIRECTORY CLASS");
  }
  const std::string state = argv[2];
  const std::string protectionClass = argv[3];
  if (!platform::namesOneDirectory(protectionClass)) {
    return complain("a protection class must name one directory");
  }
  platform::raiseDescriptorLimit();
  if (purges) return purge(state, protectionClass, command != "purge");
  std::optional<TLError> error;
  const auto inspection = capture(state, protectionClass, &error);
  if (inspection == nullptr) return complainOf(*error);
  if (command == "dump") return dump(*inspection);
  const std::string index = platform::textIndexPath(platform::dataRoot(state), protectionClass);
  for (const std::string& aside : salt::indexesSetAside(index)) {
    complain("an earlier index was damaged and has been set aside: " + aside);
  }
  return validate(*inspection);
}
