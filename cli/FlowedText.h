#pragma once

#include "platform/Text.h"

namespace cli {

// The text of a format=flowed part (RFC 3676) with its soft line breaks taken out: a line that ends
// in a blank goes on in the next of the same quote depth. With `delSp` that blank goes too. Space
// stuffing is undone; quote marks stay.
[[nodiscard]] TLString unflow(TLStringView text, bool delSp);

}  // namespace cli
