#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "cli/MailFile.h"
#include "cli/TextDecoder.h"
#include "extract/ExtractProcess.h"
#include "records/TLIndexableItem.h"

namespace cli {

// Maximum number of MIME parts of a message that are read.
inline constexpr size_t kMaxParts = 10000;

// Maximum number of bytes of a body that are decoded; the index never holds more.
inline constexpr size_t kMaxBodyBytes = size_t{1} << 20;

struct ParsedMessage {
  std::shared_ptr<TLIndexableItem> item;
  bool cut = false;  // some text was too long for the index; attachments do not count
  extract::Counts attachments = {};
};

// The reason why a message cannot become an item.
struct UnparsableMessage {
  std::string reason;
};

// Converts mail to items for the index. Limits the nesting of MIME parts (1024) and iterates over
// them without recursion. One thread.
class MessageParser {
 public:
  // With the path of tallow-extract, the text of attachments is added.
  explicit MessageParser(const std::string& extractProgram = {});

  // The item has
  //   identifier, domainIdentifier          from the origin
  //   SUBJECT, X_FROM                       Subject; X-From, else Sender
  //   AUTHORS, RECIPIENTS, ADDITIONAL_..., HIDDEN_ADDITIONAL_...   From, To, Cc, Bcc; where no
  //                                         address can be read, the header's text as a name
  //   MAIL_DATE_RECEIVED                    the topmost Received, else Date
  //   CONTENT_CREATION_DATE                 Date
  //   TEXT_CONTENT                          all inline text/plain parts, or where they hold no text
  //   HTML_CONTENT_DATA                     the text/html parts as UTF-8
  //   TEXT_CONTENT                          in either case, the text of attachments at its end
  //   ATTACHMENT_NAMES, ATTACHMENT_TYPES, MAIL_MESSAGE_ID, MAILBOXES, MAILBOX_IDENTIFIERS,
  //   CONTENT_TYPE
  // and lacks what the message lacks. Dates are seconds since 1970.
  [[nodiscard]] std::variant<ParsedMessage, UnparsableMessage> parse(std::string_view bytes,
                                                                     const MessageOrigin& origin);

 private:
  TextDecoder _decoder;
  std::optional<extract::ExtractProcess> _process;
};

}  // namespace cli
