#include "platform/RPCConnection.h"

#include <systemd/sd-id128.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <utility>

#include "platform/Assert.h"
#include "platform/Log.h"
#include "platform/Queue.h"

namespace platform {

namespace {

const Log& log() {
  static const Log handle(kSubsystem, "RPC");
  return handle;
}

std::string objectPath(const std::string& serviceName) {
  std::string path = "/" + serviceName;
  std::replace(path.begin(), path.end(), '.', '/');
  return path;
}

class MessageArguments : public RPCArguments {
 public:
  explicit MessageArguments(sd_bus_message* message) : _message(message) {}

  std::string_view readString() override {
    const char* value = nullptr;
    TL_ASSERT(sd_bus_message_read_basic(_message, 's', &value) > 0);
    return value;
  }
  bool readBoolean() override {
    int value = 0;
    TL_ASSERT(sd_bus_message_read_basic(_message, 'b', &value) > 0);
    return value != 0;
  }
  int64_t readInt64() override {
    int64_t value = 0;
    TL_ASSERT(sd_bus_message_read_basic(_message, 'x', &value) > 0);
    return value;
  }
  uint64_t readUInt64() override {
    uint64_t value = 0;
    TL_ASSERT(sd_bus_message_read_basic(_message, 't', &value) > 0);
    return value;
  }
  std::string_view readBytes() override {
    const void* data = nullptr;
    size_t size = 0;
    TL_ASSERT(sd_bus_message_read_array(_message, 'y', &data, &size) >= 0);
    return size == 0 ? std::string_view() : std::string_view(static_cast<const char*>(data), size);
  }
  std::vector<std::string_view> readStringArray() override {
    return readArray("s", [this] { return readString(); });
  }
  std::vector<std::string_view> readBytesArray() override {
    return readArray("ay", [this] { return readBytes(); });
  }

 private:
  template <typename Read>
  std::vector<std::string_view> readArray(const char* contents, const Read& read) {
    std::vector<std::string_view> values;
    TL_ASSERT(sd_bus_message_enter_container(_message, 'a', contents) >= 0);
    while (sd_bus_message_at_end(_message, 0) == 0) values.push_back(read());
    TL_ASSERT(sd_bus_message_exit_container(_message) >= 0);
    return values;
  }

  sd_bus_message* _message;
};

// Appends one value; the result is negative where D-Bus cannot carry it.
struct Append {
  sd_bus_message* message;

  int operator()(const std::string& text) const {
    return sd_bus_message_append_basic(message, 's', text.c_str());
  }
  int operator()(bool value) const {
    const int number = value ? 1 : 0;
    return sd_bus_message_append_basic(message, 'b', &number);
  }
  int operator()(const RPCBytes& value) const { return appendBytes(value.bytes); }
  int operator()(const RPCBytesArray& values) const {
    int result = sd_bus_message_open_container(message, 'a', "ay");
    for (size_t i = 0; i < values.size() && result >= 0; ++i) result = appendBytes(values[i]);
    return result < 0 ? result : sd_bus_message_close_container(message);
  }
  int operator()(const RPCDictionary& values) const {
    int result = sd_bus_message_open_container(message, 'a', "{sv}");
    for (size_t i = 0; i < values.size() && result >= 0; ++i) result = appendEntry(values[i]);
    return result < 0 ? result : sd_bus_message_close_container(message);
  }

 private:
  int appendBytes(const std::string& bytes) const {
    return sd_bus_message_append_array(message, 'y', bytes.data(), bytes.size());
  }
  int appendEntry(const RPCDictionary::value_type& entry) const {
    return std::visit(
        [&](auto number) {
          using T = decltype(number);
          const char* type = std::is_same_v<T, double>    ? "d"
                             : std::is_same_v<T, int64_t> ? "x"
                                                          : "t";
          return sd_bus_message_append(message, "{sv}", entry.first.c_str(), type, number);
        },
        entry.second);
  }
};

size_t sizeOf(const RPCValues& values) {
  size_t bytes = 0;
  for (const RPCValue& value : values) {
    if (const auto* array = std::get_if<RPCBytesArray>(&value)) {
      for (const std::string& element : *array) bytes += element.size();
    } else if (const auto* text = std::get_if<std::string>(&value)) {
      bytes += text->size();
    } else if (const auto* single = std::get_if<RPCBytes>(&value)) {
      bytes += single->bytes.size();
    }
  }
  return bytes;
}

int buildReturn(sd_bus_message* call, const RPCValues& values, sd_bus_message** reply) {
  int result = sd_bus_message_new_method_return(call, reply);
  for (size_t i = 0; i < values.size() && result >= 0; ++i) {
    result = std::visit(Append{*reply}, values[i]);
  }
  return result;
}

int buildFailure(sd_bus_message* call, const char* name, const std::string& message,
                 sd_bus_message** reply) {
  const sd_bus_error failure{name, message.c_str(), 0};
  return sd_bus_message_new_method_error(call, reply, &failure);
}

int buildError(sd_bus_message* call, const TLError& error, sd_bus_message** reply) {
  const int result = buildFailure(call, kRPCErrorName, error.message, reply);
  return result < 0 ? result
                    : sd_bus_message_append(*reply, "si", error.domain.c_str(), error.code);
}

}  // namespace

bool RPCOutbox::post(std::function<void()> item) {
  MutexLock lock(_mutex);
  if (_loop == nullptr) return false;
  _loop->post(std::move(item));
  return true;
}

void RPCOutbox::open(RunLoop* loop) {
  MutexLock lock(_mutex);
  _loop = loop;
}

bool RPCOutbox::isCurrent() {
  MutexLock lock(_mutex);
  return _thread == std::this_thread::get_id();
}

void RPCOutbox::begin() {
  MutexLock lock(_mutex);
  _thread = std::this_thread::get_id();
}

void RPCOutbox::close() {
  MutexLock lock(_mutex);
  _loop = nullptr;
  _thread = {};
}

// Knows its call by number only: the messages of the bus library are not for several threads, so
// the connection keeps them and frees what is left when it ends.
class RPCServerReply : public RPCReply {
 public:
  RPCServerReply(RPCServerConnection& connection, uint64_t call)
      : _connection(connection), _outbox(connection._outbox), _call(call) {}

  ~RPCServerReply() override {
    finish([](sd_bus_message*, sd_bus_message**) { return 0; }, 0);
  }

  void send(RPCValues values) override {
    const size_t bytes = sizeOf(values);
    finish(
        [values = std::move(values)](sd_bus_message* call, sd_bus_message** reply) {
          return buildReturn(call, values, reply);
        },
        bytes);
  }
  void sendError(const TLError& error) override {
    finish([error](sd_bus_message* call,
                   sd_bus_message** reply) { return buildError(call, error, reply); },
           error.message.size());
  }
  void sendFailure(const char* name, std::string message) override {
    const size_t bytes = message.size();
    finish(
        [name, message = std::move(message)](sd_bus_message* call, sd_bus_message** reply) {
          return buildFailure(call, name, message, reply);
        },
        bytes);
  }

 private:
  void finish(RPCServerConnection::BuildReply build, size_t bytes) {
    if (_finished.exchange(true)) return;
    // A handler that answers before it returns need not wake the loop that it runs on.
    if (_outbox->isCurrent()) return _connection.endCall(_call, build, bytes);
    _outbox->post([&connection = _connection, call = _call, build = std::move(build), bytes] {
      connection.endCall(call, build, bytes);
    });
  }

  RPCServerConnection& _connection;  // touched only where the outbox says that it lives
  const std::shared_ptr<RPCOutbox> _outbox;
  const uint64_t _call;
  std::atomic<bool> _finished{false};
};

RPCServerConnection::RPCServerConnection(int descriptor, std::string serviceName, std::string peer)
    : _serviceName(std::move(serviceName)), _peer(std::move(peer)), _descriptor(descriptor) {}

RPCServerConnection::~RPCServerConnection() {
  if (_thread.joinable()) _thread.join();
  if (_descriptor >= 0) close(_descriptor);
}

void RPCServerConnection::start(std::function<void()> ended) {
  _ended = std::move(ended);
  _loop = std::make_unique<RunLoop>();
  _outbox->open(_loop.get());
  _thread = std::thread([this] { serve(); });
}

void RPCServerConnection::finish(uint64_t milliseconds) {
  _outbox->post([this, milliseconds] { endSoon(milliseconds); });
}

void RPCServerConnection::serve() {
  setThreadName("tallow.rpc");
  _outbox->begin();
  if (openBus() && exportInterface()) {
    _authenticationTimer = _loop->addTimer(kAuthenticationMilliseconds, [this] {
      if (sd_bus_is_ready(_bus) > 0) return;
      log().error("Closing connection {}: not authenticated in time", description());
      end();
    });
    _loop->run();
  }
  _outbox->close();
  _authenticationTimer.reset();
  _deadlineTimer.reset();
  _idleTimer.reset();
  for (const auto& [number, call] : _calls) sd_bus_message_unref(call);
  if (_bus != nullptr) {
    sd_bus_detach_event(_bus);
    sd_bus_close_unref(_bus);
  }
  _loop.reset();
  _ended();
}

bool RPCServerConnection::openBus() {
  sd_id128_t id;
  if (sd_bus_new(&_bus) < 0) return false;
  const int descriptor = std::exchange(_descriptor, -1);
  const auto matchLocalSignal = [this](const char* member, sd_bus_message_handler_t handler) {
    constexpr const char* kLocal = "org.freedesktop.DBus.Local";
    return sd_bus_match_signal_async(_bus, nullptr, kLocal, nullptr, kLocal, member, handler,
                                     nullptr, this) >= 0;
  };
  const bool ready = sd_bus_set_fd(_bus, descriptor, descriptor) >= 0 &&
                     sd_id128_randomize(&id) >= 0 && sd_bus_set_server(_bus, 1, id) >= 0 &&
                     sd_bus_negotiate_fds(_bus, 0) >= 0 && sd_bus_set_trusted(_bus, 1) >= 0 &&
                     sd_bus_set_connected_signal(_bus, 1) >= 0 && sd_bus_start(_bus) >= 0 &&
                     matchLocalSignal("Connected", onConnected) &&
                     matchLocalSignal("Disconnected", onDisconnected) &&
                     sd_bus_attach_event(_bus, _loop->event(), SD_EVENT_PRIORITY_NORMAL) >= 0;
  if (!ready) log().error("Could not serve connection {}", description());
  return ready;
}

bool RPCServerConnection::exportInterface() {
  sd_bus_vtable start{};
  start.type = _SD_BUS_VTABLE_START;
  start.x.start.element_size = sizeof(sd_bus_vtable);
  start.x.start.features = _SD_BUS_VTABLE_PARAM_NAMES;
  start.x.start.vtable_format_reference = &sd_bus_object_vtable_format;
  _vtable.push_back(start);
  _vtableNames.reserve(_interface->methods.size());
  for (const RPCMethod& method : _interface->methods) {
    std::string names;
    for (const char* name : method.argumentNames) names.append(name).push_back('\0');
    _vtableNames.push_back(std::move(names));
    sd_bus_vtable entry{};
    entry.type = _SD_BUS_VTABLE_METHOD;
    entry.flags = SD_BUS_VTABLE_UNPRIVILEGED;
    entry.x.method.member = method.member;
    entry.x.method.signature = method.inputSignature;
    entry.x.method.result = method.outputSignature;
    entry.x.method.handler = onMessage;
    entry.x.method.names = _vtableNames.back().c_str();
    _vtable.push_back(entry);
  }
  sd_bus_vtable end{};
  end.type = _SD_BUS_VTABLE_END;
  _vtable.push_back(end);
  const int result = sd_bus_add_object_vtable(_bus, nullptr, objectPath(_serviceName).c_str(),
                                              _serviceName.c_str(), _vtable.data(), this);
  if (result < 0) log().error("Could not export {}: {}", _serviceName, std::strerror(-result));
  return result >= 0;
}

// A call that came in one piece with the end of the authentication is in the bus's buffer now, and
// the loop would not look at it before more bytes arrive.
int RPCServerConnection::onConnected(sd_bus_message*, void* data, sd_bus_error*) {
  auto* connection = static_cast<RPCServerConnection*>(data);
  connection->_loop->post([connection] { connection->processWaiting(); });
  return 1;
}

void RPCServerConnection::processWaiting() {
  while (!_ending && !_paused && sd_bus_process(_bus, nullptr) > 0) {
  }
}

int RPCServerConnection::onDisconnected(sd_bus_message*, void* data, sd_bus_error*) {
  static_cast<RPCServerConnection*>(data)->end();
  return 1;
}

int RPCServerConnection::onMessage(sd_bus_message* message, void* data, sd_bus_error*) {
  static_cast<RPCServerConnection*>(data)->dispatch(message);
  return 1;
}

void RPCServerConnection::dispatch(sd_bus_message* message) {
  const std::string_view member = sd_bus_message_get_member(message);
  const auto method = std::find_if(_interface->methods.begin(), _interface->methods.end(),
                                   [&](const RPCMethod& m) { return member == m.member; });
  TL_ASSERT(method != _interface->methods.end());
  const uint64_t number = _nextCall++;
  _calls.emplace(number, sd_bus_message_ref(message));
  if (_calls.size() >= kMaximumPendingCalls) {
    sd_bus_detach_event(_bus);
    _paused = true;
  }
  MessageArguments arguments(message);
  method->handler(arguments, std::make_shared<RPCServerReply>(*this, number));
}

void RPCServerConnection::endCall(uint64_t number, const BuildReply& build, size_t bytes) {
  const auto entry = _calls.find(number);
  sendReply(entry->second, build);
  sd_bus_message_unref(entry->second);
  _calls.erase(entry);
  checkQueue(bytes);
  if (_paused && !_ending && _calls.size() < kMaximumPendingCalls) {
    _paused = false;
    sd_bus_attach_event(_bus, _loop->event(), SD_EVENT_PRIORITY_NORMAL);
  }
  if (_finishing) endIfIdle();
}

void RPCServerConnection::sendReply(sd_bus_message* call, const BuildReply& build) {
  if (sd_bus_message_get_expect_reply(call) <= 0) return;
  sd_bus_message* reply = nullptr;
  int result = build(call, &reply);
  if (result < 0) {
    sd_bus_message_unref(reply);
    reply = nullptr;
    result = buildFailure(call, SD_BUS_ERROR_LIMITS_EXCEEDED,
                          "The reply is too large for one message", &reply);
  }
  if (result >= 0 && reply != nullptr) result = sd_bus_send(_bus, reply, nullptr);
  sd_bus_message_unref(reply);
  if (result < 0) log().error("Could not reply on {}: {}", description(), std::strerror(-result));
}

void RPCServerConnection::checkQueue(size_t bytes) {
  uint64_t waiting = 0;
  sd_bus_get_n_queued_write(_bus, &waiting);
  _queuedBytes = waiting == 0 ? 0 : _queuedBytes + bytes;
  if (waiting < kMaximumQueuedMessages && _queuedBytes <= kMaximumQueuedBytes) return;
  log().error("Closing connection {}: {} replies are not read", description(), waiting);
  end();
}

// The bus leaves the loop first: one that is attached when the loop ends blocks until its queue is
// empty, however long the peer does not read.
void RPCServerConnection::end() {
  _ending = true;
  sd_bus_detach_event(_bus);
  _loop->stop();
}

void RPCServerConnection::endSoon(uint64_t milliseconds) {
  _finishing = true;
  _deadlineTimer = _loop->addTimer(milliseconds, [this] { end(); });
  endIfIdle();
}

void RPCServerConnection::endIfIdle() {
  constexpr uint64_t kLookAgainMilliseconds = 10;
  uint64_t waiting = 0;
  sd_bus_get_n_queued_write(_bus, &waiting);
  if (_calls.empty() && waiting == 0) {
    end();
    return;
  }
  // What waits in the queue goes out as the peer reads. The timer posts rather than calls, as a
  // source must not be replaced while its handler runs.
  _idleTimer =
      _loop->addTimer(kLookAgainMilliseconds, [this] { _loop->post([this] { endIfIdle(); }); });
}

}  // namespace platform
