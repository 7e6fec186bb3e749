#pragma once

#include "platform/Text.h"

namespace cli {

// Removes the soft line breaks of a format=flowed part (RFC 3676). A line that ends with a space
// continues on the next line of the same quote depth. With `delSp` that space is removed as well.
// Space stuffing is undone; quote marks are kept.
[[nodiscard]] TLString unflow(TLStringView text, bool delSp);

}  // namespace cli
