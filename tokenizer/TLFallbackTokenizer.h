#pragma once

#include <vector>

#include "platform/Text.h"

// A tokenizer without a linguistic library: converts to lower case and splits at every white space,
// punctuation, control or symbol character, optionally also between letters and digits. A character
// here is a UTF-16 unit. For callers without a locale; the daemon has one, and uses Tokenizer.h.
//
// Threads: any; immutable after construction.
class TLFallbackTokenizer {
 public:
  // Only this many units of a text are processed; the rest is dropped.
  static constexpr size_t kMaxTextUnits = 2097151;

  // The shared instance, which splits numbers.
  [[nodiscard]] static const TLFallbackTokenizer& getObject();

  explicit TLFallbackTokenizer(bool splitNums) : _splitNums(splitNums) {}

  // The words, each followed by a space; empty for a text without words. With `splitNums` a word is
  // split at the first change between ASCII digits and other characters if everything after it is
  // of the new kind: "abc123" is two words, "a1b2" is one.
  [[nodiscard]] TLString CleanText(TLStringView text) const;

  // The words of CleanText. Empty for a text of one unit.
  [[nodiscard]] std::vector<TLString> CleanTokens(TLStringView text) const;

 private:
  [[nodiscard]] static TLString _CleanText(TLStringView text);
  [[nodiscard]] static TLString _CleanTextSplitNums(TLStringView text);

  const bool _splitNums;
};
