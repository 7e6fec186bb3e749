#pragma once

#include <array>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "platform/Assert.h"
#include "platform/RunLoop.h"
#include "platform/TLError.h"
#include "rpc/Names.h"

// Local RPC: named services, each a Unix stream socket on which both sides speak D-Bus peer to
// peer.
//
// Threads: a listener belongs to the run loop that it is given. Each accepted connection has its
// own thread and event loop, which runs the handlers of its methods one at a time, in order of
// arrival. Connections never wait for each other. A reply may be sent from any thread at any time,
// even after the connection has ended.
namespace rpc {

// Limits. A peer that exceeds one of them is disconnected, with a log line.
//
// When all connections are taken, the one that has been idle longest without a call in flight is
// closed to make room.
inline constexpr size_t kMaxConnections = 64;
inline constexpr uint64_t kAuthenticationMilliseconds = 5000;
inline constexpr uint64_t kMaxQueuedMessages = 256;
inline constexpr size_t kMaxQueuedBytes = size_t{256} << 20;
// Calls of a connection whose reply is outstanding; at this number it stops reading.
inline constexpr size_t kMaxPendingCalls = 4;
inline constexpr size_t kMaxMessageBytes = size_t{128} << 20;  // the protocol's limit
// Total size of the requests, over all connections, that are being received or whose reply is
// outstanding. A larger request waits until there is no other. Small ones may use as much again, so
// that searches do not wait for large batches.
inline constexpr size_t kMaxWaitingBytes = size_t{64} << 20;
inline constexpr size_t kSmallMessageBytes = size_t{64} << 10;
// Minimum progress, in each interval, of a message that has begun.
inline constexpr uint64_t kProgressMilliseconds = 5000;
inline constexpr size_t kProgressBytes = size_t{64} << 10;

// The arguments of a call, decoded completely before its handler runs and read in the order of the
// signature. The bytes are valid while the handler runs. Reading another type than the signature
// has is a programming error.
class Arguments {
 public:
  // By D-Bus type: s and ay, b, x, t, as and aay.
  using Value =
      std::variant<std::string_view, bool, int64_t, uint64_t, std::vector<std::string_view>>;

  explicit Arguments(std::vector<Value> values) : _values(std::move(values)) {}

  [[nodiscard]] std::string_view readString() { return next<std::string_view>(); }
  [[nodiscard]] bool readBoolean() { return next<bool>(); }
  [[nodiscard]] int64_t readInt64() { return next<int64_t>(); }
  [[nodiscard]] uint64_t readUInt64() { return next<uint64_t>(); }
  [[nodiscard]] std::string_view readBytes() { return next<std::string_view>(); }
  [[nodiscard]] std::vector<std::string_view> readStringArray() {
    return next<std::vector<std::string_view>>();
  }
  [[nodiscard]] std::vector<std::string_view> readBytesArray() {
    return next<std::vector<std::string_view>>();
  }

 private:
  template <typename T>
  T next() {
    TL_ASSERT(_next < _values.size() && std::holds_alternative<T>(_values[_next]));
    return std::get<T>(std::move(_values[_next++]));
  }

  std::vector<Value> _values;
  size_t _next = 0;
};

// A value of a reply, by D-Bus type: s, b, ay (Bytes), aay, a{sv} (Dictionary) and a(sss)
// (TextRows).
struct Bytes {
  std::string bytes;
};
using BytesArray = std::vector<std::string>;
using Number = std::variant<int64_t, uint64_t, double>;
using Dictionary = std::vector<std::pair<std::string, Number>>;
using TextRows = std::vector<std::array<std::string, 3>>;
using Value = std::variant<std::string, bool, Bytes, BytesArray, Dictionary, TextRows>;
using Values = std::vector<Value>;

// The obligation to reply once. Any thread; only the first call counts. If it is destroyed without
// a call, no reply is sent.
class Reply {
 public:
  virtual ~Reply() = default;
  virtual void send(Values values) = 0;
  virtual void sendError(const TLError& error) = 0;
  // A protocol error, such as kInvalidArgs.
  virtual void sendFailure(const char* name, std::string message) = 0;
};

using Handler = std::function<void(Arguments&, std::shared_ptr<Reply>)>;

// One operation. The argument names, inputs first, appear in the introspection data.
struct Method {
  const char* member;
  const char* inputSignature;
  const char* outputSignature;
  std::vector<const char*> argumentNames;
  Handler handler;
};

// The operations that a connection exports under one interface name.
struct Interface {
  std::vector<Method> methods;
  std::string name = {};  // if empty, the name of the service
};

// A new connection as its delegate sees it, before it serves.
class Connection {
 public:
  virtual ~Connection() = default;
  [[nodiscard]] virtual const std::string& serviceName() const = 0;
  [[nodiscard]] virtual std::string description() const = 0;
  // The connection keeps its interfaces as long as it exists, so a handler may hold state of its
  // connection, to be used on the connection's thread only. Names must be distinct.
  virtual void addExportedInterface(Interface interface) = 0;
};

// The socket of one service: SERVICE in the runtime directory with mode 0600, or the one that
// systemd passes under that name. The object path is derived from the service name.
class Listener {
 public:
  // Accepts or refuses a connection whose peer has passed the credentials check.
  using Delegate = std::function<bool(Listener&, Connection&)>;

  virtual ~Listener() = default;
  [[nodiscard]] virtual const std::string& serviceName() const = 0;
  virtual void setDelegate(Delegate delegate) = 0;
  // Starts listening. False when the socket is unavailable, for example because another process
  // serves it.
  virtual bool resume(TLErrorOut error) = 0;
  // Whether systemd passed the socket. Then it outlives the process, and a connection that has not
  // been accepted starts the next one. Valid after `resume`.
  [[nodiscard]] virtual bool activated() const = 0;
  // Calls `handler` with the number of open connections whenever it changes.
  virtual void setConnectionsHandler(std::function<void(size_t open)> handler) = 0;
  // Accepts no more connections; those that arrive wait in the socket.
  virtual void pause() = 0;
  // Stops listening, lets every connection send pending replies for at most `milliseconds`, and
  // joins their threads. The destructor does the same with 0.
  virtual void invalidate(uint64_t milliseconds) = 0;
};

[[nodiscard]] std::unique_ptr<Listener> makeListener(platform::RunLoop& loop, std::string directory,
                                                     std::string serviceName);

}  // namespace rpc
