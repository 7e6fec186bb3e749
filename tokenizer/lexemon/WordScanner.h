#pragma once

#include <optional>
#include <string>

#include "platform/Text.h"
#include "tokenizer/lexemon/FoldedText.h"

namespace lexemon {

// The words of a text, cleaned, one after the other. What a word is:
//
// - Each word of the ICU break iterator is folded (NFKC, case) and cut at every character that is
//   neither letter, mark nor number. Punctuation and symbols between two digits stay, where the
//   iterator or a colon holds the digits together: 3.14, 1,000, 10:30.
// - An apostrophe between two letters or two digits goes without a cut, and a final 's with it.
// - Accents go from Latin, Greek and Cyrillic letters. Other scripts keep their marks.
//
// For ASCII this comes to rules about neighbouring characters, which a table decides. A blank or
// line end of ASCII is a boundary that nothing around it changes, so what stands between two of
// them takes the table when it is all ASCII, and the iterator otherwise: the words are the same.
//
// Not for two threads at once. The text and the locale must outlive the object.
class WordScanner {
 public:
  enum class Mode { asciiByTable, unicodeOnly };

  WordScanner(TLStringView text, const std::string& locale, Mode mode);

  // Replaces `word` by the next word; false at the end. May throw as WorkspaceLease does.
  [[nodiscard]] bool next(TLString& word);

  // True when text without words was passed over since the last call. Mode unicodeOnly only.
  [[nodiscard]] bool takeSkipped() { return _folded && _folded->takeSkipped(); }

 private:
  [[nodiscard]] bool nextInASCII(TLString& word);
  bool enterNextStretch();
  [[nodiscard]] size_t mixedStretchEnd(size_t firstNonASCII) const;

  const TLStringView _text;
  const std::string& _locale;
  const Mode _mode;
  size_t _position = 0;    // in the stretch of ASCII, at its end in one of mixed text
  size_t _stretchEnd = 0;  // end of the current stretch
  std::optional<WorkspaceLease> _lease;
  std::optional<FoldedText> _folded;  // set while the stretch is one of mixed text
};

}  // namespace lexemon
