#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <array>

#include "bench/Corpus.h"
#include "bench/DaemonRun.h"
#include "bench/Percentiles.h"
#include "bench/Queries.h"

// Measures the response time of the daemon while a user types.
namespace {

std::string figures(const std::string& name, const bench::Percentiles& times) {
  return fmt::format(" {}_median_ms={:.2f} {}_p95_ms={:.2f} {}_max_ms={:.2f}", name,
                     times.at(0.5) * 1e3, name, times.at(0.95) * 1e3, name, times.at(1) * 1e3);
}

// Queries with one word that the daemon does not find at all.
std::vector<std::string> mistypedQueries(client::SearchServiceProxy& service,
                                         bench::QuerySource& source, size_t count) {
  std::vector<std::string> queries;
  for (size_t tries = 100 * count; queries.size() < count; --tries) {
    if (tries == 0) throw std::runtime_error("mistyped words are words of the mail");
    const auto mistyped = source.drawMistyped();
    // A word that is found in any form is no mistake; at the end, a single word is a prefix.
    if (bench::timedSearch(service, mistyped.word, true).results == 0) {
      queries.push_back(mistyped.query);
    }
  }
  return queries;
}

struct Timed {
  bench::Percentiles times;
  size_t found = 0;  // queries with results
  double cpu = 0;    // of the daemon, seconds per query
};

Timed timeQueries(bench::DaemonRun& daemon, client::SearchServiceProxy& service,
                  const std::vector<std::string>& queries, bool verbose) {
  Timed timed;
  const double cpuBefore = daemon.cpuSeconds();
  for (const std::string& query : queries) {
    const bench::TimedSearch search = bench::timedSearch(service, query);
    timed.times.add(search.seconds);
    if (search.results != 0) ++timed.found;
    if (verbose) fmt::print("{:8.2f} {:3} {}\n", search.seconds * 1e3, search.results, query);
  }
  timed.cpu = (daemon.cpuSeconds() - cpuBefore) / static_cast<double>(queries.size());
  return timed;
}

int run(int argc, char** argv) {
  std::vector<std::string> paths{TALLOW_SAMPLE_MAIL};
  std::string stateDirectory;
  std::string queryFile;
  std::string givenQueries;
  size_t queryCount = 200;
  uint32_t seed = 1;
  size_t mistypedCount = 0;
  bool verbose = false;
  CLI::App app("Times searches for one to three words of the mail, the last one cut short.",
               "search_benchmark");
  app.add_option("MAIL", paths, "Maildirs, mbox files, directories (default: the sample mail)");
  app.add_option(
      "--state", stateDirectory,
      "Search the index that ingest_benchmark has kept here instead of indexing the mail");
  app.add_option("--queries", queryCount, "How many (default: 200)")
      ->check(CLI::Range(size_t{1}, size_t{10000000}));
  app.add_option("--seed", seed, "Of the choice of words (default: 1)");
  app.add_option("--write-queries", queryFile,
                 "Write the queries to this file, one a line, instead of searching");
  app.add_option("--read-queries", givenQueries,
                 "Take the queries from this file; with --state, no mail is read then");
  app.add_option("--mistyped", mistypedCount,
                 "Time so many queries of three words more, one of them mistyped");
  app.add_flag("-v,--verbose", verbose, "Print each query with its results and milliseconds");
  CLI11_PARSE(app, argc, argv);
  const bool indexed = !stateDirectory.empty();

  const bench::ScratchDirectory scratch;
  if (!indexed) stateDirectory = scratch / "state";
  bench::ItemSpool spool(scratch);
  bench::QuerySource source(seed);
  const bool needsMail = givenQueries.empty() || !indexed || mistypedCount > 0;
  if (needsMail) spool.fill(paths, [&](const client::EncodedItem& item) { source.see(item); });
  const std::vector<std::string> queries =
      givenQueries.empty() ? source.drawAll(queryCount) : bench::readQueries(givenQueries);
  if (!queryFile.empty()) {
    bench::writeQueries(queries, queryFile);
    return 0;
  }

  bench::DaemonRun daemon(scratch, stateDirectory);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  if (!indexed) spool.send(service);
  static_cast<void>(bench::timedSearch(service, "warm"));  // opens the index
  const std::vector<std::string> mistyped = mistypedQueries(service, source, mistypedCount);
  // The first search makes the index build the Bloom filter that later ones use.
  if (!mistyped.empty()) static_cast<void>(bench::timedSearch(service, mistyped.front()));
  bench::Percentiles all;
  std::array<bench::Percentiles, bench::kMaxWords> byWords;
  uint64_t results = 0;
  const double cpuBefore = daemon.cpuSeconds();
  for (size_t i = 0; i < queries.size(); ++i) {
    const bench::TimedSearch timed = bench::timedSearch(service, queries[i]);
    all.add(timed.seconds);
    byWords[i % bench::kMaxWords].add(timed.seconds);
    results += timed.results;
    if (verbose) fmt::print("{:8.2f} {:3} {}\n", timed.seconds * 1e3, timed.results, queries[i]);
  }
  const double cpu = (daemon.cpuSeconds() - cpuBefore) / static_cast<double>(queries.size());
  const Timed second = mistyped.empty() ? Timed() : timeQueries(daemon, service, mistyped, verbose);
  const bench::Memory memory = daemon.memory();
  daemon.stop();

  std::string line =
      fmt::format("queries={} results={}", queries.size(), results) + figures("all", all);
  for (size_t i = 0; i < bench::kMaxWords; ++i) {
    line += figures(fmt::format("words{}", i + 1), byWords[i]);
  }
  if (!mistyped.empty()) {
    line += figures("mistyped", second.times);
    line += fmt::format(
        " mistyped_found={} mistyped_daemon_cpu_ms_per_query={:.2f} "
        "mistyped_vs_first={:.2f} mistyped_vs_first_cpu={:.2f}",
        second.found, second.cpu * 1e3, second.times.at(0.5) / all.at(0.5), second.cpu / cpu);
  }
  fmt::print("{} daemon_cpu_ms_per_query={:.2f} rss_anon_peak_mb={:.1f}\n", line, cpu * 1e3,
             static_cast<double>(memory.anonymousPeak) / 1e6);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("search_benchmark", run, argc, argv);
}
