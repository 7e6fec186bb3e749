#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "cli/Options.h"
#include "cli/Settings.h"

namespace cli {

// The mailboxes of one protection class, and how they are to be kept.
struct MailboxGroup {
  std::string protectionClass;
  std::vector<std::string> roots;     // canonical, none below another
  std::vector<std::string> excluded;  // directories; folders of other classes are among them
  uint64_t largestMail = 0;           // in bytes; 0 for no limit of the user's own
  bool onBattery = false;
};

// Those of ~/Maildir, ~/Mail and ~/.mail that are there.
[[nodiscard]] std::vector<std::string> usualMailboxes();

// `paths` by their class, which is `protectionClass` for those that the settings name none for; its
// group comes first. With `allFolders` also the folders that the settings name a class for. Or what
// is wrong, for the user.
[[nodiscard]] std::variant<std::vector<MailboxGroup>, std::string> groupMailboxes(
    const Settings& settings, const std::vector<std::string>& paths,
    const std::string& protectionClass, bool allFolders);

// The mailboxes that `sync` or `watch` is for: the paths of the command line; else those of the
// settings; else those of the last time; else the usual ones, which are named to the user. With
// --class only that class. None, and the user has been told, where there is no mailbox or the
// settings are wrong.
[[nodiscard]] std::optional<std::vector<MailboxGroup>> mailboxGroups(const Options& options);

}  // namespace cli
