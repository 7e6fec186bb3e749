#pragma once

#include <string>

#include "platform/TLError.h"

namespace cli {

// Explains an error from the daemon or the connection to a user, without URLs, domains or numbers.
[[nodiscard]] std::string plainText(const TLError& error);

// Whether the error says that the index has no such message.
[[nodiscard]] bool isNotIndexed(const TLError& error);

// Whether the daemon refused one message, which ends the batch.
[[nodiscard]] bool isRefusedMessage(const TLError& error);

}  // namespace cli
