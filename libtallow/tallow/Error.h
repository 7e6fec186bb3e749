#pragma once

#include <string>

namespace tallow {

enum class ErrorKind : int {
  // No daemon answers on the socket, or the connection was lost before the reply. Calls may be
  // repeated later.
  unreachable = 1,
  // The daemon refused the call or failed. Domain and code tell what; see interfaces/errors.md.
  refused = 2,
  // The reply did not come in time, is malformed, or is an error of D-Bus.
  protocol = 3,
  // An argument is invalid or too large; nothing was sent.
  invalid = 4,
};

// Why an operation failed. The message is for people and has no final full stop; it may contain
// text from the arguments.
struct Error {
  ErrorKind kind = ErrorKind::protocol;
  std::string domain;
  int code = 0;
  std::string message;
};

}  // namespace tallow
