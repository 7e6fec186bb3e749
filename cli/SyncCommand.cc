#include "cli/SyncCommand.h"

#include <fmt/format.h>

#include <atomic>
#include <csignal>
#include <cstdlib>
#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "cli/ProgressBar.h"
#include "cli/Results.h"
#include "platform/Files.h"
#include "platform/Paths.h"

namespace cli {

namespace {

std::atomic<bool> wasInterrupted{false};

void takeInterrupt(int signal) {
  wasInterrupted = true;
  std::signal(signal, SIG_DFL);
}

// The bar of a run, whose length is known once the mailboxes have been looked through.
class SyncProgress {
 public:
  void update(uint64_t messages, uint64_t deletions, const mailsync::DeliveryCounts& done) {
    if (!_bar) _bar.emplace(messages + deletions);
    const uint64_t sent = done.added + done.replaced + done.failed;
    _bar->update(sent + done.deleted, sent);
  }
  void clear() {
    if (_bar) _bar->clear();
  }

 private:
  std::optional<ProgressBar> _bar;
};

nlohmann::json jsonOf(const mailsync::SyncReport& report) {
  return {{"directories", report.scan.directories},
          {"entered", report.scan.entered},
          {"toSend", report.toSend},
          {"toDelete", report.toDelete},
          {"added", report.delivery.added},
          {"replaced", report.delivery.replaced},
          {"deleted", report.delivery.deleted},
          {"failed", report.delivery.failed},
          {"cut", report.delivery.cut},
          {"moved", report.scan.moves},
          {"flagsChanged", report.scan.flagChanges},
          {"unreadable", report.scan.unreadable},
          {"missing", report.scan.missing},
          {"compared", report.compared},
          {"interrupted", report.cancelled}};
}

// The paths of the command line, those of the last time, or the usual ones.
std::vector<std::string> mailboxesOf(const Options& options,
                                     const mailsync::SyncSettings& settings) {
  if (!options.arguments.empty()) return options.arguments;
  const auto catalogue = mailsync::openCatalogue(settings, nullptr);
  if (catalogue != nullptr && !catalogue->roots().empty()) return {};
  std::vector<std::string> usual = usualMailboxes();
  for (const std::string& path : usual) complain("found " + path);
  return usual;
}

bool hasMailboxes(const std::vector<std::string>& paths, const mailsync::SyncSettings& settings) {
  if (!paths.empty()) return true;
  const auto catalogue = mailsync::openCatalogue(settings, nullptr);
  return catalogue != nullptr && !catalogue->roots().empty();
}

}  // namespace

mailsync::SyncSettings syncSettings(const Options& options) {
  mailsync::SyncSettings settings;
  settings.runtimeDirectory = options.runtimeDirectory;
  settings.protectionClass = options.protectionClass;
  settings.name = options.name;
  settings.catalogueDirectory = mailsync::defaultCatalogueDirectory();
  settings.patience = options.patience();
  settings.pruneMissing = options.pruneMissing;
  settings.retryFailed = options.retryFailed;
  settings.dryRun = options.dryRun;
  return settings;
}

std::vector<std::string> usualMailboxes() {
  const char* const home = std::getenv("HOME");
  std::vector<std::string> found;
  for (const char* name : {"Maildir", "Mail", ".mail"}) {
    const std::string path = platform::joinPath(home == nullptr ? "/" : home, name);
    if (platform::fileExists(path)) found.push_back(path);
  }
  return found;
}

bool interrupted() {
  static const bool taken = [] {
    std::signal(SIGINT, takeInterrupt);
    std::signal(SIGTERM, takeInterrupt);
    return true;
  }();
  return taken && wasInterrupted;
}

std::string summaryOf(const mailsync::SyncReport& report, bool dryRun) {
  std::string text;
  const auto add = [&](uint64_t count, const char* what) {
    if (count > 0) text += fmt::format("{}{} {}", text.empty() ? "" : ", ", count, what);
  };
  if (dryRun) {
    add(report.toSend, "to send");
    add(report.toDelete, "to delete");
  } else {
    add(report.delivery.added, "added");
    add(report.delivery.replaced, "replaced");
    add(report.delivery.deleted, "deleted");
    add(report.delivery.failed, "failed");
    add(report.delivery.cut, "too long and cut");
  }
  add(report.scan.moves, "moved within a folder");
  add(report.scan.flagChanges, "with other flags");
  add(report.scan.unreadable, "not readable");
  add(report.scan.missing, "folders not there");
  if (text.empty()) text = "nothing to do";
  return report.cancelled ? text + ", interrupted" : text;
}

ExitStatus runSync(const Options& options) {
  const mailsync::SyncSettings settings = syncSettings(options);
  const std::vector<std::string> paths = mailboxesOf(options, settings);
  if (!hasMailboxes(paths, settings)) {
    complain(std::string("no mailbox is known; name one: tallow sync ~/Mail"));
    return ExitStatus::failure;
  }
  SyncProgress progress;
  std::string plan;
  const mailsync::SyncObserver observer{
      [&](const std::string& where, const std::string& reason) {
        progress.clear();
        complain(fmt::format("{}: {}", where, reason));
      },
      [&](uint64_t messages, uint64_t deletions, const mailsync::DeliveryCounts& done) {
        progress.update(messages, deletions, done);
      },
      interrupted,
      [&](const char* action, const std::string& message) {
        if (options.verbose) plan += fmt::format("{} {}\n", action, cleanForTerminal(message));
      }};
  if (interrupted()) return ExitStatus::failure;
  mailsync::SyncReport report;
  std::optional<TLError> error;
  const bool done = mailsync::syncMail(settings, paths, observer, report, &error);
  progress.clear();
  ExitStatus status = done ? ExitStatus::done : complain(error);
  const bool incomplete = report.cancelled || report.delivery.failed > 0 ||
                          report.scan.unreadable > 0 || report.scan.missing > 0;
  if (done && incomplete) status = ExitStatus::failure;
  if (!done && report.toSend + report.toDelete == 0) return status;
  return print(options.format == OutputFormat::json
                   ? jsonText(jsonOf(report))
                   : plan + summaryOf(report, options.dryRun) + '\n',
               status);
}

}  // namespace cli
