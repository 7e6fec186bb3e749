#pragma once

#include <functional>
#include <thread>

#include "platform/Mutex.h"
#include "platform/RunLoop.h"

namespace rpc {

// Posts items to a connection's loop; shared with replies, which may outlive the connection.
class Outbox {
 public:
  // Runs `item` on the connection's thread; false if the connection has ended.
  bool post(std::function<void()> item);
  // True on the connection's thread while the connection serves.
  bool isCurrent();
  void open(platform::RunLoop* loop);
  // Called on the connection's thread, when it begins and when it ends.
  void begin();
  void close();

 private:
  platform::Mutex _mutex;
  platform::RunLoop* _loop TL_GUARDED_BY(_mutex) = nullptr;
  std::thread::id _thread TL_GUARDED_BY(_mutex);
};

}  // namespace rpc
