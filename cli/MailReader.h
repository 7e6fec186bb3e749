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

// Reads single messages again where the index says that they lie. Remembers the directories of
// Maildirs that it has listed, so that a thousand messages of one folder cost one listing. One
// thread.
class MailReader {
 public:
  // Where a message of an mbox file that is named by its content was seen last; none for one that
  // nobody knows.
  using OffsetOf = std::function<std::optional<uint64_t>(const std::string& identifier)>;

  explicit MailReader(OffsetOf offsetOf = nullptr) : _offsetOf(std::move(offsetOf)) {}

  // The place of the message as it is now, with the flags of a Maildir in its name; none for an
  // identifier of another client, for a Maildir file that is gone, and for a message whose offset
  // is not known.
  [[nodiscard]] std::optional<MailLocation> locate(const std::string& identifier);

  // The first bytes of the message, at most `most`, without the From line of an mbox file and its
  // quoting. An error where something else lies there by now.
  [[nodiscard]] std::optional<std::string> read(const std::string& identifier, size_t most,
                                                TLErrorOut error);

  // Forgets what has changed since it was listed, for programs that go on for long.
  void refresh();

 private:
  struct Listing {
    // By name without flags: the path.
    std::map<std::string, std::string, std::less<>> paths;
    std::vector<timespec> times;  // when "new" and "cur" were changed last
  };

  const Listing& listingOf(const std::string& maildir);

  const OffsetOf _offsetOf;
  static constexpr size_t kMaxListings = 64;
  std::map<std::string, Listing> _listings;
};

// The value of a header field of a message, unfolded and trimmed; empty where it
// has none. The name is in small letters.
[[nodiscard]] std::string headerValue(std::string_view message, std::string_view name);

}  // namespace cli
