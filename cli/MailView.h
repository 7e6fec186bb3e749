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

// A message as a person reads it. All texts are as the mail has them, so unfit for a terminal.
// Parts beyond kMaxParts are left out; every traversal is a loop. One thread.
class MailView {
 public:
  // A longer value of a header field is cut, and ends with "…". UTF-16 units.
  static constexpr size_t kMaxFieldUnits = 4000;

  struct Attachment {
    std::string name;  // empty where the mail gives none
    std::string type;  // such as image/png
    uint64_t bytes = 0;
  };

  // Null where the bytes are no message.
  [[nodiscard]] static std::unique_ptr<MailView> parse(std::string_view bytes);

  // From, To, Cc, Bcc, Reply-To, Date and Subject, as far as there are, decoded.
  [[nodiscard]] std::vector<std::pair<std::string, std::string>> fields() const;

  // The inline text parts in their order, each HTML part as the text that it holds. Of alternatives
  // the plain text, unless that is only white space.
  [[nodiscard]] std::string text();
  // False where a part was too long to be decoded to its end.
  [[nodiscard]] bool complete() const { return _complete; }

  // All parts that are not text of the message, in their order.
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
