#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "platform/TLError.h"

namespace cli {

// The longest message that is read; a longer one is reported and skipped.
inline constexpr size_t kMaxMessageBytes = size_t{64} << 20;

// Where a message comes from.
struct MessageOrigin {
  std::string identifier;
  std::string folderPath;  // the Maildir folder, the directory of a single file, or the mbox file
  std::string folderName;
  std::optional<uint64_t> offset = std::nullopt;  // in an mbox file
};

// Receives the results of reading mail files. Return false to stop reading.
struct MailSink {
  // The bytes are valid during the call.
  std::function<bool(std::string_view bytes, const MessageOrigin& origin)> message;
  // A message, or the rest of a file, that cannot be read; `where` is a path, or path:offset.
  std::function<bool(const std::string& where, const std::string& reason)> failure;
  // A file in a directory that is not mail.
  std::function<void(const std::string& path)> ignored;
  // Bytes of the file itself read since the last call.
  std::function<void(uint64_t bytes)> progress;
};

// Reads the messages of one file: an mbox file or a single message, possibly compressed. `path` is
// absolute. With `named`, the user named the file, so a file without mail is a failure; in a
// directory it is ignored. False if the sink has stopped the reading.
//
// In an mbox file a message begins at a "From " line with a time and a year, at the start of the
// file or after an empty line. One ">" is removed from lines with one or more ">" before "From ".
bool readMailFile(const std::string& path, bool named, const MailSink& sink);

// True for a line that starts a message in an mbox file.
[[nodiscard]] bool isFromLine(std::string_view line);

}  // namespace cli
