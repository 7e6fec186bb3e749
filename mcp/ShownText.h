#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace mcp {

// Text from mail for a client: valid UTF-8, without control characters, changes of direction, and
// characters that people do not see and programs read (tags, variation selectors, zero-width ones).
// Line feeds stay. At most `most` code points, with "…" at the end if something is cut off.
[[nodiscard]] std::string shownText(std::string_view text, size_t most);

// The part of such a text from code point `from` on, at most `most` long. `next` is where the rest
// begins; 0 if there is none.
[[nodiscard]] std::string partOf(std::string_view text, size_t from, size_t most, size_t& next);

}  // namespace mcp
