#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <nlohmann/json.hpp>

#include "cli/AttachmentCounts.h"
#include "cli/Commands.h"
#include "cli/OutputFile.h"
#include "cli/Results.h"
#include "cli/StatusFacts.h"
#include "cli/StatusPage.h"
#include "platform/Clock.h"

namespace cli {

namespace {

constexpr size_t kBarColumns = 20;
constexpr size_t kShownProblems = 20;  // in text
constexpr size_t kMaxProblems = 10000;
constexpr int kSchema = 1;  // of the JSON output

std::string barOf(const mailsync::FolderCount& count) {
  const int64_t total = std::max<int64_t>(count.messages, 1);
  const auto filled =
      static_cast<size_t>(count.indexed * static_cast<int64_t>(kBarColumns) / total);
  return fmt::format("[{:=>{}}{:>{}}]", "", filled, "", kBarColumns - filled);
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

ExitStatus writePage(const std::string& path, const std::vector<ClassStatus>& classes,
                     const std::string& lock) {
  if (replaceFile(path, statusPage(classes, lock, platform::secondsSince1970()))) {
    return print(fmt::format("wrote {}\n", cleanForTerminal(path)));
  }
  complain(errno == EEXIST ? path + ": this is not a plain file, and stays"
                           : platform::posixError(errno, path).message);
  return ExitStatus::failure;
}

ExitStatus show(const Options& options, const std::vector<ClassStatus>& classes) {
  const std::string lock = lockStatus(options);
  if (!options.page.empty()) return writePage(options.page, classes, lock);
  return print(options.format == OutputFormat::json ? statusJSON(classes, lock)
                                                    : statusText(classes, lock));
}

}  // namespace

// The catalogue's part is shown even without the daemon.
ExitStatus runStatus(const Options& options) {
  const std::vector<ClassStatus> classes = readClasses(options);
  ExitStatus status = show(options, classes);
  for (const ClassStatus& one : classes) {
    if (!one.error) continue;
    status = complain(one.error);
    if (status == ExitStatus::unreachable) break;
  }
  return status;
}

}  // namespace cli
