#include "libtallow/Errors.h"

#include <utility>

#include "platform/Text.h"
#include "rpc/Channel.h"

namespace tallow {

namespace {

ErrorKind kindOf(const std::string& domain) {
  if (domain == rpc::kUnreachableDomain) return ErrorKind::unreachable;
  if (domain == rpc::kProtocolDomain) return ErrorKind::protocol;
  if (domain == rpc::kClientDomain) return ErrorKind::invalid;
  return ErrorKind::refused;
}

}  // namespace

bool fail(Error* out, Error error) {
  if (out != nullptr) *out = std::move(error);
  return false;
}

bool fail(Error* out, const std::optional<TLError>& error) {
  if (!error) return fail(out, Error{ErrorKind::protocol, rpc::kProtocolDomain, 0, "no answer"});
  return fail(out, Error{kindOf(error->domain), error->domain, error->code, error->message});
}

bool failAsInvalid(Error* out, std::string message) {
  return fail(out, Error{ErrorKind::invalid, rpc::kClientDomain, 0, std::move(message)});
}

bool isSendable(std::string_view text, const char* what, Error* error) {
  if (text.find('\0') == std::string_view::npos && platform::isValidUTF8(text)) return true;
  return failAsInvalid(error, fmt::format("{} is not UTF-8 text without NUL", what));
}

}  // namespace tallow
