#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "platform/Log.h"
#include "salt/Index.h"
#include "salt/Search.h"

// The last resort for a query that found too little: each single word of it becomes its stem, as a
// prefix, so that an inflected form finds its relatives.
//
// Threads: one caller at a time.
class TALStemRewrite {
 public:
  // Most terms of a query that a rewrite changes; the rest stay as typed.
  static constexpr size_t MAX_TOKENS_TO_STEM = 10;

  // Fills `stemmedTerms` with the terms, each single word of at least 3 bytes (a trailing blank
  // counts) as its stem without blank, whether it was found or not. True when the result is usable:
  // some word was changed, and each stem begins some text of the index. After false the contents of
  // `stemmedTerms` mean nothing.
  [[nodiscard]] bool stemRewrite(const std::vector<saltsearch::Term>& terms,
                                 std::vector<saltsearch::Term>& stemmedTerms,
                                 const salt::Index& withTextStore);

  // The stem of the term's first token; empty when no document has a word that begins with it.
  [[nodiscard]] static std::string getStemToken(saltsearch::Term term,
                                                const salt::Index& textStore);

  static const platform::Log& log();

 private:
  [[nodiscard]] static bool _doNotStem(const saltsearch::Term& term);

  const salt::Index* _textStore = nullptr;  // of the call in hand
};
