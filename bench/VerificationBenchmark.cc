#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <fstream>
#include <random>
#include <set>
#include <stdexcept>
#include <unordered_map>

#include "bench/Corpus.h"
#include "bench/DaemonRun.h"
#include "bench/Percentiles.h"
#include "bench/Queries.h"
#include "parameters/TLParamsManager.h"
#include "querylang/TLQueryAdditions.h"

// Measures how long the daemon takes to answer verification queries, through its index and by
// reading all messages, and checks the answers.
namespace {

using Identifiers = std::multiset<TLString>;

constexpr size_t kCounts[] = {5, 50, 1000};

struct Path {
  const char* name;
  const char16_t* parameters;  // more results than this from the index are not trusted
};
constexpr Path kPaths[] = {{"regular", u"salt.maxTopK=100000000"}, {"linear", u"salt.maxTopK=1"}};

// The identifiers of the mails by subject.
class Subjects {
 public:
  void see(const client::EncodedItem& encoded) {
    TLIndexableItem item;
    if (!item.initWithData(encoded.bytes)) throw std::runtime_error("an item does not parse");
    const auto& subject = item.stringValueForKey(TLAttributeKey::SUBJECT);
    if (!subject) return;
    auto& identifiers = _identifiers[*subject];
    if (identifiers.empty()) _order.push_back(*subject);
    identifiers.push_back(*item.identifier());
  }
  void shuffle(uint32_t seed) {
    std::mt19937 random(seed);
    for (size_t i = _order.size(); i > 1; --i) std::swap(_order[i - 1], _order[random() % i]);
  }
  // `count` distinct subjects, or all, from a position that advances with `round`.
  [[nodiscard]] std::vector<TLString> some(size_t count, size_t round) const {
    std::vector<TLString> subjects;
    for (size_t i = 0; i < std::min(count, _order.size()); ++i) {
      subjects.push_back(_order[(round * count + i) % _order.size()]);
    }
    return subjects;
  }
  [[nodiscard]] Identifiers mailsWith(const std::vector<TLString>& subjects) const {
    Identifiers identifiers;
    for (const TLString& subject : subjects) {
      const auto& more = _identifiers.at(subject);
      identifiers.insert(more.begin(), more.end());
    }
    return identifiers;
  }
  [[nodiscard]] size_t size() const { return _order.size(); }

 private:
  std::vector<TLString> _order;
  std::unordered_map<TLString, std::vector<TLString>> _identifiers;
};

std::shared_ptr<TLQuery> queryFor(const std::vector<TLString>& subjects, const Path& path) {
  std::string text;
  for (const TLString& subject : subjects) {
    text += text.empty() ? "(" : " || ";
    text += "kTLItemSubject = '" + sq::escaped(platform::toUTF8(subject)) + "'";
  }
  auto query = TLQueryAdditions::initWithBeaconQueryString(platform::fromUTF8(text + ")"), true);
  query->setSearchParams(TLParamsManager::paramsFromString(path.parameters));
  return query;
}

Identifiers search(client::SearchServiceProxy& service, const TLQuery& query) {
  std::optional<TLError> error;
  const auto items = service.searchItems(query, 0, bench::kProtectionClass,
                                         client::SearchServiceProxy::kNoMaximum, &error);
  if (!items) throw std::runtime_error(platform::printable(error));
  Identifiers identifiers;
  for (const auto& item : *items) identifiers.insert(*item->identifier());
  return identifiers;
}

// How often the daemon has read all messages.
size_t linearSearchesIn(const std::string& path) {
  std::ifstream log(path);
  size_t searches = 0;
  for (std::string line; std::getline(log, line);) {
    if (line.find("will use a slow linear search") != std::string::npos) ++searches;
  }
  return searches;
}

int run(int argc, char** argv) {
  std::vector<std::string> paths{TALLOW_SAMPLE_MAIL};
  size_t rounds = 5;
  uint32_t seed = 1;
  CLI::App app("Times verification queries, by the index and by reading all messages.",
               "verification_benchmark");
  app.add_option("MAIL", paths, "Maildirs, mbox files, directories (default: the sample mail)");
  app.add_option("--rounds", rounds, "Queries of each kind (default: 5)")
      ->check(CLI::Range(size_t{1}, size_t{1000000}));
  app.add_option("--seed", seed, "Of the choice of subjects (default: 1)");
  CLI11_PARSE(app, argc, argv);

  const bench::ScratchDirectory scratch;
  bench::ItemSpool spool(scratch);
  Subjects subjects;
  spool.fill(paths, [&](const client::EncodedItem& item) { subjects.see(item); });
  subjects.shuffle(seed);
  bench::DaemonRun daemon(scratch, scratch / "state");
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  spool.send(service);
  static_cast<void>(bench::timedSearch(service, "warm"));

  size_t wrong = 0;
  std::string line = fmt::format("mails={} subjects={}", spool.items(), subjects.size());
  for (const size_t count : kCounts) {
    for (const Path& path : kPaths) {
      bench::Percentiles times;
      for (size_t round = 0; round < rounds; ++round) {
        const std::vector<TLString> some = subjects.some(count, round);
        const auto query = queryFor(some, path);
        const double start = bench::secondsNow();
        const Identifiers found = search(service, *query);
        times.add(bench::secondsNow() - start);
        if (found != subjects.mailsWith(some)) ++wrong;
      }
      line += fmt::format(" {}_{}_median_ms={:.2f} {}_{}_max_ms={:.2f}", path.name, count,
                          times.at(0.5) * 1e3, path.name, count, times.at(1) * 1e3);
    }
  }
  daemon.stop();
  const size_t searches = linearSearchesIn(scratch / "daemon.log");
  fmt::print("{} regular_that_walked={} wrong_answers={}\n", line,
             searches - rounds * std::size(kCounts), wrong);
  return wrong == 0 ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("verification_benchmark", run, argc, argv);
}
