#pragma once

#include <cstddef>

#include "platform/Text.h"

namespace cli {

// Limits the text of one zone of the index. A zone holds 200,000 bytes after word breaking; a
// longer one makes the daemon refuse the rest of the batch.
//
// The cost of a text is an upper bound of its size after word breaking: the UTF-8 length of each
// folded character, a space after each character that can be a word by itself, and a space where a
// run of ASCII ends at such a character. The space after an ASCII word is paid for by the character
// that separates it.
class TextBudget {
 public:
  static constexpr size_t kZoneBytes = 195000;

  explicit TextBudget(size_t bytes = kZoneBytes) : _left(bytes) {}

  // Returns the longest prefix of `text`, in whole characters, that the remaining budget can pay
  // for, and deducts its cost.
  [[nodiscard]] TLStringView take(TLStringView text);

  // As `take`, for markup, which counts as text. Does not cut inside a tag.
  [[nodiscard]] TLStringView takeMarkup(TLStringView text);

  // An upper bound of the UTF-8 bytes that it can still pay for.
  [[nodiscard]] size_t left() const { return _left; }

  // True if any text has been cut.
  [[nodiscard]] bool exhausted() const { return _exhausted; }

 private:
  size_t _left;
  bool _exhausted = false;
};

// The maximum number of bytes that a character can take in a zone, including the space after it
// unless it is ASCII.
[[nodiscard]] size_t zoneCostOf(char32_t character);

}  // namespace cli
