#include "platform/Signpost.h"

#include <atomic>
#include <string>

#include "platform/Mutex.h"

// The kernel counts attached tracers in these semaphores.
#define _SDT_HAS_SEMAPHORES 1
#include <sys/sdt.h>

extern "C" {
__extension__ volatile unsigned short tallow_begin_semaphore __attribute__((section(".probes"))) =
    0;
__extension__ volatile unsigned short tallow_end_semaphore __attribute__((section(".probes"))) = 0;
}

namespace platform {

namespace {

struct Holder {
  Mutex mutex;
  SignpostSink sink TL_GUARDED_BY(mutex);
  std::atomic<bool> present{false};
};

Holder& holder() {
  static auto* instance = new Holder;  // outlives every thread that may still send
  return *instance;
}

}  // namespace

void setSignpostSink(SignpostSink sink) {
  Holder& h = holder();
  MutexLock lock(h.mutex);
  h.present = static_cast<bool>(sink);
  h.sink = std::move(sink);
}

bool Signpost::enabled(SignpostPhase phase) {
  const auto traced = phase == SignpostPhase::begin ? tallow_begin_semaphore : tallow_end_semaphore;
  return traced != 0 || holder().present.load(std::memory_order_relaxed);
}

void Signpost::emit(SignpostPhase phase, uint64_t identifier, const char* name,
                    const std::string& message) {
  if (phase == SignpostPhase::begin) {
    STAP_PROBE3(tallow, begin, name, identifier, message.c_str());
  } else {
    STAP_PROBE3(tallow, end, name, identifier, message.c_str());
  }
  Holder& h = holder();
  MutexLock lock(h.mutex);
  if (h.sink) h.sink({phase, name, identifier, message});
}

}  // namespace platform
