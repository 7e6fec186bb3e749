#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/TLError.h"
#include "platform/Text.h"

// Text files that do not say in what encoding they are.
namespace platform {

// The text of `bytes`: in the encoding of the byte order mark (UTF-8, UTF-16, UTF-32), which is
// left out; else in UTF-8 where they are valid, and without NUL; else in what the statistics of the
// bytes speak for; else in ISO-8859-1. Never fails: what is no character comes out as U+FFFD. At
// most 2 GiB.
[[nodiscard]] TLString decodeText(std::string_view bytes);

// The text of a file. At most `maximum` bytes are read; a larger file is an error (EFBIG).
[[nodiscard]] std::optional<TLString> readTextFile(const std::string& path, size_t maximum,
                                                   TLErrorOut error);

}  // namespace platform
