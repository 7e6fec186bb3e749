#include "cli/Mailboxes.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdlib>
#include <map>

#include "cli/Commands.h"
#include "cli/SyncCommand.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "sync/Inventory.h"

namespace cli {

namespace {

using mailsync::canonicalPath;

std::vector<std::string> excludedOf(const Settings& settings,
                                    const std::vector<std::string>& roots) {
  std::vector<std::string> excluded = settings.excluded;
  for (const std::string& root : roots) {
    for (const std::string& name : settings.excludedNames) {
      excluded.push_back(platform::joinPath(root, name));
    }
  }
  return excluded;
}

// The mailboxes of the last run, or else the usual ones.
std::vector<std::string> knownMailboxes(const Options& options) {
  const auto catalogue = mailsync::openCatalogue(syncSettings(options), nullptr);
  std::vector<std::string> known;
  if (catalogue != nullptr) known = catalogue->roots();
  if (!known.empty()) return known;
  known = usualMailboxes();
  for (const std::string& path : known) complain("found " + path);
  return known;
}

// An error if a folder with a class is inside another such folder.
std::optional<std::string> nestedFolders(const std::map<std::string, std::string>& classes) {
  for (auto row = classes.begin(); row != classes.end(); ++row) {
    for (auto below = std::next(row); below != classes.end(); ++below) {
      if (mailsync::isAtOrBelow(below->first, row->first)) {
        return fmt::format("{} lies in {}; a folder has one class with all below it", below->first,
                           row->first);
      }
    }
  }
  return std::nullopt;
}

std::nullopt_t refuse(const std::string& reason) {
  complain(reason);
  return std::nullopt;
}

}  // namespace

std::vector<std::string> usualMailboxes() {
  const char* const home = std::getenv("HOME");
  std::vector<std::string> found;
  for (const char* name : {"Maildir", "Mail", ".mail"}) {
    const std::string path = platform::joinPath(home == nullptr ? "/" : home, name);
    if (platform::fileExists(path)) found.push_back(path);
  }
  return found;
}

std::variant<std::vector<MailboxGroup>, std::string> groupMailboxes(
    const Settings& settings, const std::vector<std::string>& paths,
    const std::string& protectionClass, bool allFolders) {
  std::map<std::string, std::string> classes;  // by canonical folder
  for (const auto& [folder, name] : settings.classes) classes[canonicalPath(folder)] = name;
  if (auto wrong = nestedFolders(classes)) return *wrong;
  std::map<std::string, std::vector<std::string>> roots;  // by class
  for (const std::string& path : paths) {
    const std::string root = canonicalPath(path);
    const auto named = std::find_if(classes.begin(), classes.end(), [&](const auto& row) {
      return mailsync::isAtOrBelow(root, row.first);
    });
    roots[named == classes.end() ? protectionClass : named->second].push_back(root);
  }
  for (const auto& [folder, name] : classes) {
    if (allFolders) roots[name].push_back(folder);
  }
  std::vector<MailboxGroup> groups;
  for (auto& [name, places] : roots) {
    MailboxGroup group{name,
                       mailsync::outermost(std::move(places)),
                       {},
                       settings.largestMail,
                       settings.onBattery,
                       settings.attachments};
    group.excluded = excludedOf(settings, group.roots);
    for (const auto& [folder, other] : classes) {
      if (other != name) group.excluded.push_back(folder);
    }
    groups.insert(name == protectionClass ? groups.begin() : groups.end(), std::move(group));
  }
  return groups;
}

std::optional<std::vector<MailboxGroup>> mailboxGroups(const Options& options) {
  const auto read = readSettings();
  if (const auto* const wrong = std::get_if<std::string>(&read)) return refuse(*wrong);
  const auto& settings = std::get<Settings>(read);
  std::vector<std::string> paths = options.arguments;
  const bool named = !paths.empty();
  if (!named) paths = settings.roots.empty() ? knownMailboxes(options) : settings.roots;
  // The settings are for the default class. A class on the command line applies only to paths on
  // the command line.
  const std::string protectionClass =
      named || settings.roots.empty() ? options.protectionClass : Options().protectionClass;
  auto grouped = groupMailboxes(settings, paths, protectionClass, !named);
  if (const auto* const wrong = std::get_if<std::string>(&grouped)) {
    return refuse(settingsPath() + ": " + *wrong);
  }
  auto& groups = std::get<std::vector<MailboxGroup>>(grouped);
  for (auto group = groups.begin(); options.classGiven && group != groups.end();) {
    const bool other = group->protectionClass != options.protectionClass;
    if (other && named) {
      return refuse(fmt::format("{} has the class {} by {}", group->roots.front(),
                                group->protectionClass, settingsPath()));
    }
    group = other ? groups.erase(group) : std::next(group);
  }
  if (groups.empty()) return refuse("no mailbox is known; name one: tallow sync ~/Mail");
  return groups;
}

}  // namespace cli
