#pragma once

#include <string>
#include <string_view>

namespace mailsync {

// 32 hexadecimal digits that stand for the content of a message. The header fields in which mail
// programs keep a message's state and length (Status, X-Status, Content-Length and the like) do not
// count, so that the digest stays when somebody has read the message.
[[nodiscard]] std::string messageDigest(std::string_view message);

// The flags in Status and X-Status, as the letters of a Maildir, in order: F, R, S, T.
[[nodiscard]] std::string statusFlags(std::string_view message);

}  // namespace mailsync
