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

// Local RPC: named services, each a Unix stream socket on which both sides speak D-Bus peer to
// peer.
//
// Threads: a listener belongs to the run loop that it is given. Each accepted connection has a
// thread and an event loop of its own; the handlers of its methods run there, one at a time, in
// order of arrival. Connections never wait for each other. A reply may be sent from any thread, at
// any time, also after the connection has gone.
namespace platform {

// The error name of an error object; its body is message, domain and code.
inline constexpr const char* kRPCErrorName = "com.quill.tallow.Error";
inline constexpr const char* kRPCInvalidArgs = "org.freedesktop.DBus.Error.InvalidArgs";

// Bounds. Each peer beyond one of them is closed and logged.
//
// Where all connections are taken, the one that has been idle longest with no call in flight makes
// room for a new one.
inline constexpr size_t kMaximumConnections = 64;
inline constexpr uint64_t kAuthenticationMilliseconds = 5000;
inline constexpr uint64_t kMaximumQueuedMessages = 256;
inline constexpr size_t kMaximumQueuedBytes = size_t{256} << 20;
// Calls of one connection whose reply is outstanding; while there are as many, no more of it are
// read.
inline constexpr size_t kMaximumPendingCalls = 4;
inline constexpr size_t kMaximumMessageBytes = size_t{128} << 20;  // as the protocol has it
inline constexpr size_t kMaximumArrayElements = 262144;            // of an argument
// Bytes of the requests of all connections that are being received or whose reply is outstanding.
// One that is larger waits until there is no other. Small ones may take as much again, so that
// searches do not wait for large batches.
inline constexpr size_t kMaximumWaitingBytes = size_t{64} << 20;
inline constexpr size_t kSmallMessageBytes = size_t{64} << 10;
// A message that has begun must go on by so much in each interval.
inline constexpr uint64_t kProgressMilliseconds = 5000;
inline constexpr size_t kProgressBytes = size_t{64} << 10;

// The arguments of a call, which have been decoded in full before its handler runs; read in the
// order of the signature. The bytes live as long as the handler runs. Asking for another type than
// the signature has is a programming error.
class RPCArguments {
 public:
  // By type: s and ay, b, x, t, as and aay.
  using Value =
      std::variant<std::string_view, bool, int64_t, uint64_t, std::vector<std::string_view>>;

  explicit RPCArguments(std::vector<Value> values) : _values(std::move(values)) {}

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

// One value of a reply, by D-Bus type: s, b, ay (Bytes), aay, a{sv} (Dictionary) and a(sss)
// (TextRows).
struct RPCBytes {
  std::string bytes;
};
using RPCBytesArray = std::vector<std::string>;
using RPCNumber = std::variant<int64_t, uint64_t, double>;
using RPCDictionary = std::vector<std::pair<std::string, RPCNumber>>;
using RPCTextRows = std::vector<std::array<std::string, 3>>;
using RPCValue =
    std::variant<std::string, bool, RPCBytes, RPCBytesArray, RPCDictionary, RPCTextRows>;
using RPCValues = std::vector<RPCValue>;

// The promise of one reply. Any thread; the first call of either operation counts. A reply that is
// dropped without one ends in no answer.
class RPCReply {
 public:
  virtual ~RPCReply() = default;
  virtual void send(RPCValues values) = 0;
  virtual void sendError(const TLError& error) = 0;
  // An error of the protocol, such as kRPCInvalidArgs.
  virtual void sendFailure(const char* name, std::string message) = 0;
};

using RPCHandler = std::function<void(RPCArguments&, std::shared_ptr<RPCReply>)>;

// One operation. The names of the arguments, inputs first, stand in the introspection.
struct RPCMethod {
  const char* member;
  const char* inputSignature;
  const char* outputSignature;
  std::vector<const char*> argumentNames;
  RPCHandler handler;
};

// A list of operations that a connection exports under one interface name.
struct RPCInterface {
  std::vector<RPCMethod> methods;
  std::string name = {};  // the name of the service where empty
};

// What a delegate sees of a new connection before it serves.
class RPCConnection {
 public:
  virtual ~RPCConnection() = default;
  [[nodiscard]] virtual const std::string& serviceName() const = 0;
  [[nodiscard]] virtual std::string description() const = 0;
  // The connection keeps its interfaces for as long as it lives, so that a handler may hold state
  // of its connection; that is used on the connection's thread only. Names differ.
  virtual void addExportedInterface(RPCInterface interface) = 0;
};

// The socket of one service: SERVICE in the runtime directory, mode 0600, or handed over by systemd
// under that name. The object path derives from the service name.
class RPCListener {
 public:
  // Decides over a connection whose peer has passed the check of its credentials.
  using Delegate = std::function<bool(RPCListener&, RPCConnection&)>;

  virtual ~RPCListener() = default;
  [[nodiscard]] virtual const std::string& serviceName() const = 0;
  virtual void setDelegate(Delegate delegate) = 0;
  // Listens from now on. False when the socket cannot be had, for instance since a living process
  // serves it.
  virtual bool resume(TLErrorOut error) = 0;
  // Ends listening, lets every connection send what is ready, for at most `milliseconds`, and joins
  // their threads. Also done, with 0, at destruction.
  virtual void invalidate(uint64_t milliseconds) = 0;
};

[[nodiscard]] std::unique_ptr<RPCListener> makeRPCListener(RunLoop& loop, std::string directory,
                                                           std::string serviceName);

}  // namespace platform
