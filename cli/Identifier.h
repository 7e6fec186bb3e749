#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

// Identifiers of mail in the index. They name the place of the message and are encoded so that
// tlw://BUNDLE/IDENTIFIER is a strict RFC 3986 URL:
//
//   file/home/mara/Mail/cur/1707208920.M001   a file of its own; of a Maildir without ":2,FLAGS"
//   mbox/home/mara/archive.mbox?offset=1234   a message of an mbox file
//   mbox/home/mara/archive.mbox?message=8f3c  one that keeps its name when others are deleted
//
// The offset is that of the message's "From " line in the decompressed file. The message's own name
// is a digest of its content, with ".N" for the Nth duplicate.
namespace cli {

// Encodes every byte of a path as %XX, except letters, digits, "-", ".", "_", "~" and "/".
[[nodiscard]] std::string percentEncodePath(std::string_view path);

// `path` is absolute.
[[nodiscard]] std::string fileIdentifier(std::string_view path);
[[nodiscard]] std::string mboxIdentifier(std::string_view path, uint64_t offset);

[[nodiscard]] std::string mboxIdentifier(std::string_view path, std::string_view message);

// The identifier of a Maildir file. It does not change when the file moves from "new" to "cur" or
// its flags change: it is always that of "cur".
[[nodiscard]] std::string maildirIdentifier(std::string_view path);

// The flag letters after ":2," in the name of a Maildir file.
[[nodiscard]] std::string_view maildirFlags(std::string_view path);

// True for a file in a "cur" or "new" directory, as Maildir messages are.
[[nodiscard]] bool isMaildirFile(std::string_view path);

struct MailLocation {
  std::string path;
  std::optional<uint64_t> offset;
  std::optional<std::string> message;  // instead of the offset
};

// The location of the message; nullopt for an identifier of another form. A Maildir file name is as
// in the identifier, without flags.
[[nodiscard]] std::optional<MailLocation> parseIdentifier(std::string_view identifier);

// The current file for `path`, also if its flags have changed or it has moved from "new" to "cur";
// `path` itself if there is none.
[[nodiscard]] std::string findMaildirFile(const std::string& path);

}  // namespace cli
