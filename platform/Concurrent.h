#pragma once

#include <algorithm>
#include <atomic>
#include <cstddef>
#include <system_error>
#include <thread>
#include <vector>

#include "platform/Queue.h"

namespace platform {

// Runs body(0) to body(count - 1), in no particular order, on the calling thread and on one more
// thread per further processor, as far as the system has threads; returns when all calls have
// ended. `body` must not throw.
template <typename Body>
void concurrentApply(size_t count, const Body& body) {
  std::atomic<size_t> next{0};
  const auto work = [&] {
    for (size_t i = next++; i < count; i = next++) body(i);
  };
  const size_t processors = std::max(1U, std::thread::hardware_concurrency());
  std::vector<std::thread> helpers;
  helpers.reserve(processors);
  try {
    while (helpers.size() + 1 < std::min(processors, count)) {
      helpers.emplace_back([&work] {
        setThreadName("tallow.apply");
        work();
      });
    }
  } catch (const std::system_error&) {
    // Continue with the threads that exist.
  }
  work();
  for (std::thread& helper : helpers) helper.join();
}

}  // namespace platform
