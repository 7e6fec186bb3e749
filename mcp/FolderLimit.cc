#include "mcp/FolderLimit.h"

#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <climits>
#include <cstdlib>
#include <memory>

#include "cli/MailPlaces.h"
#include "sync/Inventory.h"

namespace mcp {

namespace {

// The path with all links resolved; nullopt if there is no such file.
std::optional<std::string> resolved(const std::string& path) {
  const std::unique_ptr<char, decltype(&std::free)> real(realpath(path.c_str(), nullptr),
                                                         &std::free);
  return real == nullptr ? std::nullopt : std::optional<std::string>(real.get());
}

}  // namespace

std::variant<FolderLimit, std::string> FolderLimit::of(const std::vector<std::string>& paths) {
  if (paths.empty()) {
    return std::string(
        "name the folders whose mail may be shown: --folder ~/Mail/lists, or mcp_folders in the "
        "settings");
  }
  if (paths.size() > kMaxFolders) return fmt::format("more than {} folders", kMaxFolders);
  FolderLimit limit;
  for (const std::string& path : paths) {
    auto real = resolved(path);
    if (!real) return fmt::format("there is no folder {}", path);
    for (std::string& spelling : cli::spellingsOf(path)) {
      limit._spellings.push_back(std::move(spelling));
    }
    limit._folders.push_back(std::move(*real));
  }
  return limit;
}

bool FolderLimit::allowsPath(const std::string& path) const {
  const auto real = resolved(path);
  return real && std::any_of(_folders.begin(), _folders.end(), [&](const std::string& folder) {
           return mailsync::isAtOrBelow(*real, folder);
         });
}

bool FolderLimit::allows(const std::string& identifier, cli::MailReader& reader) const {
  auto location = reader.locate(identifier);
  // A message of an mbox file whose offset is not known is still a message of that file.
  if (!location) location = cli::parseIdentifier(identifier);
  return location && location->path.find('\0') == std::string::npos && allowsPath(location->path);
}

void ListedMail::add(const std::string& identifier) {
  if (!_known.insert(identifier).second) return;
  _inOrder.push_back(identifier);
  if (_inOrder.size() <= kMaxListed) return;
  _known.erase(_inOrder.front());
  _inOrder.pop_front();
}

}  // namespace mcp
