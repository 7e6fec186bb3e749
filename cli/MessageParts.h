#pragma once

#include <gmime/gmime.h>

#include <vector>

#include "cli/TextDecoder.h"
#include "platform/Text.h"

namespace cli {

// The parts of a message that are indexed, in the order of the message. They belong to it.
struct Leaves {
  std::vector<GMimePart*> plain;
  std::vector<GMimePart*> html;
  std::vector<GMimeObject*> attachments;  // with inline texts that have a name
  std::vector<GMimeObject*> files;        // without these
};

// Embedded messages are included unless they are attachments. At most kMaxParts parts are read.
[[nodiscard]] Leaves leavesOf(GMimeMessage* message);

// The texts of the parts, joined in order. Stops when there is more than the index accepts.
[[nodiscard]] TLString joinedText(const std::vector<GMimePart*>& parts, TextDecoder& decoder);

}  // namespace cli
