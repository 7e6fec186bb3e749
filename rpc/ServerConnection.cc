#include "rpc/ServerConnection.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <systemd/sd-id128.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <optional>
#include <system_error>
#include <utility>

#include "platform/Assert.h"
#include "platform/Clock.h"
#include "platform/Log.h"
#include "platform/Queue.h"
#include "rpc/Greeting.h"
#include "rpc/Marshal.h"

namespace rpc {

namespace {

const platform::Log& log() {
  static const platform::Log handle(platform::kSubsystem, "RPC");
  return handle;
}

}  // namespace

// Refers to its call by number: bus messages must stay on one thread, so the connection owns them
// and frees the rest at its end.
//
// Holds the budget of its request, because the code that works on a request holds the reply, even
// after the connection has ended.
class ServerReply : public Reply {
 public:
  ServerReply(ServerConnection& connection, uint64_t call, size_t requestBytes)
      : _connection(connection),
        _outbox(connection._outbox),
        _call(call),
        _requestBytes(requestBytes) {}

  ~ServerReply() override {
    finish([](sd_bus_message*, sd_bus_message**) { return 0; }, 0);
    RequestBudget::shared().give(_requestBytes);
  }

  void send(Values values) override {
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
  void finish(ServerConnection::BuildReply build, size_t bytes) {
    if (_finished.exchange(true)) return;
    // A handler that replies before it returns runs on the loop's thread, so the loop need not be
    // woken.
    if (_outbox->isCurrent()) return _connection.endCall(_call, build, bytes);
    _outbox->post([&connection = _connection, call = _call, build = std::move(build), bytes] {
      connection.endCall(call, build, bytes);
    });
  }

  ServerConnection& _connection;  // used only if the outbox says that it still exists
  const std::shared_ptr<Outbox> _outbox;
  const uint64_t _call;
  const size_t _requestBytes;
  std::atomic<bool> _finished{false};
};

ServerConnection::ServerConnection(int descriptor, std::string serviceName, std::string peer)
    : _serviceName(std::move(serviceName)),
      _peer(std::move(peer)),
      _socket(descriptor),
      _descriptor(descriptor),
      _idleSince(platform::monotonicTicks()) {}

ServerConnection::~ServerConnection() {
  if (_thread.joinable()) _thread.join();
}

void ServerConnection::addExportedInterface(Interface interface) {
  if (interface.name.empty()) interface.name = _serviceName;
  _interfaces.push_back(std::move(interface));
}

bool ServerConnection::open(std::function<void()> ended) {
  _ended = std::move(ended);
  _loop = std::make_unique<platform::RunLoop>();
  if (!_loop->good()) return false;
  _outbox->open(_loop.get());
  return true;
}

bool ServerConnection::start(std::function<void()> ended) {
  if (!open(std::move(ended))) return false;
  try {
    _thread = std::thread([this] {
      platform::setThreadName("tallow.rpc");
      serve();
    });
  } catch (const std::system_error&) {
    _outbox->close();
    return false;
  }
  return true;
}

void ServerConnection::finish(uint64_t milliseconds) {
  _outbox->post([this, milliseconds] { endSoon(milliseconds); });
}

ServerConnection::Idleness ServerConnection::idleness() const {
  pollfd socket{_descriptor, POLLRDHUP, 0};
  const bool gone = poll(&socket, 1, 0) > 0;
  return {gone, _inFlight != 0 || _evicted, _called, _idleSince};
}

void ServerConnection::evict() {
  _evicted = true;
  _outbox->post([this] {
    int unread = 0;
    _evicted = _calls.empty() && ioctl(_socket.get(), FIONREAD, &unread) == 0 && unread == 0;
    if (_evicted) endBecause("evicted for a new connection");
  });
}

void ServerConnection::serve() {
  _outbox->begin();
  if (openBus() && exportInterfaces()) {
    _loop->run();
  } else {
    log().error("Could not serve connection {}", description());
  }
  _outbox->close();
  _source.reset();
  _authenticationTimer.reset();
  _progressTimer.reset();
  _deadlineTimer.reset();
  _idleTimer.reset();
  for (const auto& [number, call] : _calls) sd_bus_message_unref(call);
  RequestBudget::shared().give(_messageBytes);
  if (_bus != nullptr) {
    sd_bus_detach_event(_bus);
    sd_bus_close_unref(_bus);
  }
  _inlet.reset();
  _descriptor = -1;
  _socket.reset();
  _loop.reset();
  _ended();
}

bool ServerConnection::openBus() {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) != 0) return false;
  _inlet = platform::FileDescriptor(ends[0]);
  platform::FileDescriptor input(ends[1]);
  platform::FileDescriptor output(fcntl(_socket.get(), F_DUPFD_CLOEXEC, 0));
  sd_id128_t id;
  if (output.get() < 0 || sd_bus_new(&_bus) < 0) return false;
  if (sd_bus_set_fd(_bus, input.get(), output.get()) < 0) return false;
  static_cast<void>(input.release());
  static_cast<void>(output.release());
  constexpr const char* kLocal = "org.freedesktop.DBus.Local";
  const bool ready =
      sd_id128_randomize(&id) >= 0 && sd_bus_set_server(_bus, 1, id) >= 0 &&
      sd_bus_negotiate_fds(_bus, 0) >= 0 && sd_bus_set_trusted(_bus, 1) >= 0 &&
      sd_bus_start(_bus) >= 0 &&
      sd_bus_match_signal_async(_bus, nullptr, kLocal, nullptr, kLocal, "Disconnected",
                                onDisconnected, nullptr, this) >= 0 &&
      sd_bus_attach_event(_bus, _loop->event(), SD_EVENT_PRIORITY_NORMAL) >= 0;
  if (!ready) return false;
  _source = _loop->addSocket(_socket.get(), [this](bool peerGone) { onSocket(peerGone); });
  _authenticationTimer = _loop->addTimer(kAuthenticationMilliseconds, [this] {
    if (sd_bus_is_ready(_bus) <= 0) endBecause("not authenticated in time");
  });
  return _source != nullptr && _authenticationTimer != nullptr;
}

bool ServerConnection::exportInterfaces() {
  const std::string path = objectPath(_serviceName);
  return addGreeting(_bus) &&
         std::all_of(_interfaces.begin(), _interfaces.end(), [&](const Interface& interface) {
           const int result = _exports.add(_bus, path, interface, {onMessage, this});
           if (result < 0) {
             log().error("Could not export {}: {}", interface.name, std::strerror(-result));
           }
           return result >= 0;
         });
}

void ServerConnection::onSocket(bool peerGone) {
  if (_reading) {
    pump();
  } else if (peerGone) {
    end();
  }
}

void ServerConnection::pump() {
  constexpr uint64_t kMessagesAtATime = 16;  // then replies and other events have their turn
  const uint64_t last = _messages + kMessagesAtATime;
  if (_awaitsRoom && !admit()) return;
  while (!_ending) {
    if (_messages == last) {
      return _loop->post([this] {
        if (!_ending) pump();
      });
    }
    const bool betweenMessages = !_framer.inMessage();
    if (betweenMessages && _calls.size() >= kMaxPendingCalls) return setReading(false);
    if (_unread.empty() && !readSome()) break;
    const Framer::Piece piece = _framer.next(_unread);
    const std::string_view bytes = _unread.substr(0, piece.size);
    _unread.remove_prefix(piece.size);
    switch (piece.part) {
      case Framer::Part::header:
        break;
      case Framer::Part::begins:
        if (!admit()) return;
        break;
      case Framer::Part::more:
        feed(bytes);
        break;
      case Framer::Part::ends:
        feed(bytes);
        endMessage();
        break;
      case Framer::Part::unacceptable:
        return endBecause("invalid message");
    }
  }
  if (_ending) return;
  setReading(true);
  watchProgress();
}

bool ServerConnection::readSome() {
  constexpr size_t kBufferBytes = size_t{64} << 10;
  _buffer.resize(kBufferBytes);
  const ssize_t size = recv(_socket.get(), _buffer.data(), _buffer.size(), 0);
  if (size > 0) {
    _unread = std::string_view(_buffer).substr(0, static_cast<size_t>(size));
    _received += static_cast<uint64_t>(size);
    return true;
  }
  if (size == 0 || (errno != EAGAIN && errno != EINTR)) end();
  return false;
}

bool ServerConnection::admit() {
  const size_t bytes = _framer.messageBytes();
  const auto resume = [this, outbox = _outbox] { outbox->post([this] { pump(); }); };
  _awaitsRoom = !RequestBudget::shared().take(bytes, resume);
  if (_awaitsRoom) {
    setReading(false);
    return false;
  }
  _messageBytes = bytes;
  feed(_framer.header());
  return true;
}

// The bus consumes all its input, so the inlet, when full, is empty after processing.
void ServerConnection::feed(std::string_view bytes) {
  while (!bytes.empty() && !_ending) {
    const ssize_t size = send(_inlet.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (size > 0) {
      bytes.remove_prefix(static_cast<size_t>(size));
    } else if (errno == EAGAIN || errno == EINTR) {
      processBus();
    } else {
      end();
    }
  }
}

void ServerConnection::processBus() {
  int result = 1;
  while (!_ending && result > 0) result = sd_bus_process(_bus, nullptr);
  if (result < 0) end();
}

void ServerConnection::endMessage() {
  ++_messages;
  processBus();
  // A message that the bus did not dispatch was no call of an interface; its budget is still held
  // here.
  RequestBudget::shared().give(std::exchange(_messageBytes, 0));
}

void ServerConnection::watchProgress() {
  if (!_framer.inMessage() || _progressTimer != nullptr) return;
  _receivedBefore = _received;
  _messagesBefore = _messages;
  _progressTimer =
      _loop->addTimer(kProgressMilliseconds, [this] { _loop->post([this] { checkProgress(); }); });
}

// First reads what is waiting in the socket: this thread may have been busy with a call.
void ServerConnection::checkProgress() {
  if (_ending) return;
  if (_reading) pump();
  if (_ending) return;
  const bool stuck = _reading && _framer.inMessage() && _messages == _messagesBefore &&
                     _received - _receivedBefore < kProgressBytes;
  if (stuck) return endBecause("a message has stalled");
  _progressTimer.reset();
  watchProgress();
}

void ServerConnection::setReading(bool reading) {
  if (_reading == reading) return;
  _reading = reading;
  _source->setReading(reading);
}

int ServerConnection::onDisconnected(sd_bus_message*, void* data, sd_bus_error*) {
  static_cast<ServerConnection*>(data)->end();
  return 1;
}

int ServerConnection::onMessage(sd_bus_message* message, void* data, sd_bus_error*) {
  return static_cast<ServerConnection*>(data)->dispatch(message);
}

const Method* ServerConnection::methodOf(sd_bus_message* message) const {
  const char* const name = sd_bus_message_get_interface(message);
  const char* const member = sd_bus_message_get_member(message);
  if (name == nullptr || member == nullptr) return nullptr;
  for (const Interface& interface : _interfaces) {
    if (interface.name != name) continue;
    for (const Method& method : interface.methods) {
      if (std::string_view(member) == method.member) return &method;
    }
  }
  return nullptr;
}

int ServerConnection::dispatch(sd_bus_message* message) {
  const Method* const method = methodOf(message);
  if (method == nullptr) return 0;
  const char* const member = method->member;
  try {
    auto values = readArguments(message, method->inputSignature);
    if (!values) {
      return sd_bus_reply_method_errorf(message, kInvalidArgs,
                                        "The content of the call to %s is not \"%s\"", member,
                                        method->inputSignature);
    }
    sd_bus_message* const call = standInFor(_bus, message);
    if (call == nullptr) return -ENOMEM;
    const uint64_t number = _nextCall++;
    _calls.emplace(number, call);
    _inFlight = _calls.size();
    _called = true;
    const auto reply =
        std::make_shared<ServerReply>(*this, number, std::exchange(_messageBytes, 0));
    try {
      Arguments arguments(std::move(*values));
      method->handler(arguments, reply);
    } catch (const std::bad_alloc&) {
      reply->sendFailure(SD_BUS_ERROR_NO_MEMORY, "There is not enough memory for the call");
    } catch (const std::system_error& failure) {
      reply->sendError(platform::posixError(failure.code().value(), member));
    } catch (const std::exception& failure) {
      log().fault("{} failed on {}: {}", member, description(), failure.what());
      reply->sendFailure(SD_BUS_ERROR_FAILED, failure.what());
    }
  } catch (const std::bad_alloc&) {
    return -ENOMEM;
  }
  return 1;
}

void ServerConnection::endCall(uint64_t number, const BuildReply& build, size_t bytes) {
  const auto entry = _calls.find(number);
  if (entry == _calls.end()) return;
  sd_bus_message* const call = entry->second;
  // Before sending, so that a peer that has received its reply finds the connection idle.
  _calls.erase(entry);
  _idleSince = platform::monotonicTicks();
  _inFlight = _calls.size();
  sendReply(call, build);
  sd_bus_message_unref(call);
  checkQueue(bytes);
  if (!_reading && !_ending) {
    _loop->post([this] {
      if (!_ending) pump();
    });
  }
  if (_finishing) endIfIdle();
}

void ServerConnection::sendReply(sd_bus_message* call, const BuildReply& build) {
  if (sd_bus_message_get_expect_reply(call) <= 0) return;
  sd_bus_message* reply = nullptr;
  int result = build(call, &reply);
  if (result < 0) {
    sd_bus_message_unref(reply);
    reply = nullptr;
    const bool invalid = result == -EINVAL;
    result = buildFailure(
        call, invalid ? SD_BUS_ERROR_FAILED : SD_BUS_ERROR_LIMITS_EXCEEDED,
        invalid ? "The reply cannot be carried by D-Bus" : "The reply is too large for one message",
        &reply);
  }
  if (result >= 0 && reply != nullptr) result = sd_bus_send(_bus, reply, nullptr);
  sd_bus_message_unref(reply);
  if (result < 0) log().error("Could not reply on {}: {}", description(), std::strerror(-result));
}

void ServerConnection::checkQueue(size_t bytes) {
  uint64_t waiting = 0;
  sd_bus_get_n_queued_write(_bus, &waiting);
  _queuedBytes = waiting == 0 ? 0 : _queuedBytes + bytes;
  if (waiting < kMaxQueuedMessages && _queuedBytes <= kMaxQueuedBytes) return;
  endBecause("its replies are not read");
}

void ServerConnection::endBecause(const char* reason) {
  log().error("Closing connection {}: {}", description(), reason);
  end();
}

// Detaches the bus before stopping the loop: an attached bus would block until its queue is empty,
// even if the peer never reads.
void ServerConnection::end() {
  _ending = true;
  sd_bus_detach_event(_bus);
  _loop->stop();
}

void ServerConnection::endSoon(uint64_t milliseconds) {
  _finishing = true;
  _deadlineTimer = _loop->addTimer(milliseconds, [this] { end(); });
  endIfIdle();
}

void ServerConnection::endIfIdle() {
  constexpr uint64_t kLookAgainMilliseconds = 10;
  uint64_t waiting = 0;
  sd_bus_get_n_queued_write(_bus, &waiting);
  if (_calls.empty() && waiting == 0) {
    end();
    return;
  }
  // The queue drains as the peer reads. The timer posts instead of calling directly, because a
  // source must not be replaced while its handler runs.
  _idleTimer =
      _loop->addTimer(kLookAgainMilliseconds, [this] { _loop->post([this] { endIfIdle(); }); });
}

}  // namespace rpc
