#include "rpc/Channel.h"

#include <poll.h>
#include <sys/inotify.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <memory>
#include <optional>
#include <utility>

#include "platform/Files.h"
#include "platform/Paths.h"
#include "rpc/Names.h"

namespace rpc {

namespace {

// Maximum pause between two attempts: the directory may not exist yet, and the socket may exist
// before the daemon listens.
constexpr std::chrono::milliseconds kWaitStep(50);

// The daemon closes an idle connection to make room for another, and may do so just as a call is
// sent. Such a call is made again, which does no harm: no call has another effect the second time.
constexpr int kMaxAttempts = 3;
constexpr std::chrono::seconds kLostAtOnce(1);

struct MessageUnref {
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
using Message = std::unique_ptr<sd_bus_message, MessageUnref>;

// A connected file descriptor, or a negative errno value.
int connectSocket(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) return -ENAMETOOLONG;
  path.copy(address.sun_path, path.size());
  const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (descriptor < 0) return -errno;
  if (::connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) {
    return descriptor;
  }
  const int result = -errno;
  close(descriptor);
  return result;
}

// Like connectSocket, but tries again whenever the directory changes, for at most `patience`.
int connectWithin(Patience patience, const std::string& directory, const std::string& path) {
  int descriptor = connectSocket(path);
  if (descriptor >= 0 || patience.count() == 0) return descriptor;
  const auto end = std::chrono::steady_clock::now() + patience;
  const int watch = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
  inotify_add_watch(watch, directory.c_str(), IN_CREATE | IN_MOVED_TO);
  while (descriptor < 0 && std::chrono::steady_clock::now() < end) {
    pollfd changed{watch, POLLIN, 0};
    char events[4096];
    if (poll(&changed, 1, static_cast<int>(kWaitStep.count())) > 0) {
      [[maybe_unused]] const ssize_t ignored = read(watch, events, sizeof events);
    }
    descriptor = connectSocket(path);
  }
  close(watch);
  return descriptor;
}

// The error in an error reply. The daemon's own errors have message, domain and code in the body;
// the message is also that of the D-Bus error.
TLError errorOf(sd_bus_message* reply) {
  const sd_bus_error* const error = sd_bus_message_get_error(reply);
  const char* message = nullptr;
  const char* domain = nullptr;
  int32_t code = 0;
  if (sd_bus_error_has_name(error, kErrorName) && sd_bus_message_rewind(reply, 1) >= 0 &&
      sd_bus_message_read(reply, "ssi", &message, &domain, &code) > 0) {
    return {domain, code, message};
  }
  const char* text = error->message == nullptr ? "call failed" : error->message;
  return {kProtocolDomain, sd_bus_error_get_errno(error),
          fmt::format("{} ({})", text, error->name)};
}

int onReply(sd_bus_message* reply, void* data, sd_bus_error*) {
  *static_cast<Message*>(data) = Message(sd_bus_message_ref(reply));
  return 1;
}

// Sends the request and serves the connection until the reply arrives. The library creates an error
// reply on a timeout or a disconnect. Negative if there is no reply.
int exchange(sd_bus* bus, sd_bus_message* request, std::chrono::microseconds timeout,
             Message& reply) {
  sd_bus_slot* slot = nullptr;
  int result = sd_bus_call_async(bus, &slot, request, onReply, &reply,
                                 static_cast<uint64_t>(timeout.count()));
  while (result >= 0 && reply == nullptr) {
    result = sd_bus_process(bus, nullptr);
    if (result == 0) result = sd_bus_wait(bus, UINT64_MAX);
    if (result == -EINTR) result = 0;
  }
  sd_bus_slot_unref(slot);
  return reply != nullptr ? 0 : result;
}

// Whether the daemon has closed the connection, for example to make room for another.
bool hungUp(sd_bus* bus) {
  pollfd socket{sd_bus_get_fd(bus), POLLRDHUP, 0};
  return poll(&socket, 1, 0) > 0;
}

}  // namespace

std::string defaultRuntimeDirectory() {
  // Root may run its own daemon in addition to the system's.
  const char* const own = std::getenv("XDG_RUNTIME_DIR");
  const char* const given = std::getenv("RUNTIME_DIRECTORY");
  if (geteuid() == 0 && own != nullptr && *own == '/' && (given == nullptr || *given == '\0')) {
    std::string directory = platform::joinPath(own, "tallow");
    if (platform::fileExists(directory)) return directory;
  }
  return platform::runtimeDirectory();
}

Channel::Channel(const std::string& runtimeDirectory, std::string serviceName, Patience patience)
    : _runtimeDirectory(runtimeDirectory),
      _socketPath(platform::joinPath(runtimeDirectory, serviceName)),
      _serviceName(std::move(serviceName)),
      _objectPath(objectPath(_serviceName)),
      _patience(patience) {}

Channel::~Channel() {
  disconnect();
}

TLError Channel::unreachable(int errnoValue) const {
  return {kUnreachableDomain, errnoValue,
          platform::posixError(errnoValue, "daemon not reachable at " + _socketPath).message};
}

bool Channel::connect(TLErrorOut error) {
  if (_bus != nullptr && hungUp(_bus)) disconnect();
  if (_bus != nullptr) return true;
  const int descriptor = connectWithin(_patience, _runtimeDirectory, _socketPath);
  int result = descriptor;
  if (result >= 0) {
    result = adopt(descriptor) ? sd_bus_new(&_bus) : -ECANCELED;
    if (result >= 0) result = sd_bus_set_fd(_bus, descriptor, descriptor);
    if (result < 0) {
      adopt(-1);
      close(descriptor);
    }
  }
  if (result >= 0) result = sd_bus_negotiate_fds(_bus, 0);
  if (result >= 0) result = sd_bus_start(_bus);
  if (result >= 0) return true;
  platform::setError(error, unreachable(-result));
  disconnect();
  return false;
}

bool Channel::adopt(int descriptor) {
  const platform::MutexLock lock(_mutex);
  _descriptor = descriptor;
  return !_interrupted;
}

void Channel::interrupt() {
  const platform::MutexLock lock(_mutex);
  _interrupted = true;
  if (_descriptor >= 0) shutdown(_descriptor, SHUT_RDWR);
}

void Channel::disconnect() {
  adopt(-1);
  if (_bus != nullptr) sd_bus_close(_bus);
  _bus = sd_bus_unref(_bus);
}

bool Channel::call(const char* interface, const char* member, std::chrono::seconds timeout,
                   const Body& append, const Body& read, TLErrorOut error) {
  for (int attempt = 1;; ++attempt) {
    const auto start = std::chrono::steady_clock::now();
    std::optional<TLError> failure;
    if (callOnce(interface, member, timeout, append, read, &failure)) return true;
    const bool lost = failure->domain == kUnreachableDomain &&
                      (failure->code == ECONNRESET || failure->code == EPIPE) &&
                      std::chrono::steady_clock::now() - start < kLostAtOnce;
    if (lost && attempt < kMaxAttempts) continue;
    platform::setError(error, std::move(*failure));
    return false;
  }
}

bool Channel::callOnce(const char* interface, const char* member, std::chrono::seconds timeout,
                       const Body& append, const Body& read, TLErrorOut error) {
  if (!connect(error)) return false;
  sd_bus_message* raw = nullptr;
  int result =
      sd_bus_message_new_method_call(_bus, &raw, nullptr, _objectPath.c_str(), interface, member);
  const Message request(raw);
  if (result >= 0) result = append(request.get());
  if (result < 0) {
    platform::setError(error, {kClientDomain, -result, fmt::format("cannot build {}", member)});
    return false;
  }

  Message reply;
  result = exchange(_bus, request.get(), timeout, reply);
  const bool answered =
      reply != nullptr && sd_bus_message_is_method_error(reply.get(), nullptr) == 0;
  if (answered) {
    result = read(reply.get());
    if (result >= 0) return true;
    platform::setError(
        error, {kProtocolDomain, -result, fmt::format("the reply to {} is malformed", member)});
  } else if (reply == nullptr || sd_bus_is_open(_bus) <= 0) {
    platform::setError(error, unreachable(result < 0 ? -result : ECONNRESET));
    disconnect();
  } else {
    platform::setError(error, errorOf(reply.get()));
  }
  return false;
}

}  // namespace rpc
