#pragma once

#include <cstddef>

#include "platform/Text.h"

namespace cli {

// Bounds the text that goes into one zone of the index. A zone holds 200,000 bytes after word
// breaking, and a longer one makes the daemon refuse the rest of its batch.
//
// The cost of a text is an upper bound of what word breaking makes of it: the UTF-8 length of each
// character's folded form, a blank behind each character that can be a word of its own, and one
// where a run of ASCII ends at such a character. Words of ASCII pay for the blank behind them with
// the character that separates them.
class TextBudget {
 public:
  static constexpr size_t kZoneBytes = 195000;

  explicit TextBudget(size_t bytes = kZoneBytes) : _left(bytes) {}

  // The longest prefix of `text`, in whole characters, that what is left can pay for; it is paid.
  [[nodiscard]] TLStringView take(TLStringView text);

  // As `take`, for markup, which counts as text: does not end inside a tag.
  [[nodiscard]] TLStringView takeMarkup(TLStringView text);

  // True once some text has been cut.
  [[nodiscard]] bool exhausted() const { return _exhausted; }

 private:
  size_t _left;
  bool _exhausted = false;
};

// The most bytes that a character can take in a zone, the blank behind it included unless it is
// ASCII.
[[nodiscard]] size_t zoneCostOf(char32_t character);

}  // namespace cli
