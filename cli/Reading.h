#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "cli/MailReader.h"
#include "cli/MailView.h"
#include "cli/Terminal.h"

// Shows a single message as readable text.
namespace cli {

// The first bytes of the message, at most `most`. Nullopt with an error for an identifier that
// names no message on this disk or a whole mailbox, and for a message that cannot be read.
[[nodiscard]] std::optional<std::string> readSingleMessage(const std::string& identifier,
                                                           size_t most, MailReader& reader,
                                                           TLErrorOut error);

// The message as one clean text: fields, text, and a list of its attachments. Words are highlighted
// with the colours of the palette.
[[nodiscard]] std::string readingText(MailView& view, const std::string& path,
                                      const std::vector<std::string>& words,
                                      const Palette& palette);

// Such as 12.3 kB.
[[nodiscard]] std::string sizeText(uint64_t bytes);

}  // namespace cli
