#pragma once

#include <future>
#include <optional>

#include "platform/TLError.h"

namespace testsupport {

// Nullopt means success.
using Outcome = std::optional<TLError>;

// Calls start(completion), which starts an asynchronous operation, and waits for its outcome.
template <typename Start>
Outcome outcomeOf(const Start& start) {
  std::promise<Outcome> promise;
  start([&promise](const Outcome& outcome) { promise.set_value(outcome); });
  return promise.get_future().get();
}

}  // namespace testsupport
