#include "platform/DeviceVault.h"

#include <fmt/format.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <sstream>
#include <system_error>
#include <thread>
#include <utility>

#include "platform/FileDescriptor.h"
#include "platform/Files.h"
#include "platform/Mutex.h"
#include "platform/Paths.h"

namespace platform {

namespace {

constexpr uint32_t kUnlocked = 0;
constexpr uint32_t kLocked = 1;
constexpr size_t kMaxStatusBytes = 64;  // bytes; a longer file is invalid

struct Status {
  uint32_t state;
  bool unlockedSinceBoot;
};

Status readStatus(const std::string& path) {
  if (!fileExists(path)) return {kUnlocked, true};
  const Status garbled{kLocked, false};
  const auto text = readFile(path, kMaxStatusBytes, nullptr);
  if (!text) return garbled;
  std::istringstream words(*text);
  std::string state, unlocked, rest;
  words >> state >> unlocked;
  const bool digits = !state.empty() && state.size() <= 9 &&
                      state.find_first_not_of("0123456789") == std::string::npos;
  if (!digits || (unlocked != "0" && unlocked != "1") || words >> rest) return garbled;
  return {static_cast<uint32_t>(std::stoul(state)), unlocked == "1"};
}

// Only one registration at a time, because the lock monitor is the only user.
class FileDeviceVault : public DeviceVault {
 public:
  explicit FileDeviceVault(std::string path) : _path(std::move(path)) {}
  ~FileDeviceVault() override { endWatch(); }

  uint32_t DVLGetDeviceLockState(int) override { return readStatus(_path).state; }
  int DVLDeviceUnlockedSinceBoot() override { return readStatus(_path).unlockedSinceBoot ? 1 : 0; }

  uint32_t registerNotification(const std::string&, SerialQueue& queue,
                                std::function<void()> handler, int32_t* token) override {
    MutexLock lock(_mutex);
    if (_watcher.joinable()) return EBUSY;
    FileDescriptor inotify(inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
    if (inotify.get() < 0) return static_cast<uint32_t>(errno);
    if (!addWatch(inotify.get())) return static_cast<uint32_t>(errno);
    FileDescriptor end(eventfd(0, EFD_CLOEXEC));
    if (end.get() < 0) return static_cast<uint32_t>(errno);
    try {
      _watcher = std::thread([this, inotify = inotify.get(), end = end.get(), &queue,
                              call = std::move(handler)] { watch(inotify, end, queue, call); });
    } catch (const std::system_error&) {
      return EAGAIN;
    }
    *token = inotify.get();
    _inotify = std::move(inotify);
    _end = std::move(end);
    return 0;
  }

  void cancel(int32_t) override { endWatch(); }

 private:
  static constexpr int kLookAgainMilliseconds = 1000;

  [[nodiscard]] bool addWatch(int inotify) const {
    const size_t slash = _path.rfind('/');
    const std::string directory = slash == std::string::npos ? "." : _path.substr(0, slash);
    return inotify_add_watch(inotify, directory.c_str(),
                             IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE |
                                 IN_MOVE_SELF | IN_ONLYDIR) >= 0;
  }

  // The directory may be replaced by another of the same name. While it is missing, polls for it
  // once a second.
  void watch(int inotify, int end, SerialQueue& queue, const std::function<void()>& handler) const {
    setThreadName("tallow.vault");
    std::array<pollfd, 2> descriptors{{{inotify, POLLIN, 0}, {end, POLLIN, 0}}};
    bool watching = true;
    for (;;) {
      const int timeout = watching ? -1 : kLookAgainMilliseconds;
      if (poll(descriptors.data(), descriptors.size(), timeout) < 0 && errno != EINTR) return;
      if (descriptors[1].revents != 0) return;
      const Changes changes = readChanges(inotify);
      if (changes.ofDirectory) watching = false;
      const bool found = !watching && addWatch(inotify);
      if (found) watching = true;
      if (changes.ofStatus || changes.ofDirectory || found) queue.submit(handler);
    }
  }

  struct Changes {
    bool ofStatus = false;
    bool ofDirectory = false;  // the path no longer names this directory
  };

  [[nodiscard]] Changes readChanges(int inotify) const {
    Changes changes;
    const std::string name = _path.substr(_path.rfind('/') + 1);
    alignas(inotify_event) std::array<char, 4096> buffer;
    const ssize_t size = read(inotify, buffer.data(), buffer.size());
    for (ssize_t at = 0; at < size;) {
      const auto* event = reinterpret_cast<const inotify_event*>(buffer.data() + at);
      if (event->len != 0 && name == event->name) changes.ofStatus = true;
      if ((event->mask & IN_Q_OVERFLOW) != 0) changes.ofStatus = true;
      if ((event->mask & IN_MOVE_SELF) != 0) inotify_rm_watch(inotify, event->wd);
      if ((event->mask & (IN_MOVE_SELF | IN_IGNORED)) != 0) changes.ofDirectory = true;
      at += static_cast<ssize_t>(sizeof(inotify_event) + event->len);
    }
    return changes;
  }

  void endWatch() {
    MutexLock lock(_mutex);
    if (!_watcher.joinable()) return;
    const uint64_t one = 1;
    [[maybe_unused]] const ssize_t n = write(_end.get(), &one, sizeof one);
    _watcher.join();
    _inotify.reset();
    _end.reset();
  }

  const std::string _path;
  Mutex _mutex;
  std::thread _watcher TL_GUARDED_BY(_mutex);
  FileDescriptor _inotify TL_GUARDED_BY(_mutex);
  FileDescriptor _end TL_GUARDED_BY(_mutex);
};

}  // namespace

std::unique_ptr<DeviceVault> makeFileDeviceVault(std::string path) {
  return std::make_unique<FileDeviceVault>(std::move(path));
}

bool writeLockStatus(const std::string& path, bool locked, TLErrorOut error) {
  return writeFileAtomically(path, fmt::format("{} 1\n", locked ? kLocked : kUnlocked), error);
}

DeviceVault& deviceVault() {
  static const auto vault = makeFileDeviceVault(lockStatusPath());
  return *vault;
}

}  // namespace platform
