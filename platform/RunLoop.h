#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "platform/TLError.h"

struct sd_event;

namespace platform {

// Blocks `signal` in the calling thread and in all threads that it starts from now on, so that the
// signal is an event of a run loop's source only and never ends the process. Called first thing in
// `main`.
void takeSignalFromProcess(int signal);

// An event loop over file descriptors, signals and posted items.
//
// Threads: `post` and `stop` may be called from any thread; all else, and every handler, belongs to
// the thread that calls `run`. Sources live as long as their handle.
class RunLoop {
 public:
  class Source {
   public:
    virtual ~Source() = default;
  };
  class Socket : public Source {
   public:
    // While not reading, only the end of the peer is told.
    virtual void setReading(bool reading) = 0;
  };

  RunLoop();
  ~RunLoop();
  RunLoop(const RunLoop&) = delete;
  RunLoop& operator=(const RunLoop&) = delete;

  // False when the system had no descriptors or memory for it; nothing else may be called then.
  [[nodiscard]] bool good() const;

  // Sources are null when the system has no descriptors or memory for them.

  // Calls `handler` with the number each time the signal arrives; needs takeSignalFromProcess.
  [[nodiscard]] std::unique_ptr<Source> addSignal(int signal, std::function<void(int)> handler);

  // Calls `handler` while `descriptor` can be read.
  [[nodiscard]] std::unique_ptr<Source> addReadable(int descriptor, std::function<void()> handler);

  // Calls `handler` while `descriptor`, a connected socket, can be read, and once its peer has gone
  // for good.
  [[nodiscard]] std::unique_ptr<Socket> addSocket(int descriptor,
                                                  std::function<void(bool peerGone)> handler);

  // Calls `handler` once, `milliseconds` from now.
  [[nodiscard]] std::unique_ptr<Source> addTimer(uint64_t milliseconds,
                                                 std::function<void()> handler);

  // Runs `item` on the loop's thread, after what was posted before.
  void post(std::function<void()> item);

  // Serves events until `stop`. Items posted before the stop have run when it returns.
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
