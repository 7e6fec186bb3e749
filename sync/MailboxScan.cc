#include "sync/MailboxScan.h"

#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <utility>

#include "cli/Identifier.h"
#include "cli/MailFile.h"
#include "cli/MailWalker.h"
#include "platform/Files.h"
#include "platform/Paths.h"

namespace mailsync {

namespace {

constexpr int64_t kSecond = 1'000'000'000;

int64_t nanoseconds(const timespec& time) {
  return static_cast<int64_t>(time.tv_sec) * kSecond + time.tv_nsec;
}

int64_t currentTime() {
  timespec now{};
  clock_gettime(CLOCK_REALTIME, &now);
  return nanoseconds(now);
}

bool look(const std::string& path, struct stat& info) {
  return stat(path.c_str(), &info) == 0;
}

std::string directoryOf(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == 0 ? "/" : path.substr(0, slash);
}

std::string nameOf(const std::string& path) {
  return path.substr(path.rfind('/') + 1);
}

bool isBelow(const std::string& path, const std::string& directory) {
  return path.size() > directory.size() && path.starts_with(directory) &&
         path[directory.size()] == '/';
}

// "new" before "cur", so that a message moved during the scan is seen in one of them.
bool visitedBefore(const std::string& a, const std::string& b) {
  const bool aIsCur = nameOf(a) == "cur";
  const bool bIsCur = nameOf(b) == "cur";
  return aIsCur != bIsCur ? bIsCur : a < b;
}

}  // namespace

MailboxScan::MailboxScan(Catalogue& catalogue, ScanSettings settings)
    : _catalogue(catalogue), _settings(std::move(settings)), _now(currentTime()) {
  for (DirectoryRow& row : catalogue.directories()) {
    _paths[row.id] = row.path;
    if (row.parent != 0) _children[row.parent].push_back(row.path);
    std::string path = row.path;
    _directories.emplace(std::move(path), std::move(row));
  }
}

bool MailboxScan::scan(const std::string& path) {
  struct stat info {};
  if (!look(path, info)) {
    const int code = errno;
    if (_directories.contains(path)) {
      noteMissing(path);
    } else {
      _settings.complain(path, platform::posixError(code, "cannot open").message);
      ++_counts.unreadable;
    }
    return false;
  }
  if (!S_ISDIR(info.st_mode)) {
    scanFile(path, info);
    return true;
  }
  scanFrom({path, 0, 0});
  return true;
}

void MailboxScan::rescan(const std::string& path, const std::string& root) {
  std::string known = path;
  while (known != root && !_directories.contains(known)) known = directoryOf(known);
  const auto found = _directories.find(known);
  if (found == _directories.end()) {
    scan(root);
    return;
  }
  const auto depth = static_cast<size_t>(std::count(known.begin() + root.size(), known.end(), '/'));
  scanFrom({known, found->second.parent, depth, true});
}

void MailboxScan::scanFrom(Place start) {
  std::vector<Place> pending{std::move(start)};
  while (!pending.empty() && !_settings.cancelled()) {
    const Place place = std::move(pending.back());
    pending.pop_back();
    scanDirectory(place, pending);
  }
}

std::vector<std::string> MailboxScan::missing() const {
  std::vector<std::string> paths;
  for (const auto& [path, row] : _directories) {
    const auto above = _directories.find(directoryOf(path));
    const bool covered = above != _directories.end() && above->second.missing;
    if (row.missing && !covered) paths.push_back(path);
  }
  return paths;
}

// --- Directories

void MailboxScan::scanDirectory(const Place& place, std::vector<Place>& pending) {
  if (!_visited.insert(place.path).second) return;
  if (excluded(place.path)) return removeTree(place.path);
  if (_settings.entering) _settings.entering(place.path);
  struct stat info {};
  const bool there = look(place.path, info);
  if (!there && errno != ENOENT && errno != ENOTDIR) {
    _settings.complain(place.path, platform::posixError(errno, "cannot look into").message);
    ++_counts.unreadable;
    return;
  }
  if (!there || !S_ISDIR(info.st_mode)) return noteMissing(place.path);
  ++_counts.directories;
  if (place.depth > cli::kMaxDirectoryDepth) {
    _settings.complain(place.path,
                       fmt::format("more than {} directories deep", cli::kMaxDirectoryDepth));
    ++_counts.unreadable;
    return;
  }
  DirectoryRow& row = directoryAt(place.path, place.parent);
  const bool unchanged = !place.alone && row.settled && !row.missing &&
                         row.modified == nanoseconds(info.st_mtim) &&
                         row.inode == static_cast<int64_t>(info.st_ino);
  std::vector<std::string> below = _children[row.id];
  if (unchanged) {
    if (row.plain) compareFiles(row);
  } else if (!listDirectory(row, info, below)) {
    return;
  }
  std::sort(below.begin(), below.end(), visitedBefore);
  below.erase(std::unique(below.begin(), below.end()), below.end());
  for (auto path = below.rbegin(); path != below.rend(); ++path) {
    if (place.alone && !isToBeEntered(*path)) continue;
    pending.push_back({*path, row.id, place.depth + 1});
  }
}

// For a directory below one that is rescanned alone: true if it is new, was missing, or has been
// replaced.
bool MailboxScan::isToBeEntered(const std::string& path) const {
  const auto known = _directories.find(path);
  struct stat info {};
  return known == _directories.end() || known->second.missing || !look(path, info) ||
         known->second.inode != static_cast<int64_t>(info.st_ino);
}

DirectoryRow& MailboxScan::directoryAt(const std::string& path, int64_t parent) {
  const auto [found, isNew] = _directories.try_emplace(path);
  DirectoryRow& row = found->second;
  if (isNew) {
    row.path = path;
    row.parent = parent;
    row.id = _catalogue.addDirectory(row);
    _paths[row.id] = path;
  } else if (row.parent != parent && parent != 0) {
    row.parent = parent;
    row.settled = false;
  }
  return row;
}

// False if its files cannot be listed; the catalogue then stays unchanged.
bool MailboxScan::listDirectory(DirectoryRow& row, const struct stat& info,
                                std::vector<std::string>& below) {
  std::optional<TLError> error;
  auto names = platform::listDirectory(row.path, &error);
  if (!names) {
    _settings.complain(row.path, error->message);
    ++_counts.unreadable;
    return false;
  }
  const auto inode = static_cast<int64_t>(info.st_ino);
  // The empty mount point of a disk that is no longer mounted.
  if (names->empty() && row.inode != inode && _catalogue.hasContent(row.id)) {
    noteMissing(row.path);
    return false;
  }
  ++_counts.entered;
  std::map<std::string, FileRow> known;
  for (FileRow& file : _catalogue.filesOf(row.id)) known.emplace(file.name, file);
  const bool isMaildir = std::find(names->begin(), names->end(), "cur") != names->end();
  row.plain = false;
  for (const std::string& name : *names) {
    const std::string path = platform::joinPath(row.path, name);
    struct stat entry {};
    struct stat target {};
    // An entry that no longer exists was moved or deleted during the scan.
    if (lstat(path.c_str(), &entry) != 0 || !look(path, target)) continue;
    if (S_ISDIR(entry.st_mode)) {
      if (!(isMaildir && name == "tmp")) below.push_back(path);
    } else if (S_ISREG(target.st_mode)) {
      row.plain = row.plain || !cli::isMaildirFile(path);
      const auto found = known.find(name);
      if (found == known.end()) {
        FileRow arrived = rowOf(target);
        arrived.directory = row.id;
        arrived.name = name;
        _arrivals.push_back(
            {row.id, path, std::move(arrived), static_cast<int64_t>(target.st_dev)});
      } else {
        compareFile(path, found->second, target);
        known.erase(found);
      }
    }
  }
  for (const auto& [name, file] : known) _departures.insert(file.id);
  row.inode = inode;
  row.modified = nanoseconds(info.st_mtim);
  row.settled = row.modified + kTimeStep < _now;
  row.missing = false;
  _catalogue.updateDirectory(row);
  return true;
}

// The directory and all directories of the catalogue below it.
std::vector<std::string> MailboxScan::treeOf(const std::string& path) const {
  std::vector<std::string> tree;
  for (auto at = _directories.lower_bound(path); at != _directories.end(); ++at) {
    if (at->first == path || isBelow(at->first, path)) {
      tree.push_back(at->first);
    } else if (!at->first.starts_with(path)) {
      break;
    }
  }
  return tree;
}

void MailboxScan::noteMissing(const std::string& path) {
  if (_settings.pruneMissing) return removeTree(path);
  for (const std::string& below : treeOf(path)) {
    DirectoryRow& row = _directories.at(below);
    row.missing = true;
    row.settled = false;
    _catalogue.updateDirectory(row);
    _missing.insert(below);
  }
}

void MailboxScan::removeTree(const std::string& path) {
  for (const std::string& below : treeOf(path)) {
    const int64_t id = _directories.at(below).id;
    for (const FileRow& file : _catalogue.filesOf(id)) _departures.insert(file.id);
    _catalogue.removeDirectory(id);
    _directories.erase(below);
  }
}

// Forgets missing directories whose content has all been found elsewhere.
void MailboxScan::settleMissing() {
  for (const std::string& path : _missing) {
    const int64_t id = _directories.at(path).id;
    if (!_catalogue.hasContent(id)) {
      _catalogue.removeDirectory(id);
      _directories.erase(path);
      continue;
    }
    if (_missing.contains(directoryOf(path))) continue;
    ++_counts.missing;
    _settings.complain(path,
                       "is not there; its mail stays in the index (--prune-missing drops it)");
  }
}

// --- Files

void MailboxScan::scanFile(const std::string& path, const struct stat& info) {
  const std::string name = nameOf(path);
  DirectoryRow& directory = directoryAt(directoryOf(path), 0);
  for (const FileRow& file : _catalogue.filesOf(directory.id)) {
    if (file.name == name) return compareFile(path, file, info);
  }
  FileRow arrived = rowOf(info);
  arrived.directory = directory.id;
  arrived.name = name;
  _arrivals.push_back({directory.id, path, std::move(arrived), static_cast<int64_t>(info.st_dev)});
}

void MailboxScan::compareFiles(const DirectoryRow& row) {
  for (const FileRow& file : _catalogue.filesOf(row.id)) {
    struct stat info {};
    const std::string path = platform::joinPath(row.path, file.name);
    if (look(path, info)) {
      compareFile(path, file, info);
    } else if (errno == ENOENT) {
      _departures.insert(file.id);
    }
  }
}

void MailboxScan::compareFile(const std::string& path, FileRow row, const struct stat& info) {
  FileRow seen = rowOf(info);
  if (sameState(seen, row)) return;
  seen.id = row.id;
  seen.directory = row.directory;
  seen.name = row.name;
  seen.kind = row.kind;
  if (row.kind == FileKind::alias && seen.inode != row.inode) {
    _departures.insert(row.id);
    _arrivals.push_back({seen.directory, path, seen, static_cast<int64_t>(info.st_dev)});
  } else if (row.kind == FileKind::alias) {
    _catalogue.updateFile(seen);
  } else if (row.kind == FileKind::maildir) {
    checkContent(path, row);
    _catalogue.updateFile(seen);
  } else {
    readPlainFile(path, seen);
  }
}

std::string MailboxScan::pathOf(const FileRow& row) const {
  const auto directory = _paths.find(row.directory);
  return platform::joinPath(directory == _paths.end() ? "/" : directory->second, row.name);
}

bool MailboxScan::excluded(const std::string& path) const {
  return std::find(_settings.excluded.begin(), _settings.excluded.end(), path) !=
             _settings.excluded.end() ||
         cli::isLinkFolder(path);
}

FileRow MailboxScan::rowOf(const struct stat& info) const {
  FileRow row;
  row.inode = static_cast<int64_t>(info.st_ino);
  row.size = static_cast<int64_t>(info.st_size);
  row.modified = nanoseconds(info.st_mtim);
  return row;
}

}  // namespace mailsync
