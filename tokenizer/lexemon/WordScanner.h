#pragma once

#include <optional>
#include <string>

#include "platform/Text.h"
#include "tokenizer/lexemon/FoldedText.h"

namespace lexemon {

// Iterates over the cleaned words of a text:
//
// - Each word of the ICU break iterator is folded (NFKC, case) and split at every character other
//   than letters, marks and numbers. Punctuation and symbols between two digits stay if the
//   iterator or a colon keeps the digits together: 3.14, 1,000, 10:30.
// - An apostrophe between two letters or two digits is removed without a split, and so is a final
//   's.
// - Latin, Greek and Cyrillic letters lose their accents. Other scripts keep their marks.
//
// For ASCII this amounts to rules about neighbouring characters, which a table decides. ASCII white
// space is a word boundary whatever surrounds it. So a stretch between two of them uses the table
// if it is all ASCII, and otherwise the iterator; the words are the same.
//
// One thread at a time. The text and the locale must outlive the object.
class WordScanner {
 public:
  enum class Mode { asciiByTable, unicodeOnly };

  WordScanner(TLStringView text, const std::string& locale, Mode mode);

  // Replaces `word` by the next word; false at the end. May throw like WorkspaceLease.
  [[nodiscard]] bool next(TLString& word);

  // True if text without words was skipped since the last call. Mode unicodeOnly only.
  [[nodiscard]] bool takeSkipped() { return _folded && _folded->takeSkipped(); }

 private:
  [[nodiscard]] bool nextInASCII(TLString& word);
  bool enterNextStretch();
  [[nodiscard]] size_t mixedStretchEnd(size_t firstNonASCII) const;

  const TLStringView _text;
  const std::string& _locale;
  const Mode _mode;
  size_t _position = 0;    // inside an ASCII stretch; at the end of a mixed one
  size_t _stretchEnd = 0;  // end of the current stretch
  std::optional<WorkspaceLease> _lease;
  std::optional<FoldedText> _folded;  // set while the stretch is mixed text
};

}  // namespace lexemon
