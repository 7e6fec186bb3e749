#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "platform/Log.h"
#include "salt/Index.h"
#include "salt/Search.h"

// Stemming, the last resort for a query with too few results: replaces each single word by its stem
// as a prefix, so that a search for an inflected form finds related forms.
//
// Threads: one caller at a time.
class TALStemRewrite {
 public:
  // Upper bound of terms that a rewrite changes; the others stay as typed.
  static constexpr size_t MAX_TOKENS_TO_STEM = 10;

  // Fills `stemmedTerms` with the terms, each single word of at least 3 bytes (including a trailing
  // space) replaced by its stem without a space, whether it was found or not. True when some word
  // changed and the index has a text for each stem. After false `stemmedTerms` is unspecified.
  [[nodiscard]] bool stemRewrite(const std::vector<saltsearch::Term>& terms,
                                 std::vector<saltsearch::Term>& stemmedTerms,
                                 const salt::Index& withTextStore);

  // The stem of the term's first token; empty when no document has a word beginning with it.
  [[nodiscard]] static std::string getStemToken(saltsearch::Term term,
                                                const salt::Index& textStore);

  static const platform::Log& log();

 private:
  [[nodiscard]] static bool _doNotStem(const saltsearch::Term& term);

  const salt::Index* _textStore = nullptr;  // of the current call
};
