#include "sync/DirectoryWatch.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <array>
#include <cerrno>

namespace mailsync {

namespace {

constexpr uint32_t kMask = IN_CREATE | IN_CLOSE_WRITE | IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE |
                           IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR | IN_EXCL_UNLINK;

constexpr size_t kEventBytes = 64 * 1024;  // read at a time

}  // namespace

DirectoryWatch::DirectoryWatch() : _inotify(inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {}

ChangeSource::Result DirectoryWatch::watch(const std::string& directory) {
  const int watch = inotify_add_watch(_inotify.get(), directory.c_str(), kMask);
  if (watch < 0) {
    return errno == ENOENT || errno == ENOTDIR ? Result::absent : Result::refused;
  }
  const auto before = _watches.find(directory);
  if (before != _watches.end() && before->second != watch) drop(before->second);
  const auto known = _directories.find(watch);
  if (known != _directories.end() && known->second != directory) _watches.erase(known->second);
  _directories[watch] = directory;
  _watches[directory] = watch;
  return Result::watched;
}

void DirectoryWatch::keepOnly(const std::set<std::string>& directories) {
  std::vector<int> others;
  for (const auto& [directory, watch] : _watches) {
    if (!directories.contains(directory)) others.push_back(watch);
  }
  for (const int watch : others) drop(watch);
}

void DirectoryWatch::drop(int watch) {
  inotify_rm_watch(_inotify.get(), watch);
  const auto known = _directories.find(watch);
  if (known == _directories.end()) return;
  _watches.erase(known->second);
  _directories.erase(known);
}

std::vector<Change> DirectoryWatch::read() {
  std::vector<Change> changes;
  alignas(inotify_event) std::array<char, kEventBytes> bytes;
  ssize_t size = 0;
  while ((size = ::read(_inotify.get(), bytes.data(), bytes.size())) > 0) {
    for (ssize_t at = 0; at < size;) {
      const auto& event = *reinterpret_cast<const inotify_event*>(bytes.data() + at);
      take(event, changes);
      at += static_cast<ssize_t>(sizeof event + event.len);
    }
  }
  return changes;
}

void DirectoryWatch::take(const inotify_event& event, std::vector<Change>& changes) {
  if ((event.mask & IN_Q_OVERFLOW) != 0) {
    changes.push_back({Change::Kind::lost, "", "", false});
    return;
  }
  const auto known = _directories.find(event.wd);
  if (known == _directories.end()) return;  // the event of a watch that has ended
  const std::string directory = known->second;
  const std::string name = event.len > 0 ? event.name : "";
  const bool self = (event.mask & (IN_DELETE_SELF | IN_MOVE_SELF | IN_UNMOUNT | IN_IGNORED)) != 0;
  if ((event.mask & IN_IGNORED) != 0) drop(event.wd);
  changes.push_back({self ? Change::Kind::self : Change::Kind::entry, directory, name,
                     (event.mask & IN_ISDIR) != 0});
}

}  // namespace mailsync
