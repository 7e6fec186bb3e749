#include "daemon/IdleExit.h"

#include <charconv>
#include <cstdlib>
#include <string_view>
#include <utility>

#include "platform/Log.h"

namespace {

constexpr uint64_t kMaxSeconds = 366 * 24 * 3600;

const platform::Log& log() {
  static const platform::Log handle(platform::kSubsystem, "IdleExit");
  return handle;
}

}  // namespace

std::optional<uint64_t> IdleExit::limitSeconds() {
  const char* const value = std::getenv("TALLOW_IDLE_EXIT");
  if (value == nullptr || *value == '\0') return std::nullopt;
  const std::string_view text = value;
  uint64_t seconds = 0;
  const auto [end, failure] = std::from_chars(text.data(), text.data() + text.size(), seconds);
  if (failure == std::errc() && end == text.data() + text.size() && seconds > 0 &&
      seconds <= kMaxSeconds) {
    return seconds;
  }
  log().error("TALLOW_IDLE_EXIT is no number of seconds from 1 to {}: {}", kMaxSeconds, text);
  return std::nullopt;
}

IdleExit::IdleExit(platform::RunLoop& loop, uint64_t milliseconds, std::function<void()> end)
    : _loop(loop), _milliseconds(milliseconds), _end(std::move(end)) {
  connectionsChanged(0);
}

void IdleExit::connectionsChanged(size_t open) {
  _timer.reset();
  if (open == 0) _timer = _loop.addTimer(_milliseconds, _end);
}
