#include "cli/SyncCommand.h"

#include <fmt/format.h>

#include <atomic>
#include <csignal>
#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "cli/HelperProgram.h"
#include "cli/ProgressBar.h"
#include "cli/Results.h"
#include "cli/StatusFacts.h"

namespace cli {

namespace {

std::atomic<bool> wasInterrupted{false};

void takeInterrupt(int signal) {
  wasInterrupted = true;
  std::signal(signal, SIG_DFL);
}

// The progress bar of a run. Its total is known after the scan of the mailboxes.
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

// The run of one class.
struct GroupRun {
  bool done = false;  // the run was completed; otherwise its error has been printed
  ExitStatus status = ExitStatus::done;
  mailsync::SyncReport report;
  std::string plan;
};

GroupRun syncGroup(const Options& options, const MailboxGroup& group) {
  GroupRun run;
  mailsync::SyncReport& report = run.report;
  SyncProgress progress;
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
        if (options.verbose) run.plan += fmt::format("{} {}\n", action, cleanForTerminal(message));
      }};
  std::optional<TLError> error;
  run.done =
      mailsync::syncMail(syncSettings(options, group), group.roots, observer, report, &error);
  progress.clear();
  const bool incomplete = report.cancelled || report.delivery.failed > 0 ||
                          report.scan.unreadable > 0 || report.scan.missing > 0;
  if (!run.done) {
    run.status = complain(error);
  } else if (incomplete) {
    run.status = ExitStatus::failure;
  }
  return run;
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
  settings.reread = options.reread;
  settings.dryRun = options.dryRun;
  return settings;
}

mailsync::SyncSettings syncSettings(const Options& options, const MailboxGroup& group) {
  mailsync::SyncSettings settings = syncSettings(options);
  settings.protectionClass = group.protectionClass;
  settings.excluded = group.excluded;
  settings.largestMessage = group.largestMail;
  Options ofGroup = options;
  ofGroup.protectionClass = group.protectionClass;
  settings.measure = [ofGroup] { return measureIndex(ofGroup); };
  settings.extractProgram = extractProgram(options, group.attachments);
  return settings;
}

bool interrupted() {
  static const bool taken = [] {
    std::signal(SIGINT, takeInterrupt);
    std::signal(SIGTERM, takeInterrupt);
    // The terminal was closed; `nohup` ignores that.
    if (std::signal(SIGHUP, takeInterrupt) == SIG_IGN) std::signal(SIGHUP, SIG_IGN);
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

// Syncs one class after another; stops if the daemon is not running.
ExitStatus runSync(const Options& options) {
  const auto groups = mailboxGroups(options);
  if (!groups || interrupted()) return ExitStatus::failure;
  ExitStatus status = ExitStatus::done;
  nlohmann::json json = nlohmann::json::array();
  std::string text;
  for (const MailboxGroup& group : *groups) {
    const GroupRun run = syncGroup(options, group);
    if (run.status != ExitStatus::done) status = run.status;
    if (run.done || run.report.toSend + run.report.toDelete > 0) {
      json.push_back(jsonOf(run.report));
      json.back()["class"] = group.protectionClass;
      text += run.plan + (groups->size() > 1 ? group.protectionClass + ": " : "");
      text += summaryOf(run.report, options.dryRun) + '\n';
    }
    if (run.report.cancelled || run.status == ExitStatus::unreachable) break;
  }
  if (text.empty()) return status;
  if (options.format != OutputFormat::json) return print(text, status);
  return print(jsonText(groups->size() == 1 ? json[0] : json), status);
}

}  // namespace cli
