#pragma once

#include <chrono>
#include <cstdint>

namespace platform {

// Ticks of the monotonic clock; one tick is numerator/denominator nanoseconds.
[[nodiscard]] uint64_t monotonicTicks();

struct TickRatio {
  uint32_t numerator;
  uint32_t denominator;
};
[[nodiscard]] TickRatio tickRatio();

// Converts ticks to whole milliseconds, rounded down; 0 when the denominator is 0.
[[nodiscard]] uint64_t millisFromTicks(uint64_t ticks, TickRatio ratio);

// The processor time used by the calling thread so far.
[[nodiscard]] std::chrono::nanoseconds threadProcessorTime();

// Wall clock, seconds since 1970-01-01 00:00:00 UTC.
[[nodiscard]] double secondsSince1970();

}  // namespace platform

// Whole milliseconds since `start`, a value of platform::monotonicTicks.
[[nodiscard]] uint64_t elapsedMillisSinceMonotonicTime(uint64_t start);
