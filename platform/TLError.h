#pragma once

#include <fmt/format.h>

#include <optional>
#include <string>

// An error object: a small value that names who failed (`domain`), how (`code`) and says so in
// words. An operation that can fail takes an `std::optional<TLError>*` out-argument, null where the
// caller does not care, and sets it only on failure.
struct TLError {
  std::string domain;
  int code = 0;
  std::string message;

  bool operator==(const TLError&) const = default;
};

using TLErrorOut = std::optional<TLError>*;

// The domain of errors that the operating system reports; the code is errno.
inline constexpr const char* kPOSIXErrorDomain = "POSIX";

namespace platform {

// Stores `error` through `out` unless that is null.
void setError(TLErrorOut out, TLError error);

// An error of the POSIX domain for an errno value, its message prefixed by `what`.
[[nodiscard]] TLError posixError(int errnoValue, const std::string& what);

// For log lines: "DOMAIN CODE: MESSAGE", "(null)" for none.
[[nodiscard]] std::string printable(const std::optional<TLError>& error);

}  // namespace platform
