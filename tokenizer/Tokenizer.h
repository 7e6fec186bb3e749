#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/Text.h"

namespace tokenizer {

// Cuts a text into cleaned words. Documents and queries go through tokenizers of one kind and one
// locale, since a query word finds a document word only when both came out of the same cleaning.
//
// Threads: a tokenizer may be called from any thread, and from many at once; it holds no state that
// changes between calls. Break iterators are kept one per calling thread.
//
// Any text is accepted, lone surrogates and NULs included. The time is linear in its length.
class Tokenizer {
 public:
  virtual ~Tokenizer() = default;

  // The text form, for the index: appends each word in UTF-8 and one blank behind it to `out`, and
  // to `offsets` the byte position in `out` at which the word starts. No word is empty, and none
  // holds a blank or a NUL. (The space tokenizer has a form of its own, see there.)
  virtual void TokenizeToText(TLStringView text, std::string& out,
                              std::vector<uint32_t>& offsets) const = 0;

  // The list form, for queries: appends each word.
  virtual void TokenizeToList(TLStringView text, std::vector<TLString>& out) const = 0;
};

// Word breaking and cleaning by the rules of the locale, e.g. "en_US". Null, and a line in the log,
// where the locale name is no good. Both give the same words: the first walks a chain of tokens
// that has an object for each and takes the Unicode rules for all text, the fast one a stream of
// terms that takes a table for what is ASCII.
[[nodiscard]] std::unique_ptr<Tokenizer> NewLexemonTokenizer(const std::string& locale);
[[nodiscard]] std::unique_ptr<Tokenizer> NewFastLexemonTokenizer(const std::string& locale);

// Splits at blanks and cleans nothing. Its text form appends the text as it is, without a blank at
// the end, and the positions where runs of other bytes begin. In its list form the first of two
// words keeps all but one of the blanks between them.
[[nodiscard]] std::unique_ptr<Tokenizer> NewSpaceTokenizer();

}  // namespace tokenizer

// True for a UTF-16 unit that is white space, a line end, punctuation, a control or format
// character or a symbol.
[[nodiscard]] bool isSpecialUnit(char16_t unit);

// True when the last unit is such a one: a query word that is typed to its end. False for an empty
// text.
[[nodiscard]] bool hasTrailingSpecialChar(TLStringView text);
