#include "cli/LinkFolder.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <glib.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <climits>
#include <filesystem>
#include <optional>
#include <set>
#include <thread>
#include <vector>

#include "cli/MailWalker.h"
#include "platform/Files.h"
#include "platform/Paths.h"

namespace cli {

namespace {

using platform::FileDescriptor;

constexpr std::chrono::seconds kLockPatience{10};
constexpr std::chrono::milliseconds kLockStep{50};
constexpr const char* kNew = "new";
constexpr const char* kCurrent = "cur";
constexpr const char* kStage = "tmp";
// The mark comes first, so that nobody takes the links for mail.
constexpr const char* kParts[] = {kLinkFolderMark, kCurrent, kNew, kStage};
constexpr size_t kDigestLetters = 16;
constexpr std::string_view kNameEnd = ".tallow";
constexpr mode_t kPrivate = 0700;

bool refuse(TLErrorOut error, int code, const std::string& text) {
  platform::setError(error, {"tallow", code, text});
  return false;
}

bool failed(TLErrorOut error, const std::string& what) {
  platform::setError(error, platform::posixError(errno, what));
  return false;
}

// Links are not followed.
FileDescriptor openDirectory(int above, const char* name) {
  return FileDescriptor(openat(above, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

// The type bits of an entry; 0 if there is none.
mode_t typeOf(int directory, const char* name) {
  struct stat info;
  return fstatat(directory, name, &info, AT_SYMLINK_NOFOLLOW) == 0 ? info.st_mode & S_IFMT : 0;
}

std::vector<std::string> namesIn(int directory) {
  return platform::listDirectory(fmt::format("/proc/self/fd/{}", directory), nullptr)
      .value_or(std::vector<std::string>());
}

std::string digestOf(const std::string& identifier) {
  char* const sum = g_compute_checksum_for_string(G_CHECKSUM_SHA256, identifier.data(),
                                                  static_cast<gssize>(identifier.size()));
  std::string digest(sum, kDigestLetters);
  g_free(sum);
  return digest;
}

bool isDigest(std::string_view text) {
  return text.size() == kDigestLetters &&
         text.find_first_not_of("0123456789abcdef") == std::string_view::npos;
}

// Whether a link has a name of ours: TIME.DIGEST.tallow, and what mail programs append.
bool isOurName(std::string_view name) {
  const size_t dot = name.find_first_not_of("0123456789");
  if (dot == 0 || dot == std::string_view::npos || name[dot] != '.') return false;
  const std::string_view rest = name.substr(dot + 1);
  return isDigest(rest.substr(0, kDigestLetters)) &&
         rest.substr(kDigestLetters).starts_with(kNameEnd);
}

std::string nameOf(const LinkedMail& mail) {
  std::string name =
      fmt::format("{}.{}{}", std::max<int64_t>(mail.time, 0), digestOf(mail.identifier), kNameEnd);
  if (mail.isNew) return name;
  std::set<char> letters;
  for (const char c : mail.flags) {
    if (g_ascii_isalpha(c)) letters.insert(c);
  }
  return name + ":2," + std::string(letters.begin(), letters.end());
}

// Whether we have made an entry of the part `partName`.
bool isOurs(int part, std::string_view partName, const std::string& name) {
  const mode_t type = typeOf(part, name.c_str());
  const bool link = partName != kLinkFolderMark && isOurName(name) && S_ISLNK(type);
  const bool copies = partName == kLinkFolderMark || partName == kStage;
  return link || (copies && isDigest(name) && S_ISREG(type));
}

bool isMarked(int folder) {
  return S_ISDIR(typeOf(folder, kLinkFolderMark));
}

// The name of an entry that others have made in a part; nullopt if all is ours.
std::optional<std::string> foreignEntry(int folder, const char* partName) {
  const FileDescriptor part = openDirectory(folder, partName);
  for (const std::string& name : namesIn(part.get())) {
    if (!isOurs(part.get(), partName, name)) return fmt::format("{}/{}", partName, name);
  }
  return std::nullopt;
}

// The same for a link folder, or an empty directory that is to become one.
std::optional<std::string> foreignEntry(int folder) {
  const bool marked = isMarked(folder);
  for (const std::string& name : namesIn(folder)) {
    const auto* const part = std::find(std::begin(kParts), std::end(kParts), name);
    if (!marked || part == std::end(kParts) || !S_ISDIR(typeOf(folder, name.c_str()))) return name;
    if (auto foreign = foreignEntry(folder, *part)) return foreign;
  }
  return std::nullopt;
}

std::string targetOf(int folder, const std::string& link) {
  char target[PATH_MAX];
  const ssize_t size = readlinkat(folder, link.c_str(), target, sizeof target);
  return size < 0 ? std::string() : std::string(target, static_cast<size_t>(size));
}

// Waits for other processes that work in this directory.
bool lockDirectory(int directory, const std::string& path, TLErrorOut error) {
  const auto end = std::chrono::steady_clock::now() + kLockPatience;
  while (flock(directory, LOCK_EX | LOCK_NB) != 0) {
    if (errno != EWOULDBLOCK) return failed(error, "cannot lock " + path);
    if (std::chrono::steady_clock::now() >= end) {
      return refuse(error, EWOULDBLOCK, path + ": another search is at work there");
    }
    std::this_thread::sleep_for(kLockStep);
  }
  return true;
}

bool writeNewFile(int directory, const std::string& name, std::string_view bytes) {
  const FileDescriptor file(
      openat(directory, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
  return file.get() >= 0 && platform::writeAt(file.get(), 0, bytes);
}

// The absolute path without a slash at its end. Nullopt with an error for a path that could mean
// another directory than its text says.
std::optional<std::string> usablePath(const std::string& path, TLErrorOut error) {
  const std::filesystem::path given(path);
  if (std::find(given.begin(), given.end(), "..") != given.end()) {
    refuse(error, EINVAL, path + ": a folder for links may not be named with \"..\"");
    return std::nullopt;
  }
  std::error_code failure;
  std::string whole = std::filesystem::absolute(given, failure).lexically_normal().string();
  while (whole.size() > 1 && whole.ends_with('/')) whole.pop_back();
  if (!failure && whole.size() > 1 && path.find('\0') == std::string::npos) return whole;
  refuse(error, EINVAL, path + ": this cannot be a folder for links");
  return std::nullopt;
}

// The open and locked directory; created if there is none. Links are not followed.
FileDescriptor openPlace(const std::string& path, TLErrorOut error) {
  struct stat info;
  FileDescriptor folder;
  if (lstat(path.c_str(), &info) == 0 && !S_ISDIR(info.st_mode)) {
    refuse(error, ENOTDIR,
           path + (S_ISLNK(info.st_mode) ? ": this is a symbolic link, and stays"
                                         : ": this is a file, and stays"));
    return folder;
  }
  if (!platform::createDirectories(path, error)) return folder;
  folder = openDirectory(AT_FDCWD, path.c_str());
  if (folder.get() < 0) failed(error, path);
  if (folder.get() >= 0 && !lockDirectory(folder.get(), path, error)) folder.reset();
  return folder;
}

}  // namespace

std::unique_ptr<LinkFolder> LinkFolder::begin(const std::string& path, TLErrorOut error) {
  const auto whole = usablePath(path, error);
  if (!whole) return nullptr;
  FileDescriptor place = openPlace(*whole, error);
  if (place.get() < 0) return nullptr;
  if (const auto foreign = foreignEntry(place.get())) {
    refuse(error, ENOTEMPTY,
           fmt::format("{}: {} is not from a search; move it away first", *whole, *foreign));
    return nullptr;
  }
  std::unique_ptr<LinkFolder> folder(new LinkFolder(*whole, std::move(place)));
  return folder->prepare(error) ? std::move(folder) : nullptr;
}

LinkFolder::~LinkFolder() {
  removeOurs(kStage, {});
}

// Also removes what a process that was killed has left.
bool LinkFolder::prepare(TLErrorOut error) {
  for (const char* const part : kParts) {
    const bool there = mkdirat(_folder.get(), part, kPrivate) == 0 || errno == EEXIST;
    if (!there) return failed(error, _path);
  }
  removeOurs(kStage, {});
  return true;
}

bool LinkFolder::addLink(const LinkedMail& mail, const std::string& target, TLErrorOut error) {
  const std::string name = nameOf(mail);
  const std::string staged = fmt::format("{}/{}", kStage, name);
  if (symlinkat(target.c_str(), _folder.get(), staged.c_str()) != 0) {
    return errno == EEXIST || failed(error, _path);
  }
  _links[mail.isNew ? kNew : kCurrent].insert(name);
  return true;
}

bool LinkFolder::addCopy(const LinkedMail& mail, std::string_view message, TLErrorOut error) {
  const std::string name = digestOf(mail.identifier);
  if (!_copies.insert(name).second) return true;
  return (writeNewFile(_folder.get(), fmt::format("{}/{}", kStage, name), message) ||
          failed(error, _path)) &&
         addLink(mail, fmt::format("../{}/{}", kLinkFolderMark, name), error);
}

bool LinkFolder::publish(TLErrorOut error) {
  const int folder = _folder.get();
  for (const std::string& name : _copies) {
    const std::string staged = fmt::format("{}/{}", kStage, name);
    const std::string place = fmt::format("{}/{}", kLinkFolderMark, name);
    if (renameat(folder, staged.c_str(), folder, place.c_str()) != 0) return failed(error, _path);
  }
  for (const auto& [part, names] : _links) {
    for (const std::string& name : names) {
      if (!publishLink(part, name)) return failed(error, _path);
    }
  }
  for (const char* const part : {kCurrent, kNew}) removeOurs(part, _links[part]);
  removeOurs(kLinkFolderMark, _copies);
  return true;
}

// A link that is there already stays, so that mail programs see no change.
bool LinkFolder::publishLink(const std::string& part, const std::string& name) {
  const int folder = _folder.get();
  const std::string staged = fmt::format("{}/{}", kStage, name);
  const std::string place = fmt::format("{}/{}", part, name);
  if (targetOf(folder, place) == targetOf(folder, staged)) {
    return unlinkat(folder, staged.c_str(), 0) == 0;
  }
  return renameat(folder, staged.c_str(), folder, place.c_str()) == 0;
}

void LinkFolder::removeOurs(const char* partName, const std::set<std::string>& kept) {
  const FileDescriptor part = openDirectory(_folder.get(), partName);
  if (part.get() < 0) return;
  for (const std::string& name : namesIn(part.get())) {
    if (!kept.contains(name) && isOurs(part.get(), partName, name)) {
      unlinkat(part.get(), name.c_str(), 0);
    }
  }
}

}  // namespace cli
