#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

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

// Bounds. A connection beyond the first, or a peer past the others, is closed and logged.
inline constexpr size_t kMaximumConnections = 64;
inline constexpr uint64_t kAuthenticationMilliseconds = 5000;
inline constexpr uint64_t kMaximumQueuedMessages = 256;
inline constexpr size_t kMaximumQueuedBytes = size_t{256} << 20;
// Calls of one connection whose reply is outstanding; while there are as many, no more of it are
// read.
inline constexpr size_t kMaximumPendingCalls = 4;

// The arguments of a call, read in the order of the signature. The bytes live as long as the call's
// handler runs. Asking for another type than the signature has is a programming error.
class RPCArguments {
 public:
  virtual ~RPCArguments() = default;
  [[nodiscard]] virtual std::string_view readString() = 0;                    // s
  [[nodiscard]] virtual bool readBoolean() = 0;                               // b
  [[nodiscard]] virtual int64_t readInt64() = 0;                              // x
  [[nodiscard]] virtual uint64_t readUInt64() = 0;                            // t
  [[nodiscard]] virtual std::string_view readBytes() = 0;                     // ay
  [[nodiscard]] virtual std::vector<std::string_view> readStringArray() = 0;  // as
  [[nodiscard]] virtual std::vector<std::string_view> readBytesArray() = 0;   // aay
};

// One value of a reply, by D-Bus type: s, b, ay (Bytes), aay and a{sv} (Dictionary).
struct RPCBytes {
  std::string bytes;
};
using RPCBytesArray = std::vector<std::string>;
using RPCNumber = std::variant<int64_t, uint64_t, double>;
using RPCDictionary = std::vector<std::pair<std::string, RPCNumber>>;
using RPCValue = std::variant<std::string, bool, RPCBytes, RPCBytesArray, RPCDictionary>;
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

// The list of operations that a connection exports.
struct RPCInterface {
  std::vector<RPCMethod> methods;
};

// What a delegate sees of a new connection before it serves. The interface must outlive the
// listener.
class RPCConnection {
 public:
  virtual ~RPCConnection() = default;
  [[nodiscard]] virtual const std::string& serviceName() const = 0;
  [[nodiscard]] virtual std::string description() const = 0;
  virtual void setExportedInterface(const RPCInterface* interface) = 0;
};

// The socket of one service: SERVICE in the runtime directory, mode 0600, or handed over by systemd
// under that name. Object path and interface name derive from the service name.
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
