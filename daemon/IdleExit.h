#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>

#include "platform/RunLoop.h"

// Ends an idle daemon: calls `end` once no connection has been open for a while. Only for a daemon
// that systemd starts again at the next connection.
//
// Threads: all operations belong to the thread of the run loop, on which `end` is called.
class IdleExit {
 public:
  // The limit in $TALLOW_IDLE_EXIT, a whole number of seconds from 1 to a year; null, with an error
  // in the log if there is another text, for no limit.
  [[nodiscard]] static std::optional<uint64_t> limitSeconds();

  // The time begins now.
  IdleExit(platform::RunLoop& loop, uint64_t milliseconds, std::function<void()> end);

  // To be called whenever a connection has begun or ended.
  void connectionsChanged(size_t open);

 private:
  platform::RunLoop& _loop;
  const uint64_t _milliseconds;
  const std::function<void()> _end;
  std::unique_ptr<platform::RunLoop::Source> _timer;  // while there is no connection
};
