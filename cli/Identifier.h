#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

// Identifiers of mail in the index. They name the message's place so that tlw://BUNDLE/IDENTIFIER
// is a strict RFC 3986 URL:
//
//   file/home/mara/Mail/cur/1707208920.M001   a file of its own; of a Maildir without ":2,FLAGS"
//   mbox/home/mara/archive.mbox?offset=1234   a message of an mbox file
//   mbox/home/mara/archive.mbox?message=8f3c  one that keeps its name when others are deleted
//
// The offset is that of the message's "From " line in the decompressed file. The message's own name
// is a digest of its content, with ".N" for the Nth further one of the same content.
namespace cli {

// Every byte of a path but letters, digits, "-", ".", "_", "~" and the slash becomes %XX.
[[nodiscard]] std::string percentEncodePath(std::string_view path);

// `path` is absolute.
[[nodiscard]] std::string fileIdentifier(std::string_view path);
[[nodiscard]] std::string mboxIdentifier(std::string_view path, uint64_t offset);

[[nodiscard]] std::string mboxIdentifier(std::string_view path, std::string_view message);

// The identifier of a Maildir file that it keeps when it moves from "new" to "cur" or its flags
// change: that of "cur".
[[nodiscard]] std::string maildirIdentifier(std::string_view path);

// The letters after ":2," in the name of a Maildir file.
[[nodiscard]] std::string_view maildirFlags(std::string_view path);

// True for a message file of a Maildir: one in a directory "cur" or "new".
[[nodiscard]] bool isMaildirFile(std::string_view path);

struct MailLocation {
  std::string path;
  std::optional<uint64_t> offset;
  std::optional<std::string> message;  // in place of the offset
};

// Where the message lies; none for an identifier of another form. The name of a Maildir file is as
// in the identifier, without its flags.
[[nodiscard]] std::optional<MailLocation> parseIdentifier(std::string_view identifier);

// The file that `path` names, whatever flags its name has gained, also after a move from "new" to
// "cur"; `path` itself where there is none.
[[nodiscard]] std::string findMaildirFile(const std::string& path);

}  // namespace cli
