#pragma once

#include <systemd/sd-bus.h>

#include <atomic>
#include <deque>
#include <memory>
#include <string>
#include <string_view>
#include <thread>
#include <unordered_map>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Mutex.h"
#include "platform/RPC.h"
#include "platform/RPCInlet.h"

namespace platform {

// The posts of a connection's loop, shared with the replies that outlive the connection.
class RPCOutbox {
 public:
  // Runs `item` on the connection's thread; false once the connection has ended.
  bool post(std::function<void()> item);
  // True on the connection's thread, while the connection serves.
  bool isCurrent();
  void open(RunLoop* loop);
  // Called on the connection's thread, first and last.
  void begin();
  void close();

 private:
  Mutex _mutex;
  RunLoop* _loop TL_GUARDED_BY(_mutex) = nullptr;
  std::thread::id _thread TL_GUARDED_BY(_mutex);
};

// One accepted connection: the bus object and the thread that serves it.
//
// What the peer sends is read here and passed on to the bus one message at a time, once there is
// room for it. So no request is held twice, and not to read from a peer leaves replies and its end
// alone.
//
// Made and destroyed on the listener's thread; all fields but the ones named below belong to the
// connection's thread once it serves.
class RPCServerConnection : public RPCConnection {
 public:
  // Takes over `descriptor`.
  RPCServerConnection(int descriptor, std::string serviceName, std::string peer);
  ~RPCServerConnection() override;

  [[nodiscard]] const std::string& serviceName() const override { return _serviceName; }
  [[nodiscard]] std::string description() const override { return _serviceName + " " + _peer; }
  void addExportedInterface(RPCInterface interface) override;

  // Starts the thread; `ended` is called on it as the last thing that it does. False when the
  // system has no thread, descriptors or memory for it.
  [[nodiscard]] bool start(std::function<void()> ended);
  // The same in two steps, for a caller that serves on its own thread: `serve` returns when the
  // connection has ended.
  [[nodiscard]] bool open(std::function<void()> ended);
  void serve();

  // Any thread: the connection ends once no call of it is pending and what is ready has gone out,
  // or after `milliseconds`.
  void finish(uint64_t milliseconds);

  // Whether, and for how long, it does nothing. Any thread.
  struct Idleness {
    bool calling = false;  // a call is in flight, or it has been told to go
    bool called = false;   // it has ever made one
    uint64_t since = 0;    // the monotonic clock, in nanoseconds
  };
  [[nodiscard]] Idleness idleness() const;
  // Any thread: ends it, to make room for another.
  void evict();
  [[nodiscard]] bool evicted() const { return _evicted; }

 private:
  friend class RPCServerReply;

  // Makes the reply to a call, null for none; negative where D-Bus cannot carry it.
  using BuildReply = std::function<int(sd_bus_message* call, sd_bus_message** reply)>;

  bool openBus();
  bool exportInterfaces();
  bool exportInterface(const RPCInterface& interface);
  // The operation that a message calls; null for none.
  [[nodiscard]] const RPCMethod* methodOf(sd_bus_message* message) const;

  void onSocket(bool peerGone);
  // Passes on what the peer has sent, as far as calls in flight and room allow.
  void pump();
  // False when there is nothing to read now.
  bool readSome();
  // Passes the header on once there is room for its message.
  bool admit();
  void feed(std::string_view bytes);
  // Has the bus do what it can; a message has reached it in full.
  void processBus();
  void endMessage();
  void watchProgress();
  void checkProgress();
  void setReading(bool reading);

  int dispatch(sd_bus_message* message);
  void endCall(uint64_t number, const BuildReply& build, size_t bytes);
  void sendReply(sd_bus_message* call, const BuildReply& build);
  void checkQueue(size_t bytes);
  void endSoon(uint64_t milliseconds);
  void endIfIdle();
  void end();
  void endBecause(const char* reason);
  static int onMessage(sd_bus_message* message, void* data, sd_bus_error* error);
  static int onDisconnected(sd_bus_message* message, void* data, sd_bus_error* error);

  const std::string _serviceName;
  const std::string _peer;
  std::vector<RPCInterface> _interfaces;  // fixed once it serves
  std::function<void()> _ended;

  FileDescriptor _socket;
  FileDescriptor _inlet;  // the bus reads what is written here
  std::unique_ptr<RunLoop> _loop;
  const std::shared_ptr<RPCOutbox> _outbox = std::make_shared<RPCOutbox>();  // self-synchronised
  sd_bus* _bus = nullptr;
  std::vector<std::vector<sd_bus_vtable>> _vtables;  // the bus points into these and the names
  std::deque<std::string> _vtableNames;
  std::unique_ptr<RunLoop::Socket> _source;
  std::unique_ptr<RunLoop::Source> _authenticationTimer;
  std::unique_ptr<RunLoop::Source> _progressTimer;
  std::unique_ptr<RunLoop::Source> _deadlineTimer;
  std::unique_ptr<RunLoop::Source> _idleTimer;

  RPCFramer _framer;
  std::string _buffer;       // what was read
  std::string_view _unread;  // of it, what was not passed on
  bool _reading = true;
  bool _awaitsRoom = false;      // the message whose header is complete
  size_t _messageBytes = 0;      // of the budget, for the message that is being received
  uint64_t _received = 0;        // bytes
  uint64_t _messages = 0;        // received in full
  uint64_t _receivedBefore = 0;  // at the last look at the progress, as is the next
  uint64_t _messagesBefore = 0;

  // Whose reply is outstanding: a message that stands for the call, with its cookie and no content.
  std::unordered_map<uint64_t, sd_bus_message*> _calls;
  uint64_t _nextCall = 0;
  size_t _queuedBytes = 0;  // of the replies in the bus's write queue, an upper bound
  bool _finishing = false;
  bool _ending = false;

  std::atomic<size_t> _inFlight{0};  // the size of _calls; any thread reads these four
  std::atomic<bool> _called{false};
  std::atomic<uint64_t> _idleSince;
  std::atomic<bool> _evicted{false};

  std::thread _thread;
};

}  // namespace platform
