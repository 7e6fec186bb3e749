#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "cli/Options.h"
#include "cli/Settings.h"

namespace cli {

// The mailboxes of one protection class, and their settings.
struct MailboxGroup {
  std::string protectionClass;
  std::vector<std::string> roots;     // canonical, none below another
  std::vector<std::string> excluded;  // directories; folders of other classes are among them
  uint64_t largestMail = 0;           // in bytes; 0 if the user set no limit
  bool onBattery = false;
  bool attachments = true;
};

// Those of ~/Maildir, ~/Mail and ~/.mail that exist.
[[nodiscard]] std::vector<std::string> usualMailboxes();

// Groups `paths` by class. Paths without a class in the settings get `protectionClass`, whose group
// comes first. With `allFolders`, folders that have a class in the settings are included. Or an
// error message for the user.
[[nodiscard]] std::variant<std::vector<MailboxGroup>, std::string> groupMailboxes(
    const Settings& settings, const std::vector<std::string>& paths,
    const std::string& protectionClass, bool allFolders);

// The mailboxes for `sync` or `watch`: the paths of the command line, else those of the settings,
// else those of the last run, else the usual ones, which are then printed. With --class, only that
// class. Nullopt, after a message to the user, if there is no mailbox or the settings are wrong.
[[nodiscard]] std::optional<std::vector<MailboxGroup>> mailboxGroups(const Options& options);

}  // namespace cli
