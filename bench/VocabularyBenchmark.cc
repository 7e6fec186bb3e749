#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <fstream>
#include <stdexcept>

#include "bench/Corpus.h"
#include "bench/DaemonRun.h"
#include "bench/Percentiles.h"
#include "bench/Queries.h"
#include "docstore/TALSqliteDocStore.h"

// Measures the cost of searches while the vocabulary is being counted.
namespace {

// What the daemon has logged about rebuilds so far.
class DaemonLog {
 public:
  explicit DaemonLog(const std::string& path) : _file(path) {}

  [[nodiscard]] size_t begun() { return read(), _begun; }
  [[nodiscard]] size_t done() { return read(), _done; }

 private:
  void read() {
    for (std::string line; std::getline(_file, line);) {
      if (line.find("Starting to rebuild topK vocab") != std::string::npos) ++_begun;
      if (line.find("TopK vocab rebuild is done") != std::string::npos) ++_done;
    }
    _file.clear();
  }

  std::ifstream _file;
  size_t _begun = 0;
  size_t _done = 0;
};

// Without words, the daemon counts again when another mail arrives.
void forgetVocabulary(const std::string& stateDirectory) {
  TALSqliteDocStore store(bench::documentStorePath(stateDirectory));
  std::optional<TLError> error;
  if (store.openWithError(&error)) store.storeTopKVocab("", &error);
  if (error) throw std::runtime_error("document store: " + platform::printable(error));
}

// Adds enough mail for a count to be due: copies of the first one under new names.
void addMail(client::SearchServiceProxy& service, bench::ItemSpool& spool, size_t round) {
  constexpr size_t kDue = 51;
  std::vector<client::EncodedItem> first;
  spool.rewind();
  if (!spool.next(first) || first.empty()) throw std::runtime_error("no mail");
  std::vector<client::EncodedItem> copies;
  for (size_t i = 0; i < kDue; ++i) {
    TLIndexableItem item;
    if (!item.initWithData(first[i % first.size()].bytes)) {
      throw std::runtime_error("an item does not parse");
    }
    item.setIdentifier(platform::fromUTF8(fmt::format("vocabulary/{}/{}", round, i)));
    copies.push_back(client::encode(item));
  }
  bench::indexBatch(service, copies);
}

struct Round {
  bench::Percentiles alone;
  bench::Percentiles beside;
  double seconds = 0;  // of the rebuilds
};

void measure(const std::string& stateDirectory, const std::vector<std::string>& queries,
             bench::ItemSpool& spool, size_t round, Round* out) {
  forgetVocabulary(stateDirectory);
  const bench::ScratchDirectory scratch;
  bench::DaemonRun daemon(scratch, stateDirectory);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  DaemonLog said(scratch / "daemon.log");
  for (const std::string& query : queries) static_cast<void>(bench::timedSearch(service, query));
  for (const std::string& query : queries) {
    out->alone.add(bench::timedSearch(service, query).seconds);
  }
  addMail(service, spool, round);
  const double start = bench::secondsNow();
  while (said.begun() == 0) static_cast<void>(bench::timedSearch(service, queries.front()));
  for (size_t i = 0;; i = (i + 1) % queries.size()) {
    const double seconds = bench::timedSearch(service, queries[i]).seconds;
    if (said.done() > 0) break;
    out->beside.add(seconds);
  }
  out->seconds += bench::secondsNow() - start;
  daemon.stop();
}

int run(int argc, char** argv) {
  std::vector<std::string> paths{TALLOW_SAMPLE_MAIL};
  std::string stateDirectory;
  size_t queryCount = 200;
  size_t rounds = 3;
  uint32_t seed = 1;
  CLI::App app("Times searches while the vocabulary is counted, and while nothing else runs.",
               "vocabulary_benchmark");
  app.add_option("MAIL", paths, "Maildirs, mbox files, directories (default: the sample mail)");
  app.add_option(
      "--state", stateDirectory,
      "Search the index that ingest_benchmark has kept here instead of indexing the mail");
  app.add_option("--queries", queryCount, "How many (default: 200)")
      ->check(CLI::Range(size_t{1}, size_t{1000000}));
  app.add_option("--rounds", rounds, "How many rebuilds (default: 3)");
  app.add_option("--seed", seed, "Of the choice of words (default: 1)");
  CLI11_PARSE(app, argc, argv);

  const bench::ScratchDirectory scratch;
  bench::ItemSpool spool(scratch);
  bench::QuerySource source(seed);
  spool.fill(paths, [&](const client::EncodedItem& item) { source.see(item); });
  const std::vector<std::string> queries = source.drawAll(queryCount);
  if (stateDirectory.empty()) {
    stateDirectory = scratch / "state";
    const bench::ScratchDirectory indexing;
    bench::DaemonRun daemon(indexing, stateDirectory);
    client::SearchServiceProxy service(daemon.runtimeDirectory());
    spool.send(service);
    daemon.stop();
  }
  Round all;
  for (size_t i = 0; i < rounds; ++i) measure(stateDirectory, queries, spool, i, &all);
  fmt::print(
      "queries={} rebuilds={} rebuild_s={:.2f} alone_median_ms={:.2f} alone_p95_ms={:.2f} "
      "beside={} beside_median_ms={:.2f} beside_p95_ms={:.2f} p95_beside_vs_alone={:.2f}\n",
      queries.size(), rounds, all.seconds / static_cast<double>(rounds), all.alone.at(0.5) * 1e3,
      all.alone.at(0.95) * 1e3, all.beside.size(), all.beside.at(0.5) * 1e3,
      all.beside.at(0.95) * 1e3, all.beside.at(0.95) / all.alone.at(0.95));
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("vocabulary_benchmark", run, argc, argv);
}
