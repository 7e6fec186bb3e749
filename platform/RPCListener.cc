#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <list>

#include "platform/Files.h"
#include "platform/Log.h"
#include "platform/Paths.h"
#include "platform/RPCConnection.h"

namespace platform {

namespace {

constexpr int kBacklog = 64;

const Log& log() {
  static const Log handle(kSubsystem, "RPC");
  return handle;
}

// Of the whole process, over all listeners.
std::atomic<size_t> openConnections{0};

// The socket that systemd handed over under `name`, -1 for none.
int activatedSocket(const std::string& name) {
  char** names = nullptr;
  const int count = sd_listen_fds_with_names(0, &names);
  int found = -1;
  for (int i = 0; i < count; ++i) {
    if (found < 0 && name == names[i]) found = SD_LISTEN_FDS_START + i;
    free(names[i]);
  }
  free(names);
  return found;
}

bool makeAddress(const std::string& path, sockaddr_un* address, TLErrorOut error) {
  *address = {};
  address->sun_family = AF_UNIX;
  if (path.size() >= sizeof address->sun_path) {
    setError(error, posixError(ENAMETOOLONG, path));
    return false;
  }
  std::copy(path.begin(), path.end(), address->sun_path);
  return true;
}

bool someoneListens(const sockaddr_un& address) {
  const int probe = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const bool connected =
      connect(probe, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
  close(probe);
  return connected;
}

int listenAt(const std::string& path, TLErrorOut error) {
  sockaddr_un address;
  if (!makeAddress(path, &address, error)) return -1;
  if (someoneListens(address)) {
    setError(error, {kPOSIXErrorDomain, EADDRINUSE, path + " is served by a running daemon"});
    return -1;
  }
  unlink(path.c_str());
  const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  const mode_t previous = umask(0177);
  const bool bound =
      descriptor >= 0 &&
      bind(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
  const int code = errno;
  umask(previous);
  if (!bound || listen(descriptor, kBacklog) != 0) {
    setError(error, posixError(bound ? errno : code, path));
    if (descriptor >= 0) close(descriptor);
    return -1;
  }
  return descriptor;
}

class SocketListener : public RPCListener {
 public:
  SocketListener(RunLoop& loop, std::string directory, std::string serviceName)
      : _loop(loop), _directory(std::move(directory)), _serviceName(std::move(serviceName)) {}
  ~SocketListener() override { invalidate(0); }

  const std::string& serviceName() const override { return _serviceName; }
  void setDelegate(Delegate delegate) override { _delegate = std::move(delegate); }

  bool resume(TLErrorOut error) override {
    _descriptor = activatedSocket(_serviceName);
    if (_descriptor < 0) {
      if (!createDirectories(_directory, error)) return false;
      _path = joinPath(_directory, _serviceName);
      _descriptor = listenAt(_path, error);
    } else {
      fcntl(_descriptor, F_SETFL, fcntl(_descriptor, F_GETFL) | O_NONBLOCK);
    }
    if (_descriptor < 0) return false;
    _spare = open("/dev/null", O_RDONLY | O_CLOEXEC);
    _source = _loop.addReadable(_descriptor, [this] { acceptOne(); });
    return true;
  }

  void invalidate(uint64_t milliseconds) override {
    _source.reset();
    if (_descriptor >= 0) {
      close(std::exchange(_descriptor, -1));
      close(std::exchange(_spare, -1));
      if (!_path.empty()) unlink(_path.c_str());
    }
    for (const auto& connection : _connections) connection->finish(milliseconds);
    openConnections -= _connections.size();
    _connections.clear();
    *_alive = false;
  }

 private:
  void acceptOne() {
    const int descriptor = accept4(_descriptor, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
    if (descriptor >= 0) {
      serve(descriptor);
    } else if (errno == EMFILE || errno == ENFILE) {
      // Out of descriptors: the spare one lets the peer be refused rather than wait for ever.
      log().error("Refusing connection on {}: out of file descriptors", _serviceName);
      close(_spare);
      close(accept4(_descriptor, nullptr, nullptr, SOCK_CLOEXEC));
      _spare = open("/dev/null", O_RDONLY | O_CLOEXEC);
    }
  }

  void serve(int descriptor) {
    ucred peer{};
    socklen_t size = sizeof peer;
    getsockopt(descriptor, SOL_SOCKET, SO_PEERCRED, &peer, &size);
    auto connection = std::make_unique<RPCServerConnection>(
        descriptor, _serviceName, fmt::format("pid {} uid {}", peer.pid, peer.uid));
    if (peer.uid != geteuid() && peer.uid != 0) {
      log().error("Refusing connection {}: foreign user", connection->description());
    } else if (openConnections >= kMaximumConnections) {
      log().error("Refusing connection {}: {} are open", connection->description(),
                  kMaximumConnections);
    } else if (_delegate(*this, *connection)) {
      ++openConnections;
      _connections.push_back(std::move(connection));
      _connections.back()->start(
          [this, &loop = _loop, alive = _alive, which = _connections.back().get()] {
            loop.post([this, alive, which] {
              if (*alive) reap(which);
            });
          });
    }
  }

  void reap(const RPCServerConnection* which) {
    openConnections -= _connections.remove_if(
        [which](const auto& connection) { return connection.get() == which; });
  }

  RunLoop& _loop;
  const std::string _directory;
  const std::string _serviceName;
  Delegate _delegate;
  std::string _path;  // of the socket made here, empty for one handed over
  int _descriptor = -1;
  int _spare = -1;
  std::unique_ptr<RunLoop::Source> _source;
  std::list<std::unique_ptr<RPCServerConnection>> _connections;
  // Read and written on the loop's thread only; what was posted there may run after this has gone.
  const std::shared_ptr<bool> _alive = std::make_shared<bool>(true);
};

}  // namespace

std::unique_ptr<RPCListener> makeRPCListener(RunLoop& loop, std::string directory,
                                             std::string serviceName) {
  return std::make_unique<SocketListener>(loop, std::move(directory), std::move(serviceName));
}

}  // namespace platform
