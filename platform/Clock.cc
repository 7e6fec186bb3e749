#include "platform/Clock.h"

#include <chrono>
#include <ctime>

namespace platform {

uint64_t monotonicTicks() {
  return static_cast<uint64_t>(std::chrono::duration_cast<std::chrono::nanoseconds>(
                                   std::chrono::steady_clock::now().time_since_epoch())
                                   .count());
}

TickRatio tickRatio() {
  return {1, 1};
}

uint64_t millisFromTicks(uint64_t ticks, TickRatio ratio) {
  if (ratio.denominator == 0) return 0;
  return ticks * ratio.numerator / ratio.denominator / 1000000;
}

std::chrono::nanoseconds threadProcessorTime() {
  timespec time{};
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
  return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

double secondsSince1970() {
  return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

}  // namespace platform

uint64_t elapsedMillisSinceMonotonicTime(uint64_t start) {
  static const platform::TickRatio ratio = platform::tickRatio();
  return platform::millisFromTicks(platform::monotonicTicks() - start, ratio);
}
