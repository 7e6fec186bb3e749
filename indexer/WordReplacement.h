#pragma once

#include <cstddef>
#include <string>
#include <vector>

// A query word with too few results and what the search used in its place.
struct WordReplacement {
  enum class Reason { spelling, synonym, stem };

  std::string typed;        // UTF-8, as the tokenizer cleans it
  std::string replacement;  // for a stem: all words that begin with it
  Reason reason = Reason::spelling;
};
using WordReplacements = std::vector<WordReplacement>;

// Upper bounds of the words in a list, and of their lengths in bytes; other words are left out.
inline constexpr size_t kMaxWordReplacements = 64;
inline constexpr size_t kMaxReplacedWordSize = 256;
