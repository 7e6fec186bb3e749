#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "cli/MailReader.h"
#include "cli/MailView.h"
#include "cli/Terminal.h"

// A single message for a person to read.
namespace cli {

// The first bytes of the message, at most `most`. None, with an error, for an identifier that names
// no message on this disk, a mailbox as a whole, and what cannot be read.
[[nodiscard]] std::optional<std::string> readSingleMessage(const std::string& identifier,
                                                           size_t most, MailReader& reader,
                                                           TLErrorOut error);

// The message as one clean text: fields, text, and a list of its attachments. Words are marked by
// the colours of the palette.
[[nodiscard]] std::string readingText(MailView& view, const std::string& path,
                                      const std::vector<std::string>& words,
                                      const Palette& palette);

// Such as 12.3 kB.
[[nodiscard]] std::string sizeText(uint64_t bytes);

}  // namespace cli
