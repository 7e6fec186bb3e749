#pragma once

#include <cstddef>
#include <string>
#include <vector>

// A word of a query that found too little, and what the search looked for in its place.
struct WordReplacement {
  enum class Reason { spelling, synonym, stem };

  std::string typed;        // UTF-8, as the tokenizer cleans it
  std::string replacement;  // for a stem: all words that begin with it
  Reason reason = Reason::spelling;
};
using WordReplacements = std::vector<WordReplacement>;

// A list holds no more words, and no longer ones, in bytes; others are left out of it.
inline constexpr size_t kMaxWordReplacements = 64;
inline constexpr size_t kMaxReplacedWordSize = 256;
