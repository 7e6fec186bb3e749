#pragma once

#include <systemd/sd-bus.h>

#include <atomic>
#include <memory>
#include <string>
#include <thread>
#include <unordered_map>
#include <vector>

#include "platform/Mutex.h"
#include "platform/RPC.h"

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

// One accepted connection: the bus object and the thread that serves it. Made and destroyed on the
// listener's thread; all fields but the ones named below belong to the connection's thread once
// `start` has been called.
class RPCServerConnection : public RPCConnection {
 public:
  // Takes over `descriptor`.
  RPCServerConnection(int descriptor, std::string serviceName, std::string peer);
  ~RPCServerConnection() override;

  [[nodiscard]] const std::string& serviceName() const override { return _serviceName; }
  [[nodiscard]] std::string description() const override { return _serviceName + " " + _peer; }
  void setExportedInterface(const RPCInterface* interface) override { _interface = interface; }

  // Starts the thread; `ended` is called on it as the last thing that it does.
  void start(std::function<void()> ended);

  // Any thread: the connection ends once no call of it is pending and what is ready has gone out,
  // or after `milliseconds`.
  void finish(uint64_t milliseconds);

 private:
  friend class RPCServerReply;

  // Makes the reply to a call, null for none; negative where D-Bus cannot carry it.
  using BuildReply = std::function<int(sd_bus_message* call, sd_bus_message** reply)>;

  void serve();
  bool openBus();
  bool exportInterface();
  void processWaiting();
  void dispatch(sd_bus_message* message);
  void endCall(uint64_t number, const BuildReply& build, size_t bytes);
  void sendReply(sd_bus_message* call, const BuildReply& build);
  void checkQueue(size_t bytes);
  void endSoon(uint64_t milliseconds);
  void endIfIdle();
  void end();
  static int onMessage(sd_bus_message* message, void* data, sd_bus_error* error);
  static int onConnected(sd_bus_message* message, void* data, sd_bus_error* error);
  static int onDisconnected(sd_bus_message* message, void* data, sd_bus_error* error);

  const std::string _serviceName;
  const std::string _peer;
  int _descriptor;
  const RPCInterface* _interface = nullptr;
  std::function<void()> _ended;

  std::unique_ptr<RunLoop> _loop;
  const std::shared_ptr<RPCOutbox> _outbox = std::make_shared<RPCOutbox>();  // self-synchronised
  sd_bus* _bus = nullptr;
  std::vector<sd_bus_vtable> _vtable;
  std::vector<std::string> _vtableNames;
  std::unique_ptr<RunLoop::Source> _authenticationTimer;
  std::unique_ptr<RunLoop::Source> _deadlineTimer;
  std::unique_ptr<RunLoop::Source> _idleTimer;
  std::unordered_map<uint64_t, sd_bus_message*> _calls;  // whose reply is outstanding
  uint64_t _nextCall = 0;
  size_t _queuedBytes = 0;  // of the replies in the bus's write queue, an upper bound
  bool _paused = false;     // detached from the loop, as too many calls are pending
  bool _finishing = false;
  bool _ending = false;

  std::thread _thread;
};

}  // namespace platform
