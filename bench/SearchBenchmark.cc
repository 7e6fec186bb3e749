#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <array>
#include <random>
#include <stdexcept>

#include "bench/Corpus.h"
#include "bench/DaemonRun.h"
#include "bench/Percentiles.h"

// How long the daemon takes to answer while somebody types.
namespace {

constexpr size_t kSampledMails = 2000;
constexpr size_t kSampledUnits = 20000;  // of a body, in UTF-16 units
constexpr size_t kMaximumWords = 3;
constexpr size_t kLongestPrefix = 4;
constexpr size_t kShortestWord = 2;
constexpr int64_t kMaximumResults = 50;

bool isLetter(char16_t unit) {
  return (unit | 0x20) >= u'a' && (unit | 0x20) <= u'z';
}

// The words of a text that are ASCII letters alone, in order.
std::vector<std::string> wordsOf(TLStringView text) {
  std::vector<std::string> words;
  for (size_t at = 0; at < text.size();) {
    const size_t start = at;
    while (at < text.size() && isLetter(text[at])) ++at;
    if (at - start >= kShortestWord)
      words.push_back(platform::toUTF8(text.substr(start, at - start)));
    if (at == start) ++at;
  }
  return words;
}

struct Query {
  std::string text;
  size_t words;
};

// Draws queries from mail that it sees once: a sample of fixed size in which each mail has the same
// chance to be. The same mail and seed give the same queries.
class QuerySource {
 public:
  explicit QuerySource(uint32_t seed) : _random(seed) {}

  void see(const client::EncodedItem& encoded) {
    const size_t place = _seen < kSampledMails ? _seen : below(_seen + 1);
    ++_seen;
    if (place >= kSampledMails) return;
    TLIndexableItem item;
    if (!item.initWithData(encoded.bytes)) throw std::runtime_error("an item does not parse");
    const TLStringView body =
        platform::orEmpty(item.stringValueForKey(TLAttributeKey::TEXT_CONTENT));
    _mails.resize(std::max(_mails.size(), place + 1));
    _mails[place] = {wordsOf(platform::orEmpty(item.stringValueForKey(TLAttributeKey::SUBJECT))),
                     wordsOf(body.substr(0, kSampledUnits))};
  }

  // Words that follow one another in a subject or a body, the last cut to its first letters.
  [[nodiscard]] Query draw(size_t count) {
    constexpr size_t kMostTries = 100000;
    for (size_t i = 0; i < kMostTries && !_mails.empty(); ++i) {
      const auto& words = _mails[below(_mails.size())][below(2)];
      if (words.size() < count) continue;
      const size_t first = below(words.size() - count + 1);
      Query query{"", count};
      for (size_t w = 0; w + 1 < count; ++w) query.text += words[first + w] + ' ';
      query.text += words[first + count - 1].substr(0, 1 + below(kLongestPrefix));
      return query;
    }
    throw std::runtime_error("the mail has no words to search for");
  }

 private:
  // The remainder is the same everywhere, which distributions of the library are not.
  size_t below(size_t limit) { return _random() % limit; }

  std::mt19937 _random;
  size_t _seen = 0;
  std::vector<std::array<std::vector<std::string>, 2>> _mails;  // words of subject and body
};

struct Timed {
  double seconds;
  size_t results;
};

Timed search(client::SearchServiceProxy& service, const std::string& text) {
  TLQuery query;
  query.setRawQuery(platform::fromUTF8(text));
  query.setOriginalQuery(platform::fromUTF8(text));
  std::optional<TLError> error;
  const double start = bench::secondsNow();
  const auto items =
      service.searchItems(query, 0, bench::kProtectionClass, kMaximumResults, &error);
  const double seconds = bench::secondsNow() - start;
  if (!items) throw std::runtime_error("search: " + platform::printable(error));
  return {seconds, items->size()};
}

std::string figures(const std::string& name, const bench::Percentiles& times) {
  return fmt::format(" {}_median_ms={:.2f} {}_p95_ms={:.2f} {}_max_ms={:.2f}", name,
                     times.at(0.5) * 1e3, name, times.at(0.95) * 1e3, name, times.at(1) * 1e3);
}

int run(int argc, char** argv) {
  std::vector<std::string> paths{TALLOW_SAMPLE_MAIL};
  std::string stateDirectory;
  size_t queries = 200;
  uint32_t seed = 1;
  bool verbose = false;
  CLI::App app("Times searches for one to three words of the mail, the last one cut short.",
               "search_benchmark");
  app.add_option("MAIL", paths, "Maildirs, mbox files, directories (default: the sample mail)");
  app.add_option(
      "--state", stateDirectory,
      "Search the index that ingest_benchmark has kept here instead of indexing the mail");
  app.add_option("--queries", queries, "How many (default: 200)")
      ->check(CLI::Range(size_t{1}, size_t{10000000}));
  app.add_option("--seed", seed, "Of the choice of words (default: 1)");
  app.add_flag("-v,--verbose", verbose, "Print each query with its results and milliseconds");
  CLI11_PARSE(app, argc, argv);
  const bool indexed = !stateDirectory.empty();

  const bench::ScratchDirectory scratch;
  if (!indexed) stateDirectory = scratch / "state";
  bench::ItemSpool spool(scratch);
  QuerySource source(seed);
  spool.fill(paths, [&](const client::EncodedItem& item) { source.see(item); });

  bench::DaemonRun daemon(scratch, stateDirectory);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  if (!indexed) spool.send(service);
  search(service, "warm");  // opens the index
  bench::Percentiles all;
  std::array<bench::Percentiles, kMaximumWords> byWords;
  uint64_t results = 0;
  for (size_t i = 0; i < queries; ++i) {
    const Query query = source.draw(1 + i % kMaximumWords);
    const Timed timed = search(service, query.text);
    all.add(timed.seconds);
    byWords[query.words - 1].add(timed.seconds);
    results += timed.results;
    if (verbose) fmt::print("{:8.2f} {:3} {}\n", timed.seconds * 1e3, timed.results, query.text);
  }
  const bench::Memory memory = daemon.memory();
  daemon.stop();

  std::string line = fmt::format("queries={} results={}", queries, results) + figures("all", all);
  for (size_t i = 0; i < kMaximumWords; ++i) {
    line += figures(fmt::format("words{}", i + 1), byWords[i]);
  }
  fmt::print("{} rss_anon_peak_mb={:.1f}\n", line, static_cast<double>(memory.anonymousPeak) / 1e6);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("search_benchmark", run, argc, argv);
}
