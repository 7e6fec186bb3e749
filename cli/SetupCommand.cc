#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>

#include "cli/Commands.h"
#include "cli/MailFinder.h"
#include "cli/Mailboxes.h"
#include "cli/Settings.h"
#include "cli/SettingsFile.h"
#include "cli/SetupDialog.h"
#include "cli/StatusFacts.h"
#include "cli/SyncCommand.h"
#include "cli/UserUnits.h"
#include "client/DebugServiceProxy.h"
#include "platform/Files.h"
#include "sync/Inventory.h"
#include "sync/MailSync.h"

// From an installed package to the first search: mailboxes into the settings, units on, first sync.
// Each step finds out what is done already, so that the command can be run again.
//
// The sync of this command runs between the start of the daemon and that of the watch, so that the
// two do not wait for each other's lock. The watch continues what an interrupt has left.
namespace cli {

namespace {

// For systemd to start the daemon at the first connection.
constexpr rpc::Patience kDaemonPatience{std::chrono::seconds(30)};

std::string variable(const char* name) {
  const char* const value = std::getenv(name);
  return value == nullptr ? "" : value;
}

void say(const std::string& line) {
  // A closed output is no reason to stop half-way.
  (void)print(cleanForTerminal(line) + '\n');
}

// Why the command cannot run at all; empty if it can.
std::string refusal(const Options& options) {
  if (geteuid() == 0 && !variable("SUDO_USER").empty()) {
    return "a setup is for your own user; run it without sudo";
  }
  if (!variable("HOME").starts_with('/')) return "$HOME does not name your home directory";
  for (const std::string& path : options.arguments) {
    if (!platform::fileExists(path)) return path + ": there is no such file or directory";
    if (!fitsSettings(mailsync::canonicalPath(path))) {
      return path + ": the settings cannot hold this name, which is not UTF-8";
    }
  }
  return "";
}

bool isTerminal() {
  return isatty(STDIN_FILENO) == 1 && isatty(STDERR_FILENO) == 1;
}

class Setup {
 public:
  Setup(Options options, Settings settings)
      : _options(std::move(options)), _settings(std::move(settings)), _home(variable("HOME")) {}

  ExitStatus run() {
    _found = look();
    show();
    if (!isConfigured() && _found.places.empty()) return nothingFound();
    if (_options.dryRun || !(_options.yes || isTerminal())) return showPlan();
    const auto chosen = choose();
    if (!chosen) return giveUp();
    std::optional<TLError> error;
    if (!chosen->empty() && !addRootsToSettings(*chosen, _home, &error)) return complain(error);
    if (!chosen->empty()) say("Wrote " + settingsPath() + '.');
    return start(!chosen->empty());
  }

 private:
  [[nodiscard]] bool isConfigured() const {
    return !_settings.roots.empty() || !_settings.classes.empty();
  }

  // What is found and not in the settings yet.
  [[nodiscard]] FoundMail look() const {
    FoundMail found =
        _options.arguments.empty() ? findMail(_home, knownRoots()) : lookAtMail(_options.arguments);
    std::erase_if(found.places, [&](const MailPlace& place) { return isCovered(place.path); });
    std::erase_if(found.places, [&](const MailPlace& place) {
      if (fitsSettings(place.path)) return false;
      found.remarks.push_back(place.path + " is skipped: its name is not UTF-8");
      return true;
    });
    return found;
  }

  // Those that `tallow sync PATH` was run with, which roots in the settings would replace.
  [[nodiscard]] std::vector<std::string> knownRoots() const {
    const auto catalogue = mailsync::openCatalogue(syncSettings(_options), nullptr);
    if (catalogue == nullptr || !_settings.roots.empty()) return {};
    return catalogue->roots();
  }

  // Whether the settings have an opinion on this place.
  [[nodiscard]] bool isCovered(const std::string& path) const {
    const auto covers = [&path](const std::string& place) {
      return mailsync::isAtOrBelow(path, mailsync::canonicalPath(place));
    };
    return std::ranges::any_of(_settings.roots, covers) ||
           std::ranges::any_of(_settings.excluded, covers) ||
           std::ranges::any_of(_settings.classes,
                               [&](const auto& row) { return covers(row.first); });
  }

  void show() const {
    for (const std::string& remark : _found.remarks) complain(remark);
    for (const std::string& root : _settings.roots) say("Already in the settings: " + root);
    if (_found.places.empty()) return;
    say(_options.arguments.empty() ? "Mail on this device:" : "Mail to take:");
    (void)print(placesText(_found.places));
  }

  [[nodiscard]] std::vector<std::string> allPaths() const {
    std::vector<std::string> paths;
    for (const MailPlace& place : _found.places) paths.push_back(place.path);
    return paths;
  }

  // The places to add; nullopt if the user gave no answer, or wants none and has none.
  [[nodiscard]] std::optional<std::vector<std::string>> choose() const {
    if (_options.yes || !_options.arguments.empty() || _found.places.empty()) return allPaths();
    auto chosen = askWhich(_found.places, !isConfigured());
    return chosen && chosen->empty() && !isConfigured() ? std::nullopt : chosen;
  }

  [[nodiscard]] ExitStatus nothingFound() const {
    complain(_options.arguments.empty()
                 ? "no mail was found in the usual places; name it: tallow setup DIR"
                 : "the settings leave these places out: " + settingsPath());
    return ExitStatus::failure;
  }

  [[nodiscard]] static ExitStatus giveUp() {
    complain(std::string("nothing has been changed"));
    return ExitStatus::failure;
  }

  [[nodiscard]] ExitStatus showPlan() const {
    const auto paths = allPaths();
    if (paths.empty() && unitsAreOn()) {
      say("All is set up.");
      return ExitStatus::done;
    }
    say("A setup would:");
    if (!paths.empty()) {
      (void)print(fmt::format("  add to {}: {}", cleanForTerminal(settingsPath()),
                              rootsLine(paths, _home)));
    }
    say("  switch on tallowsearchd and tallow-watch.service in your systemd");
    say("  index the mail");
    if (_options.dryRun) return ExitStatus::done;
    complain(std::string("nothing has been changed; without a terminal, --yes does it"));
    return ExitStatus::failure;
  }

  // Starts daemon, first sync and watch, as far as they are not at work.
  [[nodiscard]] ExitStatus start(bool changed) {
    if (_options.runtimeDirectory != rpc::defaultRuntimeDirectory()) {
      say("The units of systemd stay as they are, because of --runtime-dir.");
      return syncAlone(changed);
    }
    if (!changed && unitsAreOn()) return tellDone();
    if (const auto failure = enableUnits()) {
      complain("the units of systemd cannot be used: " + *failure);
      return syncAlone(changed);
    }
    // For root it depends on the sockets, which may be new.
    _options.runtimeDirectory = rpc::defaultRuntimeDirectory();
    say("The daemon and tallow-watch.service start by themselves from now on.");
    return syncWithUnits();
  }

  [[nodiscard]] std::optional<TLError> ping(rpc::Patience patience) const {
    std::optional<TLError> error;
    client::DebugServiceProxy service(_options.runtimeDirectory,
                                      std::max(patience, _options.patience()));
    (void)service.ping("tallow setup", &error);
    return error;
  }

  [[nodiscard]] ExitStatus tellDone() const {
    if (const auto error = ping(rpc::Patience(0))) return complain(error);
    say("All is set up and at work; `tallow status` shows how far.");
    return ExitStatus::done;
  }

  [[nodiscard]] ExitStatus syncWithUnits() const {
    ExitStatus status = ExitStatus::unreachable;
    if (const auto error = ping(kDaemonPatience)) {
      complain(error);
      complain(std::string("journalctl --user -u tallowsearchd shows its log"));
    } else {
      status = sync("tallow-watch.service.");
    }
    if (const auto failure = startWatchUnit()) {
      complain("tallow-watch.service does not start: " + *failure);
      return status == ExitStatus::done ? ExitStatus::failure : status;
    }
    if (interrupted()) {
      say("tallow-watch.service continues; `tallow status` shows how far.");
      return ExitStatus::done;
    }
    if (status == ExitStatus::done) say("Done. To search: tallow search WORDS");
    return status;
  }

  // Without units: if a daemon runs.
  [[nodiscard]] ExitStatus syncAlone(bool changed) const {
    if (const auto error = ping(rpc::Patience(0)); rpc::isUnreachable(error)) {
      complain(std::string("no daemon answers; start `tallowsearchd` and run this again"));
      return ExitStatus::unreachable;
    } else if (error) {
      return complain(error);
    }
    const bool watched = isWatched(_options);
    if (watched && !changed) return tellDone();
    const ExitStatus status = sync("another `tallow setup`.");
    say(watched ? "Restart your `tallow watch`, which has the old settings."
                : "`tallow watch` keeps the index in step while it runs.");
    return status;
  }

  [[nodiscard]] ExitStatus sync(const char* afterInterrupt) const {
    Options ofSettings = _options;
    ofSettings.arguments.clear();
    say(std::string("Indexing; Ctrl-C leaves the rest to ") + afterInterrupt);
    return runSync(ofSettings);
  }

  Options _options;
  const Settings _settings;
  const std::string _home;
  FoundMail _found;
};

}  // namespace

ExitStatus runSetup(const Options& options) {
  if (const std::string reason = refusal(options); !reason.empty()) {
    complain(reason);
    return ExitStatus::failure;
  }
  auto settings = readSettings();
  if (const auto* const wrong = std::get_if<std::string>(&settings)) {
    complain(*wrong);
    return ExitStatus::failure;
  }
  return Setup(options, std::get<Settings>(std::move(settings))).run();
}

}  // namespace cli
