#pragma once

#include <vector>

#include "platform/Text.h"

// A tokenizer without a linguistic library: lower case, cut at every white space, punctuation,
// control or symbol character, on request also between letters and digits. A character here is a
// UTF-16 unit.
//
// Threads: any; nothing changes after creation.
class TLFallbackTokenizer {
 public:
  // The longest text that is looked at, in units; what is behind goes.
  static constexpr size_t kMaximumTextSize = 2097151;

  // The one that is shared, which splits numbers.
  [[nodiscard]] static const TLFallbackTokenizer& getObject();

  explicit TLFallbackTokenizer(bool splitNums) : _splitNums(splitNums) {}

  // The words, a blank behind each; empty for a text without words. With `splitNums` a word comes
  // apart at the first change between ASCII digits and other characters if all that is behind is
  // of the new kind: "abc123" is two words, "a1b2" one.
  [[nodiscard]] TLString CleanText(TLStringView text) const;

  // The words of CleanText. None for a single unit.
  [[nodiscard]] std::vector<TLString> CleanTokens(TLStringView text) const;

 private:
  [[nodiscard]] static TLString _CleanText(TLStringView text);
  [[nodiscard]] static TLString _CleanTextSplitNums(TLStringView text);

  const bool _splitNums;
};
