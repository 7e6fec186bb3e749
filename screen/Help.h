#pragma once

#include "screen/Glyphs.h"

namespace mailscreen {

// The help page with all keys.
[[nodiscard]] Glyphs helpText();

}  // namespace mailscreen
