#include "cli/MailWalker.h"

#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <vector>

#include "platform/Files.h"
#include "platform/Paths.h"

namespace cli {

namespace {

struct Directory {
  std::string path;
  size_t depth;
};

// Visits the files of one directory and adds its subdirectories to `pending` in reverse order.
bool visitDirectory(const Directory& directory, const WalkVisitor& visitor,
                    std::vector<Directory>& pending) {
  std::optional<TLError> error;
  auto names = platform::listDirectory(directory.path, &error);
  if (!names) return visitor.failure(directory.path, error->message);
  std::sort(names->begin(), names->end());
  const bool maildir = std::binary_search(names->begin(), names->end(), "cur");
  std::vector<Directory> below;
  for (const std::string& name : *names) {
    const std::string path = platform::joinPath(directory.path, name);
    struct stat info;
    struct stat target;
    // An entry that no longer exists was moved or deleted since the listing.
    if (lstat(path.c_str(), &info) != 0 || stat(path.c_str(), &target) != 0) continue;
    if (S_ISDIR(info.st_mode)) {
      if (!(maildir && name == "tmp") && !isLinkFolder(path))
        below.push_back({path, directory.depth + 1});
    } else if (S_ISREG(target.st_mode)) {
      if (!visitor.file(path, false, static_cast<uint64_t>(target.st_size))) return false;
    }
  }
  pending.insert(pending.end(), below.rbegin(), below.rend());
  return true;
}

}  // namespace

bool isLinkFolder(const std::string& directory) {
  struct stat info;
  return lstat(platform::joinPath(directory, kLinkFolderMark).c_str(), &info) == 0 &&
         S_ISDIR(info.st_mode);
}

bool walkMail(const std::string& path, const WalkVisitor& visitor) {
  std::error_code failure;
  const std::string root = std::filesystem::canonical(path, failure).string();
  struct stat info;
  if (failure || stat(root.c_str(), &info) != 0) {
    const int code = failure ? failure.value() : errno;
    return visitor.failure(path, platform::posixError(code, "cannot open").message);
  }
  if (!S_ISDIR(info.st_mode)) {
    return visitor.file(root, true, static_cast<uint64_t>(info.st_size));
  }
  if (isLinkFolder(root)) {
    return visitor.failure(root, "these are links of a search; their mail is indexed elsewhere");
  }
  std::vector<Directory> pending{{root, 0}};
  while (!pending.empty()) {
    const Directory directory = std::move(pending.back());
    pending.pop_back();
    const bool goOn =
        directory.depth > kMaxDirectoryDepth
            ? visitor.failure(directory.path,
                              fmt::format("more than {} directories deep", kMaxDirectoryDepth))
            : visitDirectory(directory, visitor, pending);
    if (!goOn) return false;
  }
  return true;
}

}  // namespace cli
