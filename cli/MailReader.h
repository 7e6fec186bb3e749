#pragma once

#include <cstdint>
#include <ctime>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "cli/Identifier.h"
#include "platform/TLError.h"

namespace cli {

// Reads single messages from the places named in the index. Caches the listings of Maildirs, so
// that a thousand messages of one folder need only one listing. One thread.
class MailReader {
 public:
  // The last known offset of a message in an mbox file that is identified by its content; nullopt
  // if unknown.
  using OffsetOf = std::function<std::optional<uint64_t>(const std::string& identifier)>;

  explicit MailReader(OffsetOf offsetOf = nullptr) : _offsetOf(std::move(offsetOf)) {}

  // The current place of the message, including the flags in a Maildir file name. Nullopt for an
  // identifier of another client, a Maildir file that no longer exists, and a message with an
  // unknown offset.
  [[nodiscard]] std::optional<MailLocation> locate(const std::string& identifier);

  // The first bytes of the message, at most `most`, without the From line of an mbox file and its
  // quoting. An error if something else is in that place now.
  [[nodiscard]] std::optional<std::string> read(const std::string& identifier, size_t most,
                                                TLErrorOut error);

  // Drops cached listings that are out of date; for long-running programs.
  void refresh();

 private:
  struct Listing {
    // The path, by name without flags.
    std::map<std::string, std::string, std::less<>> paths;
    std::vector<timespec> times;  // modification times of "new" and "cur"
  };

  const Listing& listingOf(const std::string& maildir);

  const OffsetOf _offsetOf;
  static constexpr size_t kMaxListings = 64;
  std::map<std::string, Listing> _listings;
};

// The value of a header field, unfolded and trimmed; empty if the message does not have the field.
// `name` is in lower case.
[[nodiscard]] std::string headerValue(std::string_view message, std::string_view name);

}  // namespace cli
