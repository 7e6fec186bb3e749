#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <stdexcept>

#include "bench/ChildProcess.h"
#include "bench/Corpus.h"
#include "bench/peers/Peers.h"

// This daemon beside other indexers of mail: the same mail, the same queries, one run.
namespace {

using peers::Figures;
using peers::Workload;

struct Options {
  std::string maildir = TALLOW_SAMPLE_MAILDIR;
  std::string queryFile;
  size_t queries = 200;
  uint32_t seed = 1;
  size_t passes = 1;
  bool optimizeFts5 = false;
  bool requireAll = false;
};

double megabytes(double bytes) {
  return bytes / 1e6;
}

// Each line as soon as there is one: the whole takes its time.
void printLine(const std::string& line) {
  fmt::print("{}\n", line);
  std::fflush(stdout);
}

std::string queryText(const Figures& figures) {
  return fmt::format("p50_ms={:.2f} p95_ms={:.2f} max_ms={:.2f} results={}", figures.median * 1e3,
                     figures.percentile95 * 1e3, figures.maximum * 1e3, figures.results);
}

void printSystem(const std::string& name, const Figures& figures, const std::string& more = "") {
  printLine(fmt::format(
      "system={} mails_per_s={:.0f} cpu_s={:.2f} disk_mb={:.1f} rss_peak_mb={:.1f} {} "
      "start_ms={:.2f}{}",
      name, figures.mailsPerSecond, figures.cpuSeconds, megabytes(figures.diskBytes),
      megabytes(figures.residentPeak), queryText(figures), figures.startSeconds * 1e3, more));
}

void printTallow(const peers::TallowFigures& tallow) {
  printSystem(
      "tallow", tallow,
      fmt::format(" rss_anon_peak_mb={:.1f} settle_s={:.1f} merges={}",
                  megabytes(tallow.anonymousPeak), tallow.settleSeconds, tallow.settleMerges));
  printLine(
      fmt::format("during_merge_p50_ms={:.2f} during_merge_p95_ms={:.2f} "
                  "during_merge_max_ms={:.2f} merges={} mails_fed={}",
                  tallow.duringMerge.median * 1e3, tallow.duringMerge.percentile95 * 1e3,
                  tallow.duringMerge.maximum * 1e3, tallow.merges, tallow.mailsFed));
}

void printEncoded(const Workload& work, const peers::EncodedFigures& encoded) {
  const auto mails = static_cast<double>(work.mails);
  const auto suffixes = static_cast<double>(encoded.suffixes);
  printLine(fmt::format(
      "system=tallow_rpc mails_per_s={:.0f} suffixes={} suffixes_per_s={:.0f} cpu_s={:.2f} "
      "rss_anon_peak_mb={:.1f}",
      mails / encoded.seconds, encoded.suffixes, suffixes / encoded.seconds, encoded.cpuSeconds,
      megabytes(encoded.anonymousPeak)));
  printLine(fmt::format("system=raw mails_per_s={:.0f} suffixes_per_s={:.0f} disk_mb={:.1f}",
                        mails / encoded.rawSeconds, suffixes / encoded.rawSeconds,
                        megabytes(encoded.rawDiskBytes)));
}

// A program that may be missing.
struct Tool {
  const char* name;
  Figures (*measure)(const Workload&);
  std::optional<std::string> version;
};

Figures measureTool(const Tool& tool, const Workload& work) {
  if (!tool.version) {
    printLine(fmt::format("system={} not_installed=1", tool.name));
    return {};
  }
  const Figures figures = tool.measure(work);
  printSystem(tool.name, figures, " version=" + *tool.version);
  return figures;
}

// What is asked for before hours of work rather than after.
void findTools(std::vector<Tool>& tools, const Options& options,
               const bench::ScratchDirectory& scratch) {
  for (Tool& tool : tools) {
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
  std::vector<std::string> queries = options.queryFile.empty()
                                         ? source.drawAll(options.queries)
                                         : bench::readQueries(options.queryFile);
  printLine(fmt::format("mails={} unreadable={} mail_mb={:.1f} queries={} passes={}", spool.items(),
                        spool.unreadable(), megabytes(static_cast<double>(spool.mailBytes())),
                        queries.size(), options.passes));
  return {maildir, spool.path(), spool.items(), std::move(queries), options.passes};
}

void measureAll(const Options& options) {
  std::vector<Tool> tools{{"mu", peers::measureMu, {}}, {"notmuch", peers::measureNotmuch, {}}};
  const bench::ScratchDirectory scratch;
  findTools(tools, options, scratch);
  bench::ItemSpool spool(scratch);
  const Workload work = prepare(options, spool);

  const peers::TallowFigures tallow = peers::measureTallow(work);
  printTallow(tallow);
  const peers::EncodedFigures encoded = peers::measureEncoded(work);
  printEncoded(work, encoded);
  const Figures mu = measureTool(tools[0], work);
  const Figures notmuch = measureTool(tools[1], work);
  const Figures fts5 = peers::measureFts5(work, options.optimizeFts5);
  printSystem("fts5", fts5, options.optimizeFts5 ? " optimized=1" : "");
  printLine(fmt::format(
      "ratios index_vs_mu={:.2f} index_vs_notmuch={:.2f} index_vs_raw={:.2f} "
      "query_p50_vs_fts5={:.2f} query_p95_vs_fts5={:.2f} query_p50_vs_mu={:.2f} "
      "query_p95_vs_mu={:.2f} disk_vs_fts5={:.2f} rss_anon_mb={:.1f}",
      tallow.mailsPerSecond / mu.mailsPerSecond, tallow.mailsPerSecond / notmuch.mailsPerSecond,
      encoded.rawSeconds / encoded.seconds, tallow.median / fts5.median,
      tallow.percentile95 / fts5.percentile95, tallow.median / mu.median,
      tallow.percentile95 / mu.percentile95, tallow.diskBytes / fts5.diskBytes,
      megabytes(std::max(tallow.anonymousPeak, encoded.anonymousPeak))));
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
  app.add_option("--passes", options.passes, "Timed passes over the queries (default: 1)")
      ->check(CLI::Range(size_t{1}, size_t{1000}));
  app.add_flag("--optimize-fts5", options.optimizeFts5,
               "Merge the index of FTS5 into one segment before it is searched");
  app.add_flag("--require-all", options.requireAll, "Fail when mu or notmuch is not installed");
  CLI11_PARSE(app, argc, argv);
  measureAll(options);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("peers_benchmark", run, argc, argv);
}
