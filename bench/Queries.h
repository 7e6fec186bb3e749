#pragma once

#include <array>
#include <cstdint>
#include <random>
#include <string>
#include <vector>

#include "bench/Corpus.h"
#include "client/Batches.h"
#include "client/SearchServiceProxy.h"

// Searches as users type them.
namespace bench {

// Upper bound of words in a query.
inline constexpr size_t kMaxWords = 3;

// Number of results a search asks for: enough for a list on a screen.
inline constexpr int64_t kMaxResults = 50;

// Draws queries from a uniform sample, of fixed size, of the mail it is shown once. The same mail
// and seed give the same queries.
class QuerySource {
 public:
  explicit QuerySource(uint32_t seed) : _random(seed) {}

  void see(const client::EncodedItem& encoded);

  // `words` consecutive words of ASCII letters from a subject or a body, joined by spaces, the last
  // one cut to its first letters.
  [[nodiscard]] std::string draw(size_t words);

  // Queries of one, two, three, one, ... words.
  [[nodiscard]] std::vector<std::string> drawAll(size_t count);

  // Three whole words, one of which, with at least five letters, has one letter wrong, missing,
  // doubled or swapped with its neighbour; and the mistyped word by itself.
  struct Mistyped {
    std::string query;
    std::string word;
  };
  [[nodiscard]] Mistyped drawMistyped();

 private:
  // Unlike the distributions of the library, the remainder is the same on every platform.
  size_t below(size_t limit) { return _random() % limit; }

  // Consecutive words of ASCII letters.
  std::vector<std::string> phrase(size_t words);
  std::string mistype(std::string word);

  std::mt19937 _random;
  size_t _seen = 0;
  std::vector<std::array<std::vector<std::string>, 2>> _mails;  // words of subject and body
};

// A file of queries has one per line. Both functions throw if the file cannot be read or written,
// or contains no query.
[[nodiscard]] std::vector<std::string> readQueries(const std::string& path);
void writeQueries(const std::vector<std::string>& queries, const std::string& path);

[[nodiscard]] std::vector<std::string> wordsOfQuery(const std::string& query);

struct TimedSearch {
  double seconds;
  size_t results;
};

// One search through the daemon, from the call to the decoded items. Throws on failure. With
// `asTyped` the query is not modified.
[[nodiscard]] TimedSearch timedSearch(client::SearchServiceProxy& service, const std::string& query,
                                      bool asTyped = false,
                                      const std::string& protectionClass = kProtectionClass);

}  // namespace bench
