#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "libtallow/tallow/Error.h"
#include "platform/TLError.h"

// Errors of the public interface from those of this system.
namespace tallow {

// Sets `out`, unless null, and returns false.
bool fail(Error* out, Error error);
bool fail(Error* out, const std::optional<TLError>& error);
bool failAsInvalid(Error* out, std::string message);

// Whether D-Bus can carry a text: valid UTF-8 without NUL. An error that names `what` otherwise.
[[nodiscard]] bool isSendable(std::string_view text, const char* what, Error* error);

}  // namespace tallow
