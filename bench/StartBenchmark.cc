#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <chrono>
#include <filesystem>
#include <thread>

#include "bench/Corpus.h"
#include "bench/DaemonRun.h"
#include "bench/Percentiles.h"
#include "bench/Queries.h"

// Measures the cost of a start: the first searches with a cold page cache, and many small
// protection classes.
namespace {

using Queries = std::vector<std::string>;

// The threads of queues end after two idle seconds; a memtable is flushed after ten.
constexpr std::chrono::seconds kUntilIdle(15);

// Evicts the files in `path` from the page cache. Each is synced first, because the kernel keeps
// pages that are not on disk yet.
void evictFromPageCache(const std::string& path) {
  for (const auto& entry : std::filesystem::recursive_directory_iterator(path)) {
    if (!entry.is_regular_file()) continue;
    const int file = open(entry.path().c_str(), O_RDONLY | O_CLOEXEC);
    if (file < 0) continue;
    fsync(file);
    posix_fadvise(file, 0, 0, POSIX_FADV_DONTNEED);
    close(file);
  }
}

struct ColdStart {
  bench::Percentiles ready;
  bench::Percentiles first;
  bench::Percentiles tenth;
};

void addColdStart(ColdStart& times, const std::string& stateDirectory, const Queries& queries,
                  size_t round) {
  constexpr size_t kQueries = 10;
  const bench::ScratchDirectory scratch;
  evictFromPageCache(stateDirectory);
  const double start = bench::secondsNow();
  bench::DaemonRun daemon(scratch, stateDirectory);
  times.ready.add(bench::secondsNow() - start);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  for (size_t i = 0; i < kQueries; ++i) {
    const std::string& query = queries[(round * kQueries + i) % queries.size()];
    const double seconds = bench::timedSearch(service, query).seconds;
    if (i == 0) times.first.add(seconds);
    if (i == kQueries - 1) times.tenth.add(seconds);
  }
  daemon.stop();
}

std::string figures(const char* name, const bench::Percentiles& times) {
  return fmt::format(" {}_median_ms={:.1f} {}_max_ms={:.1f}", name, times.at(0.5) * 1e3, name,
                     times.at(1) * 1e3);
}

void measureColdStarts(const std::string& stateDirectory, const Queries& queries, size_t rounds) {
  ColdStart times;
  for (size_t i = 0; i < rounds; ++i) addColdStart(times, stateDirectory, queries, i);
  fmt::print("cold_starts={}{}{}{}\n", rounds, figures("ready", times.ready),
             figures("first_search", times.first), figures("tenth_search", times.tenth));
}

// The resources that the daemon has gained since construction.
class Growth {
 public:
  explicit Growth(bench::DaemonRun& daemon)
      : _daemon(daemon),
        _anonymous(daemon.memory().anonymous),
        _threads(daemon.threads()),
        _descriptors(daemon.descriptors()) {}

  [[nodiscard]] std::string perClass(const char* when, size_t classes) const {
    const auto share = [&](size_t now, size_t before) {
      return (static_cast<double>(now) - static_cast<double>(before)) /
             static_cast<double>(classes);
    };
    return fmt::format(" {0}_rss_anon_kb={1:.0f} {0}_threads={2:.1f} {0}_descriptors={3:.1f}", when,
                       share(_daemon.memory().anonymous, _anonymous) / 1e3,
                       share(_daemon.threads(), _threads),
                       share(_daemon.descriptors(), _descriptors));
  }

 private:
  bench::DaemonRun& _daemon;
  const uint64_t _anonymous;
  const size_t _threads;
  const size_t _descriptors;
};

using ForClass = std::function<void(client::SearchServiceProxy&, const std::string& name)>;

// Calls `use` for each class, waits until they are idle, and prints the cost of a class.
void measureClasses(const std::string& stateDirectory, const char* what, size_t classes,
                    const ForClass& use) {
  const bench::ScratchDirectory scratch;
  bench::DaemonRun daemon(scratch, stateDirectory);
  const Growth growth(daemon);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  bench::Percentiles times;
  for (size_t i = 0; i < classes; ++i) {
    const std::string name = fmt::format("class-{}", i);
    const double start = bench::secondsNow();
    use(service, name);
    times.add(bench::secondsNow() - start);
  }
  const std::string used = growth.perClass("used", classes);
  std::this_thread::sleep_for(kUntilIdle);
  const std::string idle = growth.perClass("idle", classes);
  const double start = bench::secondsNow();
  daemon.stop();
  fmt::print("classes={} {}{}{}{} stop_ms={:.1f}\n", classes, what, figures("call", times), used,
             idle, (bench::secondsNow() - start) * 1e3);
}

void search(client::SearchServiceProxy& service, const std::string& name) {
  static_cast<void>(bench::timedSearch(service, "harbour", false, name));
}

int run(int argc, char** argv) {
  std::vector<std::string> paths{TALLOW_SAMPLE_MAIL};
  std::string stateDirectory;
  std::string givenQueries;
  size_t rounds = 3;
  size_t classes = 5;
  size_t mails = 100;
  CLI::App app(
      "Times the first searches after a start with an empty page cache, and weighs small classes.",
      "start_benchmark");
  app.add_option("MAIL", paths, "Maildirs, mbox files, directories (default: the sample mail)");
  app.add_option("--state", stateDirectory,
                 "Start with the index that ingest_benchmark has kept here");
  app.add_option("--read-queries", givenQueries, "Take the queries from this file");
  app.add_option("--rounds", rounds, "How many cold starts (default: 3)")
      ->check(CLI::Range(size_t{1}, size_t{1000}));
  app.add_option("--classes", classes, "How many protection classes (default: 5)")
      ->check(CLI::Range(size_t{1}, size_t{500}));
  app.add_option("--mails", mails, "How many mails a class has (default: 100)");
  CLI11_PARSE(app, argc, argv);

  const bench::ScratchDirectory scratch;
  bench::ItemSpool spool(scratch);
  bench::QuerySource source(1);
  spool.fill(paths, [&](const client::EncodedItem& item) { source.see(item); });
  const Queries queries =
      givenQueries.empty() ? source.drawAll(100) : bench::readQueries(givenQueries);
  if (stateDirectory.empty()) {
    stateDirectory = scratch / "cold";
    bench::DaemonRun daemon(scratch, stateDirectory);
    client::SearchServiceProxy service(daemon.runtimeDirectory());
    spool.send(service);
    daemon.stop();
  }
  measureColdStarts(stateDirectory, queries, rounds);

  std::vector<client::EncodedItem> batch;
  spool.rewind();
  static_cast<void>(spool.next(batch));
  if (batch.size() > mails) batch.resize(mails);
  measureClasses(scratch / "classes", "empty", classes, search);
  const std::string full = fmt::format("mails={}", batch.size());
  measureClasses(scratch / "full", full.c_str(), classes,
                 [&](client::SearchServiceProxy& service, const std::string& name) {
                   bench::indexBatch(service, batch, name);
                 });
  measureClasses(scratch / "full", (full + " reopened").c_str(), classes, search);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("start_benchmark", run, argc, argv);
}
