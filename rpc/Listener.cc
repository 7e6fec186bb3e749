#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <list>
#include <tuple>
#include <vector>

#include "platform/Files.h"
#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/Paths.h"
#include "rpc/ServerConnection.h"

namespace rpc {

namespace {

constexpr int kBacklog = 64;
constexpr size_t kMaxNewcomers =
    kMaxConnections / 4;  // connections without a call, before they give way
// Pause before retrying to accept a peer that cannot even be refused.
constexpr useconds_t kNoDescriptorsMicroseconds = 10000;

const platform::Log& log() {
  static const platform::Log handle(platform::kSubsystem, "RPC");
  return handle;
}

// All connections of the process, over all listeners, oldest first. Any thread; every entry is
// alive.
class ConnectionTable {
 public:
  // False when all places are taken by connections with calls in flight.
  bool enter(ServerConnection* connection) TL_EXCLUDES(_mutex) {
    platform::MutexLock lock(_mutex);
    // Evicted connections remain for a moment.
    if (_connections.size() >= 2 * kMaxConnections) return false;
    const auto staying = std::count_if(_connections.begin(), _connections.end(),
                                       [](const auto* one) { return !one->evicted(); });
    if (static_cast<size_t>(staying) >= kMaxConnections && !evictOne()) return false;
    _connections.push_back(connection);
    return true;
  }

  void leave(const ServerConnection* connection) TL_EXCLUDES(_mutex) {
    platform::MutexLock lock(_mutex);
    std::erase(_connections, connection);
  }

 private:
  // A connection whose peer has hung up leaves by itself, and so makes room without harm. Next come
  // connections that have never made a call, if they are many, so that silent peers cannot push out
  // working ones; then idle ones; then new ones, which are about to call. Among equals, the one
  // that has been idle longest.
  bool evictOne() TL_REQUIRES(_mutex) {
    using Rank = std::tuple<int, uint64_t>;  // the lowest is evicted
    const bool manySilent = silent() > kMaxNewcomers;
    ServerConnection* chosen = nullptr;
    Rank lowest;
    for (ServerConnection* connection : _connections) {
      const auto idle = connection->idleness();
      if (connection->evicted() || (idle.calling && !idle.gone)) continue;
      const int order = idle.gone ? 0 : idle.called ? 2 : manySilent ? 1 : 3;
      const Rank rank(order, idle.since);
      if (chosen != nullptr && rank >= lowest) continue;
      chosen = connection;
      lowest = rank;
    }
    if (chosen != nullptr) chosen->evict();
    return chosen != nullptr;
  }

  // The number of connections that have not made a call.
  [[nodiscard]] size_t silent() const TL_REQUIRES(_mutex) {
    return static_cast<size_t>(
        std::count_if(_connections.begin(), _connections.end(),
                      [](const auto* one) { return !one->evicted() && !one->idleness().called; }));
  }

  platform::Mutex _mutex;
  std::vector<ServerConnection*> _connections TL_GUARDED_BY(_mutex);
};

ConnectionTable& connectionTable() {
  static auto* instance = new ConnectionTable;
  return *instance;
}

// The socket that systemd passed under `name`, -1 for none.
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
    platform::setError(error, platform::posixError(ENAMETOOLONG, path));
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
    platform::setError(error,
                       {kPOSIXErrorDomain, EADDRINUSE, path + " is served by a running daemon"});
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
    platform::setError(error, platform::posixError(bound ? errno : code, path));
    if (descriptor >= 0) close(descriptor);
    return -1;
  }
  return descriptor;
}

class SocketListener : public Listener {
 public:
  SocketListener(platform::RunLoop& loop, std::string directory, std::string serviceName)
      : _loop(loop), _directory(std::move(directory)), _serviceName(std::move(serviceName)) {}
  ~SocketListener() override { invalidate(0); }

  const std::string& serviceName() const override { return _serviceName; }
  void setDelegate(Delegate delegate) override { _delegate = std::move(delegate); }

  bool resume(TLErrorOut error) override {
    _descriptor = activatedSocket(_serviceName);
    if (_descriptor < 0) {
      if (!platform::createDirectories(_directory, error)) return false;
      _path = platform::joinPath(_directory, _serviceName);
      _descriptor = listenAt(_path, error);
    } else {
      fcntl(_descriptor, F_SETFL, fcntl(_descriptor, F_GETFL) | O_NONBLOCK);
    }
    if (_descriptor < 0) return false;
    _spare = open("/dev/null", O_RDONLY | O_CLOEXEC);
    _source = _loop.addReadable(_descriptor, [this] { acceptOne(); });
    if (_source == nullptr) platform::setError(error, platform::posixError(ENOMEM, _serviceName));
    return _source != nullptr;
  }

  bool activated() const override { return _descriptor >= 0 && _path.empty(); }

  void setConnectionsHandler(std::function<void(size_t)> handler) override {
    _connectionsHandler = std::move(handler);
  }

  void pause() override { _source.reset(); }

  void invalidate(uint64_t milliseconds) override {
    pause();
    if (_descriptor >= 0) {
      close(std::exchange(_descriptor, -1));
      close(std::exchange(_spare, -1));
      if (!_path.empty()) unlink(_path.c_str());
    }
    for (const auto& connection : _connections) connection->finish(milliseconds);
    for (const auto& connection : _connections) connectionTable().leave(connection.get());
    _connections.clear();
    *_alive = false;
  }

 private:
  void acceptOne() {
    const int descriptor = accept4(_descriptor, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
    if (descriptor >= 0) {
      serve(descriptor);
    } else if (errno == EMFILE || errno == ENFILE) {
      // Out of descriptors: closes the spare one to accept and refuse the peer, which would
      // otherwise wait forever.
      log().error("Refusing connection on {}: out of file descriptors", _serviceName);
      if (_spare < 0) usleep(kNoDescriptorsMicroseconds);
      close(_spare);
      close(accept4(_descriptor, nullptr, nullptr, SOCK_CLOEXEC));
      _spare = open("/dev/null", O_RDONLY | O_CLOEXEC);
    }
  }

  void serve(int descriptor) {
    ucred peer{};
    socklen_t size = sizeof peer;
    getsockopt(descriptor, SOL_SOCKET, SO_PEERCRED, &peer, &size);
    auto connection = std::make_unique<ServerConnection>(
        descriptor, _serviceName, fmt::format("pid {} uid {}", peer.pid, peer.uid));
    if (peer.uid != geteuid() && peer.uid != 0) {
      log().error("Refusing connection {}: foreign user", connection->description());
    } else if (!_delegate(*this, *connection)) {
      return;
    } else if (!connectionTable().enter(connection.get())) {
      log().error("Refusing connection {}: {} are open", connection->description(),
                  kMaxConnections);
    } else {
      begin(std::move(connection));
    }
  }

  void begin(std::unique_ptr<ServerConnection> connection) {
    ServerConnection* const which = connection.get();
    const bool started = connection->start([this, &loop = _loop, alive = _alive, which] {
      loop.post([this, alive, which] {
        if (*alive) reap(which);
      });
    });
    if (started) {
      _connections.push_back(std::move(connection));
      _connectionsHandler(_connections.size());
    } else {
      log().error("Refusing connection {}: no thread or no descriptors", which->description());
      connectionTable().leave(which);
    }
  }

  void reap(const ServerConnection* which) {
    connectionTable().leave(which);
    _connections.remove_if([which](const auto& connection) { return connection.get() == which; });
    _connectionsHandler(_connections.size());
  }

  platform::RunLoop& _loop;
  const std::string _directory;
  const std::string _serviceName;
  Delegate _delegate;
  std::function<void(size_t)> _connectionsHandler = [](size_t) {};
  std::string _path;  // of the socket created here; empty for one passed by systemd
  int _descriptor = -1;
  int _spare = -1;
  std::unique_ptr<platform::RunLoop::Source> _source;
  std::list<std::unique_ptr<ServerConnection>> _connections;
  // Accessed on the loop's thread only; posted items may run after this object is gone.
  const std::shared_ptr<bool> _alive = std::make_shared<bool>(true);
};

}  // namespace

std::unique_ptr<Listener> makeListener(platform::RunLoop& loop, std::string directory,
                                       std::string serviceName) {
  return std::make_unique<SocketListener>(loop, std::move(directory), std::move(serviceName));
}

}  // namespace rpc
