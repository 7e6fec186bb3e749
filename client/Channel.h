#pragma once

#include <chrono>
#include <functional>
#include <string>

#include "platform/TLError.h"

struct sd_bus;
struct sd_bus_message;

// Everything that a client program needs to talk to the daemon.
namespace client {

// Error domains of this library. Errors that the daemon answers with keep their own.
//
// No connection, or it ended before the reply: the daemon is not running, or just went away.
inline constexpr const char* kUnreachableDomain = "com.quill.tallow.client.Unreachable";
// What the protocol itself reports, such as a refused argument or a call without an answer in time.
inline constexpr const char* kProtocolDomain = "org.freedesktop.DBus";
// A call that cannot be sent as it is.
inline constexpr const char* kClientDomain = "com.quill.tallow.client";

[[nodiscard]] inline bool isUnreachable(const std::optional<TLError>& error) {
  return error.has_value() && error->domain == kUnreachableDomain;
}

// How long a call may take. Indexing waits for all batches that are queued before it, a vacuum
// rewrites the whole index.
inline constexpr std::chrono::seconds kShortTimeout = std::chrono::minutes(2);
inline constexpr std::chrono::seconds kLongTimeout = std::chrono::hours(6);

// How long to wait for a daemon that is not there.
using Patience = std::chrono::milliseconds;

// $RUNTIME_DIRECTORY, else tallow in $XDG_RUNTIME_DIR (for root only if it exists), else
// /run/tallow.
[[nodiscard]] std::string defaultRuntimeDirectory();

// The connection to one service of the daemon, over the socket of that name in the runtime
// directory. It is made by the first call, and made anew by the first call after it was lost; a
// call waits for the socket to take connections for as long as `patience`, so that a client may
// start before the daemon.
//
// One thread uses a channel at a time; channels are independent of each other.
class Channel {
 public:
  Channel(const std::string& runtimeDirectory, std::string serviceName, Patience patience);
  ~Channel();
  Channel(const Channel&) = delete;
  Channel& operator=(const Channel&) = delete;

  // Appends the arguments to the call, or reads the results of the reply. Negative, an errno value,
  // is a failure.
  using Body = std::function<int(sd_bus_message*)>;

  // Calls `member` and waits for its reply. False with an error when there is none.
  bool call(const char* member, std::chrono::seconds timeout, const Body& append, const Body& read,
            TLErrorOut error) {
    return call(_serviceName.c_str(), member, timeout, append, read, error);
  }
  // The same of another interface of the service's object.
  bool call(const char* interface, const char* member, std::chrono::seconds timeout,
            const Body& append, const Body& read, TLErrorOut error);

 private:
  bool connect(TLErrorOut error);
  void disconnect();
  [[nodiscard]] TLError unreachable(int errnoValue) const;

  const std::string _runtimeDirectory;
  const std::string _socketPath;
  const std::string _serviceName;
  const std::string _objectPath;
  const Patience _patience;
  sd_bus* _bus = nullptr;
};

}  // namespace client
