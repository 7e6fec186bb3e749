#include "platform/TLError.h"

#include <system_error>
#include <utility>

namespace platform {

void setError(TLErrorOut out, TLError error) {
  if (out != nullptr) *out = std::move(error);
}

TLError posixError(int errnoValue, const std::string& what) {
  return {kPOSIXErrorDomain, errnoValue,
          fmt::format("{}: {}", what, std::generic_category().message(errnoValue))};
}

std::string printable(const std::optional<TLError>& error) {
  if (!error) return "(null)";
  return fmt::format("{} {}: {}", error->domain, error->code, error->message);
}

}  // namespace platform
