#pragma once

#include <deque>
#include <optional>
#include <string>
#include <unordered_set>
#include <variant>
#include <vector>

#include "cli/MailReader.h"

namespace mcp {

// Which mail may be shown: mail whose file, with all symbolic links resolved, is in one of the
// named folders or below. It limits what clients ask for; a program of the same user could still
// exchange files while they are read. One thread.
class FolderLimit {
 public:
  // Each is a query of its own.
  static constexpr size_t kMaxFolders = 8;

  // From paths as the user named them: folders, or mbox files. Or an error message for the user, if
  // there are none or too many, or one does not exist.
  [[nodiscard]] static std::variant<FolderLimit, std::string> of(
      const std::vector<std::string>& paths);

  // The folders under all names that mail may have been indexed with: as the user named them, and
  // with links resolved.
  [[nodiscard]] const std::vector<std::string>& spellings() const { return _spellings; }

  // Whether the mail is within the limit now. False for mail that is no longer on this disk, and
  // for identifiers of other clients.
  [[nodiscard]] bool allows(const std::string& identifier, cli::MailReader& reader) const;
  // The same for a path, such as that of a mailbox.
  [[nodiscard]] bool allowsPath(const std::string& path) const;

 private:
  FolderLimit() = default;

  std::vector<std::string> _folders;  // with links resolved
  std::vector<std::string> _spellings;
};

// The messages that a session has shown in lists. Only these can be read as a whole, so that a
// client cannot make up identifiers of other files in a folder. One thread.
class ListedMail {
 public:
  // The oldest are forgotten.
  static constexpr size_t kMaxListed = 10000;

  void add(const std::string& identifier);
  [[nodiscard]] bool holds(const std::string& identifier) const {
    return _known.contains(identifier);
  }

 private:
  std::unordered_set<std::string> _known;
  std::deque<std::string> _inOrder;
};

}  // namespace mcp
