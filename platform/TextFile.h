#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/TLError.h"
#include "platform/Text.h"

// Text files of unknown encoding.
namespace platform {

// Decodes `bytes`: by their byte order mark (UTF-8, UTF-16, UTF-32), which is removed; else as
// UTF-8 if valid and without NUL; else by byte statistics; else as ISO-8859-1. Never fails: invalid
// input becomes U+FFFD. At most 2 GiB.
[[nodiscard]] TLString decodeText(std::string_view bytes);

// The text of a file. At most `maximum` bytes are read; a larger file is an error (EFBIG).
[[nodiscard]] std::optional<TLString> readTextFile(const std::string& path, size_t maximum,
                                                   TLErrorOut error);

}  // namespace platform
