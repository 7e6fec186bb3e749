#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <set>
#include <stdexcept>

#include "bench/ChildProcess.h"
#include "bench/Corpus.h"
#include "bench/peers/Peers.h"

// Compares this daemon with other mail indexers: the same mail and the same queries in one run.
namespace {

using peers::Figures;
using peers::SearchTimes;
using peers::Workload;

// In the order of measurement.
const std::vector<std::string> kSystems{"tallow", "tallow_rpc", "raw", "mu", "notmuch", "fts5"};

struct Options {
  std::string maildir = TALLOW_SAMPLE_MAILDIR;
  std::string queryFile;
  size_t queries = 200;
  uint32_t seed = 1;
  std::vector<std::string> only = kSystems;
  size_t turns = 1;
  bool optimizeFts5 = false;
  bool requireAll = false;

  [[nodiscard]] bool has(const char* system) const {
    return std::find(only.begin(), only.end(), system) != only.end();
  }
};

// Hands out queries, never the same twice. Searches ignore case.
class NewQueries {
 public:
  explicit NewQueries(bench::QuerySource& source) : _source(source) {}

  [[nodiscard]] std::vector<std::string> of(const std::vector<std::string>& given) {
    std::vector<std::string> queries;
    for (const std::string& query : given) {
      if (isNew(query)) queries.push_back(query);
    }
    return queries;
  }

  // Queries of one, two, three, one, ... words; fewer if the mail has no others.
  [[nodiscard]] std::vector<std::string> draw(size_t count) {
    constexpr int kMaxTries = 10000;  // for one
    std::vector<std::string> queries;
    for (int tries = 0; queries.size() < count && tries < kMaxTries; ++tries) {
      std::string query = _source.draw(1 + queries.size() % bench::kMaxWords);
      if (!isNew(query)) continue;
      queries.push_back(std::move(query));
      tries = 0;
    }
    return queries;
  }

 private:
  bool isNew(const std::string& query) {
    std::vector<std::string> words = bench::wordsOfQuery(query);
    for (std::string& word : words) {
      for (char& c : word) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    }
    return _given.insert(std::move(words)).second;
  }

  bench::QuerySource& _source;
  std::set<std::vector<std::string>> _given;
};

double megabytes(double bytes) {
  return bytes / 1e6;
}

// Prints each line as soon as it is complete, because the whole run takes long.
void printLine(const std::string& line) {
  fmt::print("{}\n", line);
  std::fflush(stdout);
}

double milliseconds(const SearchTimes& times, double part) {
  return times.at(part) * 1e3;
}

std::string queryText(const Figures& figures) {
  return fmt::format(
      "p50_ms={:.2f} p95_ms={:.2f} max_ms={:.2f} again_p50_ms={:.2f} again_p95_ms={:.2f} "
      "results={}",
      milliseconds(figures.first, 0.5), milliseconds(figures.first, 0.95),
      milliseconds(figures.first, 1), milliseconds(figures.again, 0.5),
      milliseconds(figures.again, 0.95), figures.first.results());
}

void printSystem(const std::string& name, const Figures& figures, const std::string& more = "") {
  printLine(fmt::format(
      "system={} mails_per_s={:.0f} cpu_s={:.2f} disk_mb={:.1f} rss_peak_mb={:.1f} {} "
      "start_ms={:.2f}{}",
      name, figures.mailsPerSecond, figures.cpuSeconds, megabytes(figures.diskBytes),
      megabytes(figures.residentPeak), queryText(figures), figures.startSeconds * 1e3, more));
}

void printDuringMerge(const char* name, const peers::DuringMerge& figures) {
  printLine(fmt::format(
      "{0}_p50_ms={1:.2f} {0}_p95_ms={2:.2f} {0}_max_ms={3:.2f} queries={4} "
      "merges={5} mails_fed={6}",
      name, milliseconds(figures.times, 0.5), milliseconds(figures.times, 0.95),
      milliseconds(figures.times, 1), figures.times.queries(), figures.merges, figures.mailsFed));
}

void printTallow(const peers::TallowFigures& tallow) {
  printSystem(
      "tallow", tallow,
      fmt::format(" rss_anon_peak_mb={:.1f} settle_s={:.1f} merges={}",
                  megabytes(tallow.anonymousPeak), tallow.settleSeconds, tallow.settleMerges));
  printDuringMerge("during_merge", tallow.duringMerge);
  printDuringMerge("during_merge_and_ingest", tallow.duringIngest);
}

void printEncoded(const Workload& work, const peers::EncodedFigures& encoded) {
  const auto mails = static_cast<double>(work.mails);
  printLine(fmt::format(
      "system=tallow_rpc mails_per_s={:.0f} suffixes={:.0f} suffixes_per_s={:.0f} cpu_s={:.2f} "
      "rss_anon_peak_mb={:.1f}",
      mails / encoded.seconds, encoded.suffixes, encoded.suffixes / encoded.seconds,
      encoded.cpuSeconds, megabytes(encoded.anonymousPeak)));
}

void printRaw(const Workload& work, const peers::EncodedFigures& encoded) {
  const auto mails = static_cast<double>(work.mails);
  printLine(fmt::format("system=raw mails_per_s={:.0f} suffixes_per_s={:.0f} disk_mb={:.1f}",
                        mails / encoded.rawSeconds, encoded.suffixes / encoded.rawSeconds,
                        megabytes(encoded.rawDiskBytes)));
}

// Raw batches take their keys from an index, so one is created in any case.
peers::EncodedFigures measureEncoded(const Workload& work, const Options& options) {
  if (!options.has("tallow_rpc") && !options.has("raw")) return {};
  const peers::EncodedFigures encoded = peers::measureEncoded(work, options.has("raw"));
  if (options.has("tallow_rpc")) printEncoded(work, encoded);
  if (options.has("raw")) printRaw(work, encoded);
  return options.has("tallow_rpc") ? encoded : peers::EncodedFigures{};
}

// A program that may be missing.
struct Tool {
  const char* name;
  Figures (*measure)(const Workload&);
  bool chosen;
  std::optional<std::string> version;
};

Figures measureTool(const Tool& tool, const Workload& work) {
  if (!tool.chosen) return {};
  if (!tool.version) {
    printLine(fmt::format("system={} not_installed=1", tool.name));
    return {};
  }
  const Figures figures = tool.measure(work);
  printSystem(tool.name, figures, " version=" + *tool.version);
  return figures;
}

// Checks the programs before hours of work, not after.
void findTools(std::vector<Tool>& tools, const Options& options,
               const bench::ScratchDirectory& scratch) {
  for (Tool& tool : tools) {
    if (!tool.chosen) continue;
    tool.version = bench::versionOf(tool.name, scratch / "version");
    if (tool.version) continue;
    if (options.requireAll) throw std::runtime_error(std::string(tool.name) + " is not installed");
    fmt::print(stderr, "peers_benchmark: {} is not installed; its ratios will be nan\n", tool.name);
  }
}

Workload prepare(const Options& options, bench::ItemSpool& spool) {
  const std::string maildir = std::filesystem::canonical(options.maildir);
  bench::QuerySource source(options.seed);
  spool.fill({maildir}, [&](const client::EncodedItem& item) { source.see(item); });
  if (spool.items() == 0) throw std::runtime_error(maildir + ": there is no mail");
  Workload work{maildir, spool.path(), spool.items(), {}, {}, {}};
  NewQueries newQueries(source);
  work.queries = options.queryFile.empty() ? newQueries.draw(options.queries)
                                           : newQueries.of(bench::readQueries(options.queryFile));
  work.warmUp = newQueries.draw(work.queries.size());
  work.duringMerge = newQueries.draw(work.queries.size());
  printLine(fmt::format("mails={} unreadable={} mail_mb={:.1f} queries={} warm_up={}",
                        spool.items(), spool.unreadable(),
                        megabytes(static_cast<double>(spool.mailBytes())), work.queries.size(),
                        work.warmUp.size()));
  return work;
}

peers::TallowFigures measureTallow(const Workload& work, const Options& options) {
  if (!options.has("tallow")) return {};
  const peers::TallowFigures tallow = peers::measureTallow(work);
  printTallow(tallow);
  return tallow;
}

Figures measureFts5(const Workload& work, const Options& options) {
  if (!options.has("fts5")) return {};
  const Figures fts5 = peers::measureFts5(work, options.optimizeFts5);
  printSystem("fts5", fts5, options.optimizeFts5 ? " optimized=1" : "");
  return fts5;
}

// How many times as fast as mu. The speed of the machine may drift between measurements. With more
// than one turn, both index the mail again, one right after the other, and the times of all turns
// are added up.
double rateBesideMu(const Workload& work, const Figures& tallow, const Figures& mu, size_t turns) {
  double ours = 1 / tallow.mailsPerSecond;
  double theirs = 1 / mu.mailsPerSecond;
  for (size_t turn = 2; turn <= turns && !std::isnan(ours + theirs); ++turn) {
    const Figures us = peers::indexByTallow(work);
    const Figures them = peers::indexByMu(work);
    ours += 1 / us.mailsPerSecond;
    theirs += 1 / them.mailsPerSecond;
    printLine(
        fmt::format("turn={} tallow_mails_per_s={:.0f} tallow_cpu_s={:.2f} mu_mails_per_s={:.0f} "
                    "mu_cpu_s={:.2f}",
                    turn, us.mailsPerSecond, us.cpuSeconds, them.mailsPerSecond, them.cpuSeconds));
  }
  return theirs / ours;
}

void measureAll(const Options& options) {
  std::vector<Tool> tools{{"mu", peers::measureMu, options.has("mu"), {}},
                          {"notmuch", peers::measureNotmuch, options.has("notmuch"), {}}};
  const bench::ScratchDirectory scratch;
  findTools(tools, options, scratch);
  bench::ItemSpool spool(scratch);
  const Workload work = prepare(options, spool);

  const peers::TallowFigures tallow = measureTallow(work, options);
  const peers::EncodedFigures encoded = measureEncoded(work, options);
  const Figures mu = measureTool(tools[0], work);
  const double besideMu = rateBesideMu(work, tallow, mu, options.turns);
  const Figures notmuch = measureTool(tools[1], work);
  const Figures fts5 = measureFts5(work, options);
  printLine(fmt::format(
      "ratios index_vs_mu={:.2f} index_vs_notmuch={:.2f} index_vs_raw={:.2f} "
      "query_p50_vs_fts5={:.2f} query_p95_vs_fts5={:.2f} query_p50_vs_mu={:.2f} "
      "query_p95_vs_mu={:.2f} disk_vs_fts5={:.2f} rss_anon_mb={:.1f}",
      besideMu, tallow.mailsPerSecond / notmuch.mailsPerSecond,
      encoded.rawSeconds / encoded.seconds, tallow.first.at(0.5) / fts5.first.at(0.5),
      tallow.first.at(0.95) / fts5.first.at(0.95), tallow.first.at(0.5) / mu.first.at(0.5),
      tallow.first.at(0.95) / mu.first.at(0.95), tallow.diskBytes / fts5.diskBytes,
      megabytes(std::fmax(tallow.anonymousPeak, encoded.anonymousPeak))));
}

int run(int argc, char** argv) {
  Options options;
  CLI::App app("Measures this daemon beside mu, notmuch and SQLite FTS5 on the same mail.",
               "peers_benchmark");
  app.add_option("MAILDIR", options.maildir, "The Maildir to index (default: of the sample mail)")
      ->check(CLI::ExistingDirectory);
  app.add_option("QUERIES", options.queryFile,
                 "File of queries, one a line (default: drawn from the mail)")
      ->check(CLI::ExistingFile);
  app.add_option("--queries", options.queries, "How many to draw without a file (default: 200)")
      ->check(CLI::Range(size_t{1}, size_t{1000000}));
  app.add_option("--seed", options.seed, "Of the choice of words (default: 1)");
  app.add_option("--only", options.only,
                 "Which to measure, parted by commas (default: tallow,tallow_rpc,raw,mu,notmuch,"
                 "fts5); the others' ratios are nan")
      ->delimiter(',')
      ->allow_extra_args(false)
      ->check(CLI::IsMember(kSystems));
  app.add_option(
         "--turns", options.turns,
         "How often this daemon and mu index the mail in turns for index_vs_mu (default: 1)")
      ->check(CLI::Range(size_t{1}, size_t{100}));
  app.add_flag("--optimize-fts5", options.optimizeFts5,
               "Merge the index of FTS5 into one segment before it is searched");
  app.add_flag("--require-all", options.requireAll,
               "Fail when mu or notmuch is to be measured and not installed");
  CLI11_PARSE(app, argc, argv);
  measureAll(options);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("peers_benchmark", run, argc, argv);
}
