#include <fmt/format.h>

#include <algorithm>
#include <ctime>
#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "cli/Results.h"
#include "cli/SyncCommand.h"
#include "client/DebugServiceProxy.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "records/TLDebugServiceKeys.h"

namespace cli {

namespace {

constexpr size_t kBarColumns = 20;
constexpr size_t kShownProblems = 20;
constexpr size_t kLockStatusBytes = 64;

// What the daemon tells of one class.
struct IndexStatus {
  int64_t stored = 0;      // items
  int64_t searchable = 0;  // of these
  int64_t highestID = 0;   // as many documents have ever been stored
  int64_t textBytes = 0;
  int64_t suffixes = 0;
  int64_t hotSuffixes = 0;  // not sorted in yet
  int64_t merges = 0;       // since the index was opened

  [[nodiscard]] int64_t deleted() const { return std::max<int64_t>(highestID - stored, 0); }
};

std::optional<IndexStatus> readIndexStatus(const Options& options, TLErrorOut error) {
  client::DebugServiceProxy service(options.runtimeDirectory, options.patience());
  const auto statistics =
      service.fetchStatsForIndexer(options.name, options.protectionClass, error);
  if (!statistics) return std::nullopt;
  IndexStatus status;
  const std::pair<std::string_view, int64_t*> fields[] = {
      {TLDebugServiceDocStoreNumOfItems, &status.stored},
      {TLDebugServiceTextStoreNumOfItems, &status.searchable},
      {TLDebugServiceSaltMaxDocID, &status.highestID},
      {TLDebugServiceTextStoreSize, &status.textBytes},
      {TLDebugServiceSaltTotalSuffixes, &status.suffixes},
      {TLDebugServiceSaltHotSuffixes, &status.hotSuffixes},
      {TLDebugServiceSaltVacuumNumOfPhases, &status.merges}};
  for (const auto& [key, value] : *statistics) {
    const auto* const number = std::get_if<int64_t>(&value);
    for (const auto& [name, field] : fields) {
      if (number != nullptr && key == name) *field = *number;
    }
  }
  return status;
}

// The text of the lock status file; without one the device counts as unlocked.
std::string lockStatus(const Options& options) {
  const std::string path = platform::joinPath(options.runtimeDirectory, "lock_status");
  if (!platform::fileExists(path)) return "unlocked";
  const auto text = platform::readFile(path, kLockStatusBytes, nullptr);
  if (!text) return "unknown";
  return text->starts_with("0") ? "unlocked" : "locked";
}

std::string timeText(int64_t seconds) {
  const auto time = static_cast<std::time_t>(seconds);
  std::tm parts{};
  char text[64] = "";
  localtime_r(&time, &parts);
  std::strftime(text, sizeof text, "%FT%T%z", &parts);
  return text;
}

std::string barOf(const mailsync::FolderCount& count) {
  const int64_t total = std::max<int64_t>(count.messages, 1);
  const auto filled =
      static_cast<size_t>(count.indexed * static_cast<int64_t>(kBarColumns) / total);
  return fmt::format("[{:=>{}}{:>{}}]", "", filled, "", kBarColumns - filled);
}

std::string mailboxText(mailsync::Catalogue& catalogue) {
  const auto last = mailsync::lastSync(catalogue);
  std::string text = fmt::format("Last sync  {}\n", last ? timeText(*last) : "not ended yet");
  for (const mailsync::FolderCount& count : catalogue.folderCounts()) {
    text += fmt::format("{} {:>8} of {:>8}  {}", barOf(count), count.indexed, count.messages,
                        cleanForTerminal(count.path));
    if (count.waiting > 0) text += fmt::format(", {} waiting", count.waiting);
    if (count.failed > 0) text += fmt::format(", {} failed", count.failed);
    text += count.missing ? ", not there\n" : "\n";
  }
  for (const mailsync::Problem& problem : catalogue.problems(kShownProblems)) {
    text += fmt::format("failed: {}: {}\n", cleanForTerminal(problem.path),
                        cleanForTerminal(problem.reason));
  }
  return text;
}

nlohmann::json mailboxJSON(mailsync::Catalogue& catalogue) {
  nlohmann::json folders = nlohmann::json::array();
  for (const mailsync::FolderCount& count : catalogue.folderCounts()) {
    folders.push_back({{"path", count.path},
                       {"messages", count.messages},
                       {"indexed", count.indexed},
                       {"waiting", count.waiting},
                       {"failed", count.failed},
                       {"missing", count.missing}});
  }
  nlohmann::json problems = nlohmann::json::array();
  for (const mailsync::Problem& problem : catalogue.problems(kShownProblems)) {
    problems.push_back({{"path", problem.path}, {"reason", problem.reason}});
  }
  const auto last = mailsync::lastSync(catalogue);
  return {{"lastSync", last ? nlohmann::json(timeText(*last)) : nlohmann::json()},
          {"roots", catalogue.roots()},
          {"folders", std::move(folders)},
          {"problems", std::move(problems)}};
}

std::string indexText(const IndexStatus& index) {
  const double share = index.highestID == 0 ? 0.0
                                            : 100.0 * static_cast<double>(index.deleted()) /
                                                  static_cast<double>(index.highestID);
  std::string text = fmt::format("Index      {} messages, {:.1f} MB of text\n", index.stored,
                                 static_cast<double>(index.textBytes) / 1e6);
  text += fmt::format("Deleted    {} messages, {:.0f} % of all that were stored\n", index.deleted(),
                      share);
  text += fmt::format("Merging    {} of {} suffixes not sorted in yet, {} merges so far\n",
                      index.hotSuffixes, index.suffixes, index.merges);
  if (index.searchable < index.stored) {
    text +=
        fmt::format("           {} stored and not searchable\n", index.stored - index.searchable);
  }
  return text;
}

nlohmann::json indexJSON(const IndexStatus& index) {
  return {{"messages", index.stored},   {"searchable", index.searchable},
          {"deleted", index.deleted()}, {"textBytes", index.textBytes},
          {"suffixes", index.suffixes}, {"hotSuffixes", index.hotSuffixes},
          {"merges", index.merges}};
}

}  // namespace

// What the catalogue knows is shown without the daemon as well.
ExitStatus runStatus(const Options& options) {
  std::optional<TLError> failure;
  const auto catalogue = mailsync::openCatalogue(syncSettings(options), &failure);
  if (failure) return complain(failure);
  std::optional<TLError> error;
  const auto index = readIndexStatus(options, &error);
  std::string text;
  if (options.format == OutputFormat::json) {
    text = jsonText({{"mailboxes", catalogue ? mailboxJSON(*catalogue) : nlohmann::json()},
                     {"index", index ? indexJSON(*index) : nlohmann::json()},
                     {"lock", lockStatus(options)}});
  } else {
    text = catalogue ? mailboxText(*catalogue) : "No mailbox is kept in step; see tallow sync.\n";
    if (index) text += indexText(*index);
    text += fmt::format("Device     {}\n", lockStatus(options));
  }
  const ExitStatus written = print(text);
  return index ? written : complain(error);
}

}  // namespace cli
