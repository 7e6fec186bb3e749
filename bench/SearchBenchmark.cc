#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <array>

#include "bench/Corpus.h"
#include "bench/DaemonRun.h"
#include "bench/Percentiles.h"
#include "bench/Queries.h"

// How long the daemon takes to answer while somebody types.
namespace {

std::string figures(const std::string& name, const bench::Percentiles& times) {
  return fmt::format(" {}_median_ms={:.2f} {}_p95_ms={:.2f} {}_max_ms={:.2f}", name,
                     times.at(0.5) * 1e3, name, times.at(0.95) * 1e3, name, times.at(1) * 1e3);
}

int run(int argc, char** argv) {
  std::vector<std::string> paths{TALLOW_SAMPLE_MAIL};
  std::string stateDirectory;
  std::string queryFile;
  size_t queryCount = 200;
  uint32_t seed = 1;
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
  app.add_flag("-v,--verbose", verbose, "Print each query with its results and milliseconds");
  CLI11_PARSE(app, argc, argv);
  const bool indexed = !stateDirectory.empty();

  const bench::ScratchDirectory scratch;
  if (!indexed) stateDirectory = scratch / "state";
  bench::ItemSpool spool(scratch);
  bench::QuerySource source(seed);
  spool.fill(paths, [&](const client::EncodedItem& item) { source.see(item); });
  const std::vector<std::string> queries = source.drawAll(queryCount);
  if (!queryFile.empty()) {
    bench::writeQueries(queries, queryFile);
    return 0;
  }

  bench::DaemonRun daemon(scratch, stateDirectory);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  if (!indexed) spool.send(service);
  static_cast<void>(bench::timedSearch(service, "warm"));  // opens the index
  bench::Percentiles all;
  std::array<bench::Percentiles, bench::kMaximumWords> byWords;
  uint64_t results = 0;
  const double cpuBefore = daemon.cpuSeconds();
  for (size_t i = 0; i < queries.size(); ++i) {
    const bench::TimedSearch timed = bench::timedSearch(service, queries[i]);
    all.add(timed.seconds);
    byWords[i % bench::kMaximumWords].add(timed.seconds);
    results += timed.results;
    if (verbose) fmt::print("{:8.2f} {:3} {}\n", timed.seconds * 1e3, timed.results, queries[i]);
  }
  const double cpu = (daemon.cpuSeconds() - cpuBefore) / static_cast<double>(queries.size());
  const bench::Memory memory = daemon.memory();
  daemon.stop();

  std::string line =
      fmt::format("queries={} results={}", queries.size(), results) + figures("all", all);
  for (size_t i = 0; i < bench::kMaximumWords; ++i) {
    line += figures(fmt::format("words{}", i + 1), byWords[i]);
  }
  fmt::print("{} daemon_cpu_ms_per_query={:.2f} rss_anon_peak_mb={:.1f}\n", line, cpu * 1e3,
             static_cast<double>(memory.anonymousPeak) / 1e6);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("search_benchmark", run, argc, argv);
}
