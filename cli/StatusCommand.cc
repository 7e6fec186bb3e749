#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "cli/Results.h"
#include "cli/StateDirectory.h"
#include "cli/SyncCommand.h"
#include "client/DebugServiceProxy.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "platform/ProcessLock.h"
#include "records/TLDebugServiceKeys.h"

namespace cli {

namespace {

constexpr size_t kBarColumns = 20;
constexpr size_t kShownProblems = 20;  // in text
constexpr size_t kMostProblems = 10000;
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
  double mergeSeconds = 0;  // of these together
  bool merging = false;
  int64_t documents = 0;         // in the files, with those that are only marked as deleted
  int64_t deletedDocuments = 0;  // of these

  [[nodiscard]] int64_t deleted() const { return std::max<int64_t>(highestID - stored, 0); }
  // How much of the files belongs to deleted mail, from 0 to 1; mails are taken for equally long.
  [[nodiscard]] double deletedShare() const {
    return documents <= 0 ? 0.0
                          : static_cast<double>(deletedDocuments) / static_cast<double>(documents);
  }
};

// The number after a name in the daemon's metrics; 0 where it has none.
int64_t metric(const std::string& metrics, const char* name) {
  const size_t at = metrics.find(name);
  return at == std::string::npos
             ? 0
             : std::strtoll(metrics.c_str() + at + std::strlen(name), nullptr, 10);
}

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
    const auto* const seconds = std::get_if<double>(&value);
    if (seconds != nullptr && key == TLDebugServiceSaltVacuumTimeSecs) {
      status.mergeSeconds = *seconds;
    }
  }
  const auto metrics = service.fetchStatsForSalt(options.name, options.protectionClass, error);
  if (!metrics) return std::nullopt;
  status.merging = metrics->find("(IN PROGRESS)") != std::string::npos;
  status.documents = metric(*metrics, "---- Docs: ");
  status.deletedDocuments = metric(*metrics, "---- Deleted docs: ");
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

// Whether a watch keeps the mailboxes in step at present.
bool isWatched(const Options& options) {
  std::optional<TLError> failure;
  const std::string path = mailsync::watchLockPath(syncSettings(options));
  const auto lock = platform::ProcessLock::acquireShared(path, &failure);
  return lock == nullptr && failure->code == EWOULDBLOCK;
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
  int64_t failed = 0;
  for (const mailsync::FolderCount& count : catalogue.folderCounts()) failed += count.failed;
  for (const mailsync::Problem& problem : catalogue.problems(kShownProblems)) {
    --failed;
    text += fmt::format("failed: {}: {}\n", cleanForTerminal(problem.path),
                        cleanForTerminal(problem.reason));
  }
  if (failed > 0) text += fmt::format("failed: {} more; see --format=json\n", failed);
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
  for (const mailsync::Problem& problem : catalogue.problems(kMostProblems)) {
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
  text += fmt::format(
      "Merging    {}; {} of {} suffixes not sorted in yet, {} merges so far in {:.0f} s\n",
      index.merging ? "at work" : "not at present", index.hotSuffixes, index.suffixes, index.merges,
      index.mergeSeconds);
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
          {"merges", index.merges},     {"mergeSeconds", index.mergeSeconds},
          {"merging", index.merging},   {"deletedShare", index.deletedShare()}};
}

std::string diskText(const DiskUse& disk, const std::optional<IndexStatus>& index) {
  std::string text =
      fmt::format("Files      {:.1f} MB of index, {:.1f} MB of store",
                  static_cast<double>(disk.index) / 1e6, static_cast<double>(disk.store) / 1e6);
  if (index && index->deletedDocuments > 0) {
    const auto bytes = static_cast<double>(disk.index + disk.store);
    text +=
        fmt::format(", some {:.1f} MB of it for deleted mail", bytes * index->deletedShare() / 1e6);
  }
  return text + '\n';
}

}  // namespace

// What the catalogue knows is shown without the daemon as well.
ExitStatus runStatus(const Options& options) {
  std::optional<TLError> failure;
  const auto catalogue = mailsync::openCatalogue(syncSettings(options), &failure);
  if (failure) return complain(failure);
  std::optional<TLError> error;
  const auto index = readIndexStatus(options, &error);
  const auto disk = diskUse(options);
  const bool watched = isWatched(options);
  std::string text;
  if (options.format == OutputFormat::json) {
    text = jsonText(
        {{"mailboxes", catalogue ? mailboxJSON(*catalogue) : nlohmann::json()},
         {"index", index ? indexJSON(*index) : nlohmann::json()},
         {"files", disk ? nlohmann::json({{"indexBytes", disk->index}, {"storeBytes", disk->store}})
                        : nlohmann::json()},
         {"watched", watched},
         {"lock", lockStatus(options)}});
  } else {
    text = catalogue ? mailboxText(*catalogue) : "No mailbox is kept in step; see tallow sync.\n";
    text += fmt::format("Watch      {}\n", watched ? "at work" : "not at work; see tallow watch");
    if (index) text += indexText(*index);
    if (disk) text += diskText(*disk, index);
    text += fmt::format("Device     {}\n", lockStatus(options));
  }
  const ExitStatus written = print(text);
  return index ? written : complain(error);
}

}  // namespace cli
