#pragma once

#include <chrono>
#include <deque>
#include <optional>
#include <string>
#include <vector>

#include "cli/Mime.h"
#include "cli/TextBudget.h"
#include "cli/TextDecoder.h"
#include "extract/ExtractProcess.h"

namespace cli {

// What an attachment is taken to be, by its type, or by the end of its name where the type tells
// nothing; nullopt if it has no text.
[[nodiscard]] std::optional<extract::Kind> kindOf(GMimeObject* attachment);

// The text of the attachments of one mail. Texts and attached messages are decoded here, as the
// mail's own text is; all other files are taken apart by tallow-extract. One thread.
class AttachmentText {
 public:
  // Of a mail, with those of attached messages. Later ones are counted and not read.
  static constexpr size_t kMaxAttachments = 100;
  // For all of a mail; the last one may take as long as ExtractProcess lets it.
  static constexpr std::chrono::seconds kPatience{20};

  // All must outlive this object. Texts are taken from `budget`.
  AttachmentText(extract::ExtractProcess& process, TextDecoder& decoder, TextBudget& budget,
                 extract::Counts& counts)
      : _process(process), _decoder(decoder), _budget(budget), _counts(counts) {}

  // The texts in order, each on lines of its own. Call once.
  [[nodiscard]] TLString of(const std::vector<GMimeObject*>& attachments);

 private:
  using Clock = std::chrono::steady_clock;

  extract::Outcome add(extract::Kind kind, GMimeObject* attachment);
  extract::Outcome addFile(extract::Kind kind, std::string_view bytes);
  extract::Outcome addMessage(GMimeMessage* message);
  // `whole` says that nothing is missing from the text.
  extract::Outcome addText(TLStringView text, bool whole = true);
  [[nodiscard]] bool hasRoom() const;

  extract::ExtractProcess& _process;
  TextDecoder& _decoder;
  TextBudget& _budget;
  extract::Counts& _counts;
  const Clock::time_point _until = Clock::now() + kPatience;
  std::deque<GMimeObject*> _pending;
  size_t _read = 0;
  TLString _text;
};

}  // namespace cli
