#pragma once

#include <chrono>
#include <functional>
#include <string>

#include "platform/Mutex.h"
#include "platform/TLError.h"
#include "rpc/Names.h"

struct sd_bus;
struct sd_bus_message;

namespace rpc {

// Error domains of the client end. Errors from the daemon keep their own.
//
// No connection, or it was lost before the reply: the daemon is not running or has just ended.
inline constexpr const char* kUnreachableDomain = "com.quill.tallow.client.Unreachable";
// Errors of the protocol itself, such as an invalid argument or a timeout.
inline constexpr const char* kProtocolDomain = "org.freedesktop.DBus";
// The call cannot be sent.
inline constexpr const char* kClientDomain = "com.quill.tallow.client";

[[nodiscard]] inline bool isUnreachable(const std::optional<TLError>& error) {
  return error.has_value() && error->domain == kUnreachableDomain;
}

// Timeouts of calls. Indexing waits for all batches queued before it; a vacuum rewrites the whole
// index.
inline constexpr std::chrono::seconds kShortTimeout = std::chrono::minutes(2);
inline constexpr std::chrono::seconds kLongTimeout = std::chrono::hours(6);

// How long to wait for a daemon that is not running.
using Patience = std::chrono::milliseconds;

// $RUNTIME_DIRECTORY, else tallow in $XDG_RUNTIME_DIR (for root only if it exists), else
// /run/tallow.
[[nodiscard]] std::string defaultRuntimeDirectory();

// The connection to one service of the daemon, over the socket of that name in the runtime
// directory. The first call connects, and so does the first call after the connection was lost. A
// call waits up to `patience` for the socket to accept connections, so a client may start before
// the daemon.
//
// Threads: one at a time per channel, except `interrupt`; channels are independent.
class Channel {
 public:
  Channel(const std::string& runtimeDirectory, std::string serviceName, Patience patience);
  ~Channel();
  Channel(const Channel&) = delete;
  Channel& operator=(const Channel&) = delete;

  // Appends the arguments to the call, or reads the results from the reply. A negative errno value
  // is a failure.
  using Body = std::function<int(sd_bus_message*)>;

  // Calls `member` and waits for the reply. False with an error if there is none. A call whose
  // connection is lost within a second is made again, up to twice.
  bool call(const char* member, std::chrono::seconds timeout, const Body& append, const Body& read,
            TLErrorOut error) {
    return call(_serviceName.c_str(), member, timeout, append, read, error);
  }
  // Calls a member of another interface of the service's object.
  bool call(const char* interface, const char* member, std::chrono::seconds timeout,
            const Body& append, const Body& read, TLErrorOut error);

  // From any thread: ends the current call and prevents later ones; all fail as unreachable.
  void interrupt() TL_EXCLUDES(_mutex);

 private:
  bool callOnce(const char* interface, const char* member, std::chrono::seconds timeout,
                const Body& append, const Body& read, TLErrorOut error);
  bool connect(TLErrorOut error);
  void disconnect();
  bool adopt(int descriptor) TL_EXCLUDES(_mutex);
  [[nodiscard]] TLError unreachable(int errnoValue) const;

  const std::string _runtimeDirectory;
  const std::string _socketPath;
  const std::string _serviceName;
  const std::string _objectPath;
  const Patience _patience;
  sd_bus* _bus = nullptr;
  platform::Mutex _mutex;
  int _descriptor TL_GUARDED_BY(_mutex) = -1;  // of the connection, to be shut down
  bool _interrupted TL_GUARDED_BY(_mutex) = false;
};

}  // namespace rpc
