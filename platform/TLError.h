#pragma once

#include <fmt/format.h>

#include <optional>
#include <string>

// An error value: who failed (`domain`), how (`code`), and a message. An operation that can fail
// has an `std::optional<TLError>*` out-parameter, which may be null and is set only on failure.
struct TLError {
  std::string domain;
  int code = 0;
  std::string message;

  bool operator==(const TLError&) const = default;
};

using TLErrorOut = std::optional<TLError>*;

// The domain of operating system errors; the code is errno.
inline constexpr const char* kPOSIXErrorDomain = "POSIX";

namespace platform {

// Stores `error` through `out` unless that is null.
void setError(TLErrorOut out, TLError error);

// An error of the POSIX domain for an errno value; `what` is prefixed to its message.
[[nodiscard]] TLError posixError(int errnoValue, const std::string& what);

// For log lines: "DOMAIN CODE: MESSAGE", or "(null)".
[[nodiscard]] std::string printable(const std::optional<TLError>& error);

}  // namespace platform
