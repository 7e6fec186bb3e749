#pragma once

#include <fmt/format.h>

#include <cstdint>
#include <functional>
#include <string_view>
#include <utility>

namespace platform {

enum class SignpostPhase { begin, end };

struct SignpostEvent {
  SignpostPhase phase;
  std::string_view name;
  uint64_t identifier;
  std::string_view message;
};

using SignpostSink = std::function<void(const SignpostEvent&)>;

// Passes the events to a test; an empty sink removes it. Calls of a sink never overlap.
void setSignpostSink(SignpostSink sink);

// Trace points of the handle "com.quill.tallow.signposts", "PointsOfInterest": the static probes
// tallow:begin and tallow:end with (name, identifier, message), for perf and bpftrace. Without a
// tracer or sink nothing is formatted or sent. Any thread.
class Signpost {
 public:
  // An identifier derived from the address of an object.
  [[nodiscard]] static uint64_t identifierForObject(const void* object) {
    return reinterpret_cast<uintptr_t>(object);
  }

  template <typename... Args>
  static void begin(uint64_t identifier, const char* name, fmt::format_string<Args...> format,
                    Args&&... args) {
    send(SignpostPhase::begin, identifier, name, format, std::forward<Args>(args)...);
  }
  template <typename... Args>
  static void end(uint64_t identifier, const char* name, fmt::format_string<Args...> format,
                  Args&&... args) {
    send(SignpostPhase::end, identifier, name, format, std::forward<Args>(args)...);
  }

  // True if a tracer or a sink is attached.
  [[nodiscard]] static bool enabled(SignpostPhase phase);

 private:
  template <typename... Args>
  static void send(SignpostPhase phase, uint64_t identifier, const char* name,
                   fmt::format_string<Args...> format, Args&&... args) {
    if (identifier == 0 || identifier == ~uint64_t{0} || !enabled(phase)) return;
    emit(phase, identifier, name, fmt::format(format, std::forward<Args>(args)...));
  }
  static void emit(SignpostPhase phase, uint64_t identifier, const char* name,
                   const std::string& message);
};

}  // namespace platform
