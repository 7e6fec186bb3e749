#pragma once

#include "screen/Glyphs.h"

namespace mailscreen {

// The keys, for reading.
[[nodiscard]] Glyphs helpText();

}  // namespace mailscreen
