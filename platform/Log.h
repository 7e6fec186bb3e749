#pragma once

#include <fmt/format.h>

#include <functional>
#include <string>
#include <string_view>
#include <utility>

namespace platform {

// The environment variable and the output call `standard` "default".
enum class LogLevel { debug, info, standard, error, fault };

[[nodiscard]] const char* logLevelName(LogLevel level);

inline constexpr const char* kSubsystem = "com.quill.tallow";

// Replaces a private value in a log line.
inline constexpr const char* kPrivate = "<private>";

// A message as passed to a sink. The views are valid during the call only.
struct LogRecord {
  std::string_view subsystem;
  std::string_view category;
  LogLevel level;
  std::string_view message;
};

using LogSink = std::function<void(const LogRecord&)>;

// Sets the destination of messages for all handles and levels of the process; an empty sink
// restores the journal or standard error. Calls of a sink never overlap, and the old sink is not
// called after this function has returned. Any thread.
void setLogSink(LogSink sink);

// The threshold from TALLOW_LOG (debug, info, default, error or fault), read once; if not set, that
// of the process.
[[nodiscard]] LogLevel logThreshold();

// The process's own threshold. Set it before the first message; default is `standard`.
void setProcessLogThreshold(LogLevel level);

// A log handle, one per subsystem and category, usually a function-local static. Any thread. The
// arguments of a message below the threshold are not formatted.
class Log {
 public:
  // Both strings must outlive the handle; usually string literals.
  constexpr Log(const char* subsystem, const char* category)
      : _subsystem(subsystem), _category(category) {}

  [[nodiscard]] bool enabled(LogLevel level) const;

  template <typename... Args>
  void write(LogLevel level, fmt::format_string<Args...> format, Args&&... args) const {
    if (enabled(level)) emit(level, fmt::format(format, std::forward<Args>(args)...));
  }
  template <typename... Args>
  void debug(fmt::format_string<Args...> format, Args&&... args) const {
    write(LogLevel::debug, format, std::forward<Args>(args)...);
  }
  template <typename... Args>
  void info(fmt::format_string<Args...> format, Args&&... args) const {
    write(LogLevel::info, format, std::forward<Args>(args)...);
  }
  template <typename... Args>
  void standard(fmt::format_string<Args...> format, Args&&... args) const {
    write(LogLevel::standard, format, std::forward<Args>(args)...);
  }
  template <typename... Args>
  void error(fmt::format_string<Args...> format, Args&&... args) const {
    write(LogLevel::error, format, std::forward<Args>(args)...);
  }
  template <typename... Args>
  void fault(fmt::format_string<Args...> format, Args&&... args) const {
    write(LogLevel::fault, format, std::forward<Args>(args)...);
  }

  // Writes a formatted message regardless of the threshold.
  void emit(LogLevel level, std::string_view message) const;

 private:
  const char* _subsystem;
  const char* _category;
};

// How log lines show a boolean.
[[nodiscard]] inline const char* yesNo(bool value) {
  return value ? "YES" : "NO";
}

}  // namespace platform
