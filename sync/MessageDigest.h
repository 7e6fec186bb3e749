#pragma once

#include <string>
#include <string_view>

namespace mailsync {

// A digest of the content of a message, 32 hexadecimal digits. Header fields in which mail programs
// store a message's state and length (Status, X-Status, Content-Length and the like) are skipped,
// so that reading a message does not change its digest.
[[nodiscard]] std::string messageDigest(std::string_view message);

// The flags in Status and X-Status as Maildir letters, sorted: F, R, S, T.
[[nodiscard]] std::string statusFlags(std::string_view message);

}  // namespace mailsync
