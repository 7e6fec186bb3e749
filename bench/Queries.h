#pragma once

#include <array>
#include <cstdint>
#include <random>
#include <string>
#include <vector>

#include "bench/Corpus.h"
#include "client/Batches.h"
#include "client/SearchServiceProxy.h"

// Searches as somebody types them.
namespace bench {

// A query has one to this many words.
inline constexpr size_t kMaximumWords = 3;

// How many results a search asks for: what a list on a screen has use for.
inline constexpr int64_t kMaximumResults = 50;

// Draws queries from mail that it sees once: a sample of fixed size in which each mail has the same
// chance to be. The same mail and seed give the same queries.
class QuerySource {
 public:
  explicit QuerySource(uint32_t seed) : _random(seed) {}

  void see(const client::EncodedItem& encoded);

  // `words` words of ASCII letters that follow one another in a subject or a body, parted by
  // blanks, the last cut to its first letters.
  [[nodiscard]] std::string draw(size_t words);

  // Queries of one, two, three, one ... words.
  [[nodiscard]] std::vector<std::string> drawAll(size_t count);

  // Three whole words of which one, of five letters or more, has one letter wrong, missing, doubled
  // or exchanged with its neighbour; the mistyped word by itself as well.
  struct Mistyped {
    std::string query;
    std::string word;
  };
  [[nodiscard]] Mistyped drawMistyped();

 private:
  // The remainder is the same everywhere, which distributions of the library are not.
  size_t below(size_t limit) { return _random() % limit; }

  // Words of ASCII letters that follow one another.
  std::vector<std::string> phrase(size_t words);
  std::string mistype(std::string word);

  std::mt19937 _random;
  size_t _seen = 0;
  std::vector<std::array<std::vector<std::string>, 2>> _mails;  // words of subject and body
};

// A file of queries has one a line. Both throw when it cannot be read or written; one that holds
// no query cannot be read.
[[nodiscard]] std::vector<std::string> readQueries(const std::string& path);
void writeQueries(const std::vector<std::string>& queries, const std::string& path);

[[nodiscard]] std::vector<std::string> wordsOfQuery(const std::string& query);

struct TimedSearch {
  double seconds;
  size_t results;
};

// One search through the daemon, from the call to the decoded items. Throws when it fails. With
// `asTyped` words that find nothing are not changed.
[[nodiscard]] TimedSearch timedSearch(client::SearchServiceProxy& service, const std::string& query,
                                      bool asTyped = false,
                                      const std::string& protectionClass = kProtectionClass);

}  // namespace bench
