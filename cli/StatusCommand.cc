#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <nlohmann/json.hpp>
#include <set>

#include "cli/AttachmentCounts.h"
#include "cli/Commands.h"
#include "cli/Results.h"
#include "cli/Settings.h"
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
constexpr size_t kMaxProblems = 10000;
constexpr size_t kLockStatusBytes = 64;
constexpr int kSchema = 1;  // of the JSON output

// The daemon's statistics for one class.
struct IndexStatus {
  int64_t stored = 0;      // items
  int64_t searchable = 0;  // of these
  int64_t textBytes = 0;
  int64_t suffixes = 0;
  int64_t hotSuffixes = 0;  // not yet merged into a shard
  int64_t merges = 0;       // since the index was opened
  double mergeSeconds = 0;  // total duration of the merges
  bool merging = false;
  int64_t deleted = 0;  // documents whose text is still in the files

  // The share of the files that belongs to deleted mail, from 0 to 1, assuming mails of equal
  // length.
  [[nodiscard]] double deletedShare() const {
    const int64_t all = searchable + deleted;
    return all <= 0 ? 0.0 : static_cast<double>(deleted) / static_cast<double>(all);
  }
};

// The value of a name in the daemon's metrics; 0 if missing.
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
  status.deleted = metric(*metrics, "---- Deleted docs: ");
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

// Whether a watch is running for the mailboxes.
bool isWatched(const Options& options) {
  std::optional<TLError> failure;
  const std::string path = mailsync::watchLockPath(syncSettings(options));
  const auto lock = platform::ProcessLock::acquireShared(path, &failure);
  return lock == nullptr && failure->code == EWOULDBLOCK;
}

std::string mailboxText(mailsync::Catalogue& catalogue, const std::optional<int64_t>& last) {
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
  return text + attachmentText(catalogue.attachments(), "Attached   ", "           ");
}

nlohmann::json mailboxJSON(mailsync::Catalogue& catalogue, const std::optional<int64_t>& last) {
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
  for (const mailsync::Problem& problem : catalogue.problems(kMaxProblems)) {
    problems.push_back({{"path", problem.path}, {"reason", problem.reason}});
  }
  return {{"lastSync", last ? nlohmann::json(timeText(*last)) : nlohmann::json()},
          {"roots", catalogue.roots()},
          {"folders", std::move(folders)},
          {"problems", std::move(problems)},
          {"attachments", attachmentJSON(catalogue.attachments())}};
}

std::string indexText(const IndexStatus& index) {
  std::string text = fmt::format("Index      {} messages, {:.1f} MB of text\n", index.stored,
                                 static_cast<double>(index.textBytes) / 1e6);
  text += fmt::format("Deleted    {} messages, {:.0f} % of what the files hold\n", index.deleted,
                      100 * index.deletedShare());
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
          {"deleted", index.deleted},   {"textBytes", index.textBytes},
          {"suffixes", index.suffixes}, {"hotSuffixes", index.hotSuffixes},
          {"merges", index.merges},     {"mergeSeconds", index.mergeSeconds},
          {"merging", index.merging},   {"deletedShare", index.deletedShare()}};
}

std::string diskText(const DiskUse& disk, const std::optional<IndexStatus>& index) {
  std::string text =
      fmt::format("Files      {:.1f} MB of index, {:.1f} MB of store",
                  static_cast<double>(disk.index) / 1e6, static_cast<double>(disk.store) / 1e6);
  if (index && index->deleted > 0) {
    const auto bytes = static_cast<double>(disk.index + disk.store);
    text +=
        fmt::format(", some {:.1f} MB of it for deleted mail", bytes * index->deletedShare() / 1e6);
  }
  return text + '\n';
}

// All information about one class.
struct ClassStatus {
  std::string name;
  std::unique_ptr<mailsync::Catalogue> catalogue;
  std::optional<int64_t> lastSync;
  bool isNew = false;  // nothing was ever indexed, so the daemon is not asked
  std::optional<IndexStatus> index;
  std::optional<DiskUse> disk;
  bool watched = false;
  std::optional<TLError> error;  // from the catalogue or the index
};

Options withClass(Options options, const std::string& name) {
  options.protectionClass = name;
  return options;
}

ClassStatus readClass(const Options& options) {
  ClassStatus status;
  status.name = options.protectionClass;
  status.catalogue = mailsync::openCatalogue(syncSettings(options), &status.error);
  status.lastSync = mailsync::lastSync(syncSettings(options));
  status.isNew = isUnknownClass(options);
  if (!status.isNew) status.index = readIndexStatus(options, &status.error);
  status.disk = diskUse(options);
  status.watched = isWatched(options);
  return status;
}

std::string classText(const ClassStatus& status) {
  std::string text = status.catalogue ? mailboxText(*status.catalogue, status.lastSync)
                                      : "No mailbox is kept in step; see tallow sync.\n";
  text +=
      fmt::format("Watch      {}\n", status.watched ? "at work" : "not at work; see tallow watch");
  if (status.isNew) text += "Index      nothing has been indexed yet\n";
  if (status.index) text += indexText(*status.index);
  if (status.disk) text += diskText(*status.disk, status.index);
  return text;
}

nlohmann::json classJSON(const ClassStatus& status) {
  nlohmann::json files;
  if (status.disk) {
    files = {{"indexBytes", status.disk->index}, {"storeBytes", status.disk->store}};
  }
  return {{"class", status.name},
          {"mailboxes",
           status.catalogue ? mailboxJSON(*status.catalogue, status.lastSync) : nlohmann::json()},
          {"index", status.index ? indexJSON(*status.index) : nlohmann::json()},
          {"files", std::move(files)},
          {"watched", status.watched}};
}

// The class of the command line; otherwise the default class and those known from the state
// directory and the settings, as far as they have an index or a catalogue; the default class if
// none has.
std::vector<std::string> classesOf(const Options& options) {
  if (options.classGiven) return {options.protectionClass};
  const std::vector<std::string> onDisk = classesOnDisk(options);
  std::set<std::string> names(onDisk.begin(), onDisk.end());
  const auto settings = readSettings();
  if (const auto* const read = std::get_if<Settings>(&settings)) {
    for (const auto& [folder, name] : read->classes) names.insert(name);
  }
  names.insert(options.protectionClass);
  std::erase_if(names, [&](const std::string& name) {
    const Options one = withClass(options, name);
    return isUnknownClass(one) && !mailsync::hasCatalogue(syncSettings(one));
  });
  if (names.empty()) names.insert(options.protectionClass);
  return {names.begin(), names.end()};
}

std::string statusText(const std::vector<ClassStatus>& classes, const std::string& lock) {
  std::string text;
  for (const ClassStatus& status : classes) {
    if (classes.size() > 1) text += fmt::format("Class      {}\n", cleanForTerminal(status.name));
    text += classText(status);
    if (classes.size() > 1) text += '\n';
  }
  return text + fmt::format("Device     {}\n", lock);
}

std::string statusJSON(const std::vector<ClassStatus>& classes, const std::string& lock) {
  nlohmann::json list = nlohmann::json::array();
  for (const ClassStatus& status : classes) list.push_back(classJSON(status));
  return jsonText({{"schema", kSchema}, {"lock", lock}, {"classes", std::move(list)}});
}

}  // namespace

// The catalogue's part is shown even without the daemon.
ExitStatus runStatus(const Options& options) {
  std::vector<ClassStatus> classes;
  for (const std::string& name : classesOf(options)) {
    classes.push_back(readClass(withClass(options, name)));
  }
  const std::string lock = lockStatus(options);
  ExitStatus status = print(options.format == OutputFormat::json ? statusJSON(classes, lock)
                                                                 : statusText(classes, lock));
  for (const ClassStatus& one : classes) {
    if (!one.error) continue;
    status = complain(one.error);
    if (status == ExitStatus::unreachable) break;
  }
  return status;
}

}  // namespace cli
