#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/Text.h"

namespace tokenizer {

// Splits a text into cleaned words. Documents and queries must use tokenizers of the same kind and
// locale, because a query word finds a document word only if both were cleaned in the same way.
//
// Threads: any number of threads may call a tokenizer at once; it is immutable. Break iterators are
// cached per calling thread.
//
// Accepts any text, including lone surrogates and NULs. Linear in its length.
class Tokenizer {
 public:
  virtual ~Tokenizer() = default;

  // Text form, for the index: appends each word in UTF-8, followed by one space, to `out`, and its
  // byte position in `out` to `offsets`. Words are not empty and contain no space or NUL. (The
  // space tokenizer differs; see below.)
  virtual void TokenizeToText(TLStringView text, std::string& out,
                              std::vector<uint32_t>& offsets) const = 0;

  // List form, for queries: appends each word.
  virtual void TokenizeToList(TLStringView text, std::vector<TLString>& out) const = 0;
};

// Word breaking and cleaning by the rules of the locale, e.g. "en_US". Null, with a log line, if
// the locale name is invalid. Both give the same words: the first goes through a chain of token
// objects and applies the Unicode rules to all text; the fast one goes through a stream of terms
// and uses a table for ASCII.
[[nodiscard]] std::unique_ptr<Tokenizer> NewLexemonTokenizer(const std::string& locale);
[[nodiscard]] std::unique_ptr<Tokenizer> NewFastLexemonTokenizer(const std::string& locale);

// Splits at spaces and cleans nothing. Its text form appends the text unchanged, without a final
// space, and the positions where runs of other bytes begin. In its list form, the first of two
// words keeps all but one of the spaces between them.
[[nodiscard]] std::unique_ptr<Tokenizer> NewSpaceTokenizer();

}  // namespace tokenizer

// True for a UTF-16 unit that is white space, a line end, punctuation, a control or format
// character, or a symbol.
[[nodiscard]] bool isSpecialUnit(char16_t unit);

// True if the last unit is special: the last query word is complete. False for an empty text.
[[nodiscard]] bool hasTrailingSpecialChar(TLStringView text);
