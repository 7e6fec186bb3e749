#include "platform/DeviceVault.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <sstream>
#include <thread>
#include <utility>

#include "platform/Files.h"
#include "platform/Mutex.h"
#include "platform/Paths.h"

namespace platform {

namespace {

constexpr uint32_t kUnlocked = 0;
constexpr uint32_t kLocked = 1;
constexpr size_t kLongestStatus = 64;  // bytes; more is garbled

struct Status {
  uint32_t state;
  bool unlockedSinceBoot;
};

Status readStatus(const std::string& path) {
  if (!fileExists(path)) return {kUnlocked, true};
  const Status garbled{kLocked, false};
  const auto text = readFile(path, kLongestStatus, nullptr);
  if (!text) return garbled;
  std::istringstream words(*text);
  std::string state, unlocked, rest;
  words >> state >> unlocked;
  const bool digits = !state.empty() && state.size() <= 9 &&
                      state.find_first_not_of("0123456789") == std::string::npos;
  if (!digits || (unlocked != "0" && unlocked != "1") || words >> rest) return garbled;
  return {static_cast<uint32_t>(std::stoul(state)), unlocked == "1"};
}

// One registration at a time: the monitor is the only user.
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
    _inotify = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
    if (_inotify < 0) return static_cast<uint32_t>(errno);
    const size_t slash = _path.rfind('/');
    const std::string directory = slash == std::string::npos ? "." : _path.substr(0, slash);
    if (inotify_add_watch(_inotify, directory.c_str(),
                          IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE) < 0) {
      const int code = errno;
      close(_inotify);
      return static_cast<uint32_t>(code);
    }
    _end = eventfd(0, EFD_CLOEXEC);
    _watcher = std::thread([this, name = _path.substr(slash + 1), &queue,
                            call = std::move(handler)] { watch(name, queue, call); });
    *token = _inotify;
    return 0;
  }

  void cancel(int32_t) override { endWatch(); }

 private:
  void watch(const std::string& name, SerialQueue& queue,
             const std::function<void()>& handler) const {
    setThreadName("tallow.vault");
    std::array<pollfd, 2> descriptors{{{_inotify, POLLIN, 0}, {_end, POLLIN, 0}}};
    alignas(inotify_event) std::array<char, 4096> buffer;
    for (;;) {
      if (poll(descriptors.data(), descriptors.size(), -1) < 0 && errno != EINTR) return;
      if (descriptors[1].revents != 0) return;
      const ssize_t size = read(_inotify, buffer.data(), buffer.size());
      for (ssize_t at = 0; at < size;) {
        const auto* event = reinterpret_cast<const inotify_event*>(buffer.data() + at);
        if (event->len != 0 && name == event->name) queue.submit(handler);
        at += static_cast<ssize_t>(sizeof(inotify_event) + event->len);
      }
    }
  }

  void endWatch() {
    MutexLock lock(_mutex);
    if (!_watcher.joinable()) return;
    const uint64_t one = 1;
    [[maybe_unused]] const ssize_t n = write(_end, &one, sizeof one);
    _watcher.join();
    close(_inotify);
    close(_end);
  }

  const std::string _path;
  Mutex _mutex;
  std::thread _watcher TL_GUARDED_BY(_mutex);
  int _inotify = -1;  // fixed while the watcher runs
  int _end = -1;
};

}  // namespace

std::unique_ptr<DeviceVault> makeFileDeviceVault(std::string path) {
  return std::make_unique<FileDeviceVault>(std::move(path));
}

DeviceVault& deviceVault() {
  static const auto vault = makeFileDeviceVault(lockStatusPath());
  return *vault;
}

}  // namespace platform
