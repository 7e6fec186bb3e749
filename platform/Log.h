#pragma once

#include <fmt/format.h>

#include <functional>
#include <string>
#include <string_view>
#include <utility>

namespace platform {

// `standard` is the level that the environment variable and the output call "default".
enum class LogLevel { debug, info, standard, error, fault };

[[nodiscard]] const char* logLevelName(LogLevel level);

inline constexpr const char* kSubsystem = "com.quill.tallow";

// What a private value of a log line is replaced by.
inline constexpr const char* kPrivate = "<private>";

// One message as a sink sees it. The views live for the call.
struct LogRecord {
  std::string_view subsystem;
  std::string_view category;
  LogLevel level;
  std::string_view message;
};

using LogSink = std::function<void(const LogRecord&)>;

// Replaces where messages go, for all handles of the process and all levels; an empty sink brings
// back the journal or the standard error. Calls of a sink never overlap, and none runs after the
// call that replaces it has returned. Any thread.
void setLogSink(LogSink sink);

// The threshold of TALLOW_LOG (debug, info, default, error or fault), read once; where that is not
// set, the one of this process.
[[nodiscard]] LogLevel logThreshold();

// The process's own threshold, `standard` unless it is set before the first message.
void setProcessLogThreshold(LogLevel level);

// One handle per subsystem and category, made once and kept, usually by a function-local static.
// Any thread. The arguments of a message below the threshold are not formatted.
class Log {
 public:
  // Both must outlive the handle, usually string literals.
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

  // Writes a finished message, whatever the threshold.
  void emit(LogLevel level, std::string_view message) const;

 private:
  const char* _subsystem;
  const char* _category;
};

// The text that a boolean has in log lines.
[[nodiscard]] inline const char* yesNo(bool value) {
  return value ? "YES" : "NO";
}

}  // namespace platform
