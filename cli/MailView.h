#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "cli/Mime.h"
#include "cli/TextDecoder.h"

namespace cli {

// A message in readable form. All texts are as in the mail and must be cleaned before they go to a
// terminal. Parts beyond kMaxParts are left out; no function recurses. One thread.
class MailView {
 public:
  // In UTF-16 units. A longer header value is cut and ends with "…".
  static constexpr size_t kMaxFieldUnits = 4000;

  struct Attachment {
    std::string name;  // empty if the mail has none
    std::string type;  // such as image/png
    uint64_t bytes = 0;
  };

  // Null if the bytes are not a message.
  [[nodiscard]] static std::unique_ptr<MailView> parse(std::string_view bytes);

  // The decoded fields From, To, Cc, Bcc, Reply-To, Date and Subject, if present.
  [[nodiscard]] std::vector<std::pair<std::string, std::string>> fields() const;

  // The inline text parts in order; HTML parts are converted to text. Of alternatives, the plain
  // text is used unless it is only white space.
  [[nodiscard]] std::string text();
  // False if a part was too long to be decoded completely.
  [[nodiscard]] bool complete() const { return _complete; }

  // All parts that are not text of the message, in order.
  [[nodiscard]] std::vector<Attachment> attachments() const;
  // The content of the attachment with this index.
  [[nodiscard]] std::string attachment(size_t index) const;

 private:
  explicit MailView(Object<GMimeMessage> message);

  void addLeaf(GMimeObject* leaf, bool read);
  [[nodiscard]] TLString readable(GMimePart* part);
  [[nodiscard]] int chosenOf(GMimeMultipart* alternatives);

  const Object<GMimeMessage> _message;  // owns all parts
  TextDecoder _decoder;
  std::vector<GMimePart*> _texts;
  std::vector<GMimeObject*> _attachments;
  bool _complete = true;
};

}  // namespace cli
