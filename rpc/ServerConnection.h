#pragma once

#include <systemd/sd-bus.h>

#include <atomic>
#include <memory>
#include <string>
#include <string_view>
#include <thread>
#include <unordered_map>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Mutex.h"
#include "rpc/Exports.h"
#include "rpc/Inlet.h"
#include "rpc/Outbox.h"
#include "rpc/Server.h"

namespace rpc {

// One accepted connection: its bus object and the thread that serves it.
//
// The connection reads from the peer itself and passes one message at a time on to the bus, once
// the budget has room for it. So no request is held in memory twice, and while reading is paused,
// replies and the end of the connection still work.
//
// Created and destroyed on the listener's thread; while it serves, all fields except those marked
// below belong to the connection's thread.
class ServerConnection : public Connection {
 public:
  // Takes ownership of `descriptor`.
  ServerConnection(int descriptor, std::string serviceName, std::string peer);
  ~ServerConnection() override;

  [[nodiscard]] const std::string& serviceName() const override { return _serviceName; }
  [[nodiscard]] std::string description() const override { return _serviceName + " " + _peer; }
  void addExportedInterface(Interface interface) override;

  // Starts the thread; its last action is to call `ended`. False when the system lacks a thread,
  // descriptors or memory.
  [[nodiscard]] bool start(std::function<void()> ended);
  // start() in two steps, for a caller that serves on its own thread: `serve` returns when the
  // connection has ended.
  [[nodiscard]] bool open(std::function<void()> ended);
  void serve();

  // Any thread: ends the connection when no call is pending and all replies have been sent, or
  // after `milliseconds`.
  void finish(uint64_t milliseconds);

  // Whether the connection is idle, and since when. Any thread.
  struct Idleness {
    bool gone = false;     // the peer has hung up, and the connection will end soon
    bool calling = false;  // a call is in flight, or the connection is closing
    bool called = false;   // it has made at least one call
    uint64_t since = 0;    // nanoseconds of the monotonic clock
  };
  [[nodiscard]] Idleness idleness() const;
  // Any thread: closes the connection to make room for another, unless a call has arrived.
  void evict();
  [[nodiscard]] bool evicted() const { return _evicted; }

 private:
  friend class ServerReply;

  // Builds the reply to a call; null for none; negative if D-Bus cannot carry it.
  using BuildReply = std::function<int(sd_bus_message* call, sd_bus_message** reply)>;

  bool openBus();
  bool exportInterfaces();
  // The method that a message calls; null if unknown.
  [[nodiscard]] const Method* methodOf(sd_bus_message* message) const;

  void onSocket(bool peerGone);
  // Reads from the peer and passes messages on, as far as calls in flight and the budget allow.
  void pump();
  // False when there is nothing to read now.
  bool readSome();
  // Passes the header to the bus if the budget has room for its message.
  bool admit();
  void feed(std::string_view bytes);
  // Lets the bus process its input.
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
  std::vector<Interface> _interfaces;  // fixed while serving
  std::function<void()> _ended;

  platform::FileDescriptor _socket;
  std::atomic<int> _descriptor;     // of the socket, for `idleness`; -1 at the end
  platform::FileDescriptor _inlet;  // what is written here, the bus reads
  std::unique_ptr<platform::RunLoop> _loop;
  const std::shared_ptr<Outbox> _outbox = std::make_shared<Outbox>();  // thread-safe
  sd_bus* _bus = nullptr;
  Exports _exports;
  std::unique_ptr<platform::RunLoop::Socket> _source;
  std::unique_ptr<platform::RunLoop::Source> _authenticationTimer;
  std::unique_ptr<platform::RunLoop::Source> _progressTimer;
  std::unique_ptr<platform::RunLoop::Source> _deadlineTimer;
  std::unique_ptr<platform::RunLoop::Source> _idleTimer;

  Framer _framer;
  std::string _buffer;       // bytes read from the peer
  std::string_view _unread;  // the part of _buffer not yet passed on
  bool _reading = true;
  bool _awaitsRoom = false;      // a complete header is waiting for the budget
  size_t _messageBytes = 0;      // budget held for the message being received
  uint64_t _received = 0;        // bytes
  uint64_t _messages = 0;        // received completely
  uint64_t _receivedBefore = 0;  // at the last progress check, like the next
  uint64_t _messagesBefore = 0;

  // Calls whose reply is outstanding, by number; of each only the header is kept.
  std::unordered_map<uint64_t, sd_bus_message*> _calls;
  uint64_t _nextCall = 0;
  size_t _queuedBytes = 0;  // replies in the bus's write queue, an upper bound
  bool _finishing = false;
  bool _ending = false;

  std::atomic<size_t> _inFlight{0};  // the size of _calls; these four are read by any thread
  std::atomic<bool> _called{false};
  std::atomic<uint64_t> _idleSince;
  std::atomic<bool> _evicted{false};

  std::thread _thread;
};

}  // namespace rpc
