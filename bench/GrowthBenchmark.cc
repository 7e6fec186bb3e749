#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <stdexcept>
#include <thread>

#include "bench/Corpus.h"
#include "bench/DaemonRun.h"
#include "bench/Percentiles.h"
#include "bench/Queries.h"

// Measures the cost of a mail and of a query as the mailbox grows.
namespace {

// One size of the mailbox. The rates are those of the last tenth of the mails added before it.
struct Step {
  double mails = 0;
  double secondsPerMail = 0;
  double cpuPerMail = 0;  // of the daemon
  double median = 0;      // of the queries, in seconds
  double p95 = 0;
  double maximum = 0;
  double anonymousPeak = 0;  // bytes, since the start
  double disk = 0;           // bytes of all files of the daemon
};

// Grows one mailbox in one daemon: at each step adds mail, then runs queries.
class Growth {
 public:
  Growth(const bench::ScratchDirectory& scratch, std::string stateDirectory,
         bench::ItemSpool& spool, std::vector<std::string> queries)
      : _stateDirectory(std::move(stateDirectory)),
        _daemon(scratch, _stateDirectory),
        _service(_daemon.runtimeDirectory()),
        _spool(spool),
        _queries(std::move(queries)) {
    static_cast<void>(bench::timedSearch(_service, "warm"));  // opens the index
  }

  [[nodiscard]] Step grow(size_t mails) {
    Step step;
    send(mails - (mails - _sent) / 10);
    const double start = bench::secondsNow();
    const double cpuStart = _daemon.cpuSeconds();
    const size_t before = _sent;
    send(mails);
    const auto count = static_cast<double>(_sent - before);
    step.mails = static_cast<double>(_sent);
    step.secondsPerMail = (bench::secondsNow() - start) / count;
    step.cpuPerMail = (_daemon.cpuSeconds() - cpuStart) / count;
    waitForMerge();
    search(step);
    step.anonymousPeak = static_cast<double>(_daemon.memory().anonymousPeak);
    step.disk = static_cast<double>(bench::bytesOnDisk(_stateDirectory));
    return step;
  }

  void stop() { _daemon.stop(); }

 private:
  // Until this many mails have been sent in total.
  void send(size_t mails) {
    constexpr size_t kItemsACall = 100;
    while (_sent < mails) {
      if (_at == _batch.size()) {
        _at = 0;
        if (!_spool.next(_batch)) throw std::runtime_error("there is less mail than was seen");
      }
      const size_t count = std::min({kItemsACall, _batch.size() - _at, mails - _sent});
      bench::indexBatch(_service, std::span(_batch).subspan(_at, count));
      _at += count;
      _sent += count;
    }
  }

  void waitForMerge() const {
    constexpr std::chrono::milliseconds kPoll(50);
    while (_daemon.threadNamed("tallow-merge")) std::this_thread::sleep_for(kPoll);
  }

  void search(Step& step) {
    bench::Percentiles times;
    for (const std::string& query : _queries) {
      times.add(bench::timedSearch(_service, query).seconds);
    }
    step.median = times.at(0.5);
    step.p95 = times.at(0.95);
    step.maximum = times.at(1);
  }

  const std::string _stateDirectory;
  bench::DaemonRun _daemon;
  client::SearchServiceProxy _service;
  bench::ItemSpool& _spool;
  const std::vector<std::string> _queries;
  std::vector<client::EncodedItem> _batch;
  size_t _at = 0;  // index in the batch
  size_t _sent = 0;
};

void print(const Step& step) {
  fmt::print(
      "mails={:.0f} mails_per_s={:.0f} cpu_ms_per_mail={:.2f} p50_ms={:.2f} p95_ms={:.2f} "
      "max_ms={:.2f} rss_anon_peak_mb={:.1f} disk_mb={:.1f}\n",
      step.mails, 1 / step.secondsPerMail, step.cpuPerMail * 1e3, step.median * 1e3, step.p95 * 1e3,
      step.maximum * 1e3, step.anonymousPeak / 1e6, step.disk / 1e6);
  std::fflush(stdout);
}

// Fits figure ~ mails^e by least squares over the logarithms and returns e.
double exponent(const std::vector<Step>& steps, double Step::*figure) {
  double n = 0, sumX = 0, sumY = 0, sumXX = 0, sumXY = 0;
  for (const Step& step : steps) {
    const double x = std::log(step.mails);
    const double y = std::log(step.*figure);
    n += 1;
    sumX += x;
    sumY += y;
    sumXX += x * x;
    sumXY += x * y;
  }
  return (n * sumXY - sumX * sumY) / (n * sumXX - sumX * sumX);
}

void printExponents(const std::vector<Step>& steps) {
  fmt::print(
      "exponents seconds_per_mail={:.2f} cpu_per_mail={:.2f} p50={:.2f} p95={:.2f} "
      "rss_anon_peak={:.2f} disk={:.2f}\n",
      exponent(steps, &Step::secondsPerMail), exponent(steps, &Step::cpuPerMail),
      exponent(steps, &Step::median), exponent(steps, &Step::p95),
      exponent(steps, &Step::anonymousPeak), exponent(steps, &Step::disk));
}

// Ascending sizes, at most the number of mails; by default a ninth, a third and all.
std::vector<size_t> sizesOf(std::vector<size_t> wanted, size_t mails) {
  if (wanted.empty()) wanted = {mails / 9, mails / 3, mails};
  std::erase_if(wanted, [mails](size_t size) { return size < 10 || size > mails; });
  std::sort(wanted.begin(), wanted.end());
  wanted.erase(std::unique(wanted.begin(), wanted.end()), wanted.end());
  if (wanted.size() < 2) throw std::runtime_error("there is too little mail for two sizes");
  return wanted;
}

int run(int argc, char** argv) {
  std::vector<std::string> paths{TALLOW_SAMPLE_MAIL};
  std::string stateDirectory;
  std::vector<size_t> wanted;
  size_t queryCount = 200;
  uint32_t seed = 1;
  CLI::App app("Indexes mail in steps, with searches after each, and tells how the cost grows.",
               "growth_benchmark");
  app.add_option("MAIL", paths, "Maildirs, mbox files, directories (default: the sample mail)");
  app.add_option("--state", stateDirectory,
                 "Keep the index below this directory, which must be new or empty");
  app.add_option("--steps", wanted,
                 "Numbers of mails, parted by commas (default: a ninth, a third and all)")
      ->delimiter(',')
      ->allow_extra_args(false);
  app.add_option("--queries", queryCount, "How many at each step (default: 200)")
      ->check(CLI::Range(size_t{1}, size_t{1000000}));
  app.add_option("--seed", seed, "Of the choice of words (default: 1)");
  CLI11_PARSE(app, argc, argv);

  const bench::ScratchDirectory scratch;
  if (stateDirectory.empty()) stateDirectory = scratch / "state";
  bench::ItemSpool spool(scratch);
  bench::QuerySource source(seed);
  spool.fill(paths, [&](const client::EncodedItem& item) { source.see(item); });
  spool.rewind();
  Growth growth(scratch, stateDirectory, spool, source.drawAll(queryCount));
  std::vector<Step> steps;
  for (const size_t mails : sizesOf(wanted, spool.items())) {
    steps.push_back(growth.grow(mails));
    print(steps.back());
  }
  growth.stop();
  printExponents(steps);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("growth_benchmark", run, argc, argv);
}
