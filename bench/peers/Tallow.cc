#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <exception>
#include <stdexcept>
#include <string_view>
#include <thread>
#include <utility>

#include "bench/ChildProcess.h"
#include "bench/Corpus.h"
#include "bench/RawBatches.h"
#include "bench/peers/Peers.h"
#include "client/DebugServiceProxy.h"
#include "platform/Queue.h"

namespace peers {

namespace {

struct Merges {
  uint64_t ended;
  bool running;
};

// Reads all texts of the index.

Merges mergesOf(client::DebugServiceProxy& service) {
  std::optional<TLError> error;
  const auto text = service.fetchStatsForSalt(bench::kClientName, bench::kProtectionClass, &error);
  if (!text) throw std::runtime_error("statistics: " + platform::printable(error));
  constexpr std::string_view kCount = "---- Vacuums: ";
  const size_t at = text->find(kCount);
  if (at == std::string::npos) throw std::runtime_error("the metrics tell no vacuums");
  return {std::stoull(text->substr(at + kCount.size())),
          text->find("(IN PROGRESS)", at) != std::string::npos};
}

// Identifies a merge at no cost. Nullopt while there is no merge.
std::optional<pid_t> mergeThread(const bench::DaemonRun& daemon) {
  return daemon.threadNamed("tallow-merge");
}

// Merges and compacts the index until nothing is left to merge.
void settle(client::DebugServiceProxy& service) {
  constexpr std::chrono::milliseconds kPoll(100);
  constexpr int kMaxRounds = 100;  // each moves at least a quarter of a million suffixes
  for (int round = 0; round < kMaxRounds; ++round) {
    const uint64_t before = mergesOf(service).ended;
    std::optional<TLError> error;
    if (!service.forceVacuumAndCompact(bench::kProtectionClass, &error)) {
      throw std::runtime_error("vacuum: " + platform::printable(error));
    }
    Merges merges = mergesOf(service);
    for (; merges.running; merges = mergesOf(service)) std::this_thread::sleep_for(kPoll);
    if (merges.ended == before) return;
  }
  throw std::runtime_error("the merges do not come to an end");
}

// Indexes the spool's mail repeatedly under new identifiers, to make the daemon merge.
//
// Threads: used by one. The feeding thread, which `start` creates and `stop` joins, owns everything
// but `_stopping` while it runs.
class Feeder {
 public:
  Feeder(const bench::DaemonRun& daemon, const std::string& spoolPath)
      : _daemon(daemon), _service(daemon.runtimeDirectory()), _spool(spoolPath) {}
  ~Feeder() { end(); }
  Feeder(const Feeder&) = delete;
  Feeder& operator=(const Feeder&) = delete;

  // True once a merge is running; false if all mail was sent without one.
  [[nodiscard]] bool startMerge() {
    const size_t first = _round;
    while (!mergeThread(_daemon)) {
      if (_round > first + 1) return false;  // the first round may already have been started
      sendBatch(SIZE_MAX);
    }
    return true;
  }

  // Continues on a thread, in small calls like incoming mail.
  void start() {
    _thread = std::thread([this] { feed(); });
  }

  // Returns the number of mails sent since the last stop; rethrows the exception of the thread.
  uint64_t stop() {
    end();
    _stopping = false;
    if (_failure) std::rethrow_exception(_failure);
    return std::exchange(_mails, 0);
  }

 private:
  void sendBatch(size_t itemsACall) {
    if (!_spool.next(_batch)) {
      ++_round;
      _spool.rewind();
      return;
    }
    for (client::EncodedItem& item : _batch) item = renamed(item);
    for (size_t at = 0; at < _batch.size() && !_stopping;) {
      const size_t count = std::min(itemsACall, _batch.size() - at);
      bench::indexBatch(_service, std::span(_batch).subspan(at, count));
      _mails += count;
      at += count;
    }
  }

  [[nodiscard]] client::EncodedItem renamed(const client::EncodedItem& encoded) const {
    TLIndexableItem item;
    if (!item.initWithData(encoded.bytes)) throw std::runtime_error("an item does not parse");
    item.setIdentifier(platform::fromUTF8(encoded.identifier + "-again" + std::to_string(_round)));
    return client::encode(item);
  }

  void feed() noexcept {
    platform::setThreadName("bench.feeder");
    constexpr size_t kItemsACall = 10;
    try {
      while (!_stopping) sendBatch(kItemsACall);
    } catch (...) {
      _failure = std::current_exception();
    }
  }

  void end() {
    _stopping = true;
    if (_thread.joinable()) _thread.join();
  }

  const bench::DaemonRun& _daemon;
  client::SearchServiceProxy _service;
  bench::ItemSpool _spool;
  std::vector<client::EncodedItem> _batch;
  size_t _round = 0;
  uint64_t _mails = 0;
  std::exception_ptr _failure;
  std::atomic<bool> _stopping{false};
  std::thread _thread;
};

// Creates the index, which should not count as indexing.
void openIndex(client::SearchServiceProxy& service) {
  std::optional<TLError> error;
  const auto none =
      service.fetchLastClientState(bench::kClientName, bench::kProtectionClass, &error);
  if (error) throw std::runtime_error("opening: " + platform::printable(error));
}

void indexByClient(const Workload& work, bench::DaemonRun& daemon, const std::string& output,
                   Figures& figures) {
  sync();
  const double cpuStart = daemon.cpuSeconds();
  const bench::Run run = bench::runProgram({{bench::programBeside("tallow"), "--runtime-dir",
                                             daemon.runtimeDirectory(), "index", work.maildir},
                                            {},
                                            output},
                                           false);
  figures.mailsPerSecond = static_cast<double>(work.mails) / run.seconds;
  figures.cpuSeconds = run.cpuSeconds + daemon.cpuSeconds() - cpuStart;
  figures.residentPeak = static_cast<double>(daemon.memory().residentPeak);
}

// Runs queries one after another while merges run, with or without mail coming in. Between merges,
// mail comes in until the next one starts, and no query runs. A query that outlasts its merge does
// not count.
void timeDuringMerge(std::span<const std::string> queries, bool feeding, Feeder& feeder,
                     const bench::DaemonRun& daemon, const Search& search, DuringMerge& figures) {
  std::optional<pid_t> latest;
  for (const std::string& query : queries) {
    if (!mergeThread(daemon)) {
      figures.mailsFed += feeder.stop();
      if (!feeder.startMerge()) return;
      if (feeding) feeder.start();
    }
    const std::optional<pid_t> merge = mergeThread(daemon);
    const bench::TimedSearch answer = search(query);
    if (!merge || mergeThread(daemon) != merge) continue;
    figures.times.add(answer);
    if (latest != merge) ++figures.merges;
    latest = merge;
  }
  figures.mailsFed += feeder.stop();
}

}  // namespace

TallowFigures measureTallow(const Workload& work) {
  const bench::ScratchDirectory scratch;
  const std::string state = scratch / "state";
  bench::DaemonRun daemon(scratch, state);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  client::DebugServiceProxy debugService(daemon.runtimeDirectory());
  openIndex(service);
  TallowFigures figures;
  indexByClient(work, daemon, scratch / "output", figures);

  const double start = bench::secondsNow();
  settle(debugService);
  figures.settleSeconds = bench::secondsNow() - start;
  figures.settleMerges = mergesOf(debugService).ended;
  figures.diskBytes = static_cast<double>(bench::bytesOnDisk(state));

  const Search search = [&](const std::string& query) {
    return bench::timedSearch(service, query);
  };
  timeQueries(work, search, figures);
  Feeder feeder(daemon, work.spoolPath);
  const std::span<const std::string> queries(work.duringMerge);
  const size_t half = queries.size() / 2;
  timeDuringMerge(queries.first(half), false, feeder, daemon, search, figures.duringMerge);
  timeDuringMerge(queries.subspan(half), true, feeder, daemon, search, figures.duringIngest);

  figures.anonymousPeak = static_cast<double>(daemon.memory().anonymousPeak);
  daemon.stop();
  return figures;
}

Figures indexByTallow(const Workload& work) {
  const bench::ScratchDirectory scratch;
  bench::DaemonRun daemon(scratch, scratch / "state");
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  openIndex(service);
  Figures figures;
  indexByClient(work, daemon, scratch / "output", figures);
  daemon.stop();
  return figures;
}

EncodedFigures measureEncoded(const Workload& work, bool withRaw) {
  const bench::ScratchDirectory scratch;
  const std::string state = scratch / "state";
  const std::string rawPath = scratch / "raw";
  bench::ItemSpool spool(work.spoolPath);
  bench::DaemonRun daemon(scratch, state);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  openIndex(service);
  EncodedFigures figures;
  sync();
  const double start = bench::secondsNow();
  const double cpuStart = daemon.cpuSeconds();
  spool.send(service);
  figures.seconds = bench::secondsNow() - start;
  figures.cpuSeconds = daemon.cpuSeconds() - cpuStart;
  figures.anonymousPeak = static_cast<double>(daemon.memory().anonymousPeak);
  daemon.stop();
  if (!withRaw) return figures;
  sync();
  const bench::RawRun raw = bench::writeRawBatches(bench::indexPath(state), rawPath);
  figures.suffixes = static_cast<double>(raw.suffixes);
  figures.rawSeconds = raw.seconds;
  figures.rawDiskBytes = static_cast<double>(bench::bytesOnDisk(rawPath));
  return figures;
}

}  // namespace peers
