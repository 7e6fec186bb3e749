#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "platform/TLError.h"

struct sd_event;

namespace platform {

// Blocks `signal` in the calling thread and all threads that it starts later, so that only a run
// loop's source receives it and it never ends the process. Call it first in `main`.
void takeSignalFromProcess(int signal);

// An event loop over file descriptors, signals and posted items.
//
// Threads: `post` and `stop` may be called from any thread; everything else, including every
// handler, belongs to the thread that calls `run`. A source is active as long as its handle exists.
class RunLoop {
 public:
  class Source {
   public:
    virtual ~Source() = default;
  };
  class Socket : public Source {
   public:
    // While reading is off, the handler is called only when the peer has gone.
    virtual void setReading(bool reading) = 0;
  };

  RunLoop();
  ~RunLoop();
  RunLoop(const RunLoop&) = delete;
  RunLoop& operator=(const RunLoop&) = delete;

  // False when the system lacked descriptors or memory; then no other function may be called.
  [[nodiscard]] bool good() const;

  // Sources are null when the system lacks descriptors or memory.

  // Calls `handler` with the signal number at each arrival; requires takeSignalFromProcess.
  [[nodiscard]] std::unique_ptr<Source> addSignal(int signal, std::function<void(int)> handler);

  // Calls `handler` while `descriptor` is readable.
  [[nodiscard]] std::unique_ptr<Source> addReadable(int descriptor, std::function<void()> handler);

  // Calls `handler` while `descriptor`, a connected socket, is readable, and when its peer has
  // closed the connection.
  [[nodiscard]] std::unique_ptr<Socket> addSocket(int descriptor,
                                                  std::function<void(bool peerGone)> handler);

  // Calls `handler` once, `milliseconds` from now.
  [[nodiscard]] std::unique_ptr<Source> addTimer(uint64_t milliseconds,
                                                 std::function<void()> handler);

  // Runs `item` on the loop's thread, after earlier posts.
  void post(std::function<void()> item);

  // Serves events until `stop`. Runs all items posted before the stop, then returns.
  void run();
  void stop();

  // For bus objects of the RPC layer.
  [[nodiscard]] sd_event* event() const;

 private:
  struct Body;
  std::unique_ptr<Body> _body;
};

// The run loop of the process, run by the main thread; made on first use and never destroyed.
[[nodiscard]] RunLoop& mainRunLoop();

}  // namespace platform
