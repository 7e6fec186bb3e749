#pragma once

#include <string>

#include "platform/TLError.h"

namespace cli {

// What an error of the daemon or on the way to it means to a person: no URL, domain or number.
[[nodiscard]] std::string plainText(const TLError& error);

// Whether the daemon says that the index has no such message.
[[nodiscard]] bool isNotIndexed(const TLError& error);

// Whether it refused one message, which then ended its batch.
[[nodiscard]] bool isRefusedMessage(const TLError& error);

}  // namespace cli
