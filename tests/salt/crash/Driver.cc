// Kills a process with SIGKILL while it adds, deletes and merges, repeatedly on the same database,
// and checks after each kill that the keys contain every acknowledged operation exactly once. Exits
// with 1 at the first fault and keeps the database.
#include <fmt/format.h>
#include <poll.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <optional>
#include <random>

#include "tests/salt/Model.h"
#include "tests/salt/SaltSupport.h"
#include "tests/salt/crash/Workload.h"
#include "tests/support/DriverOptions.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Process.h"
#include "tests/support/TemporaryDirectory.h"

using namespace salttest;
using Clock = std::chrono::steady_clock;
using std::chrono::microseconds;

namespace {

constexpr uint32_t kGenerations = 12;  // kills per database
constexpr size_t kMaxPlaces = 20000;   // per database; more would only slow down the check
constexpr microseconds kForever = std::chrono::hours(24);
constexpr uint64_t kLogBlock = 32768;

constexpr uint64_t kMaxDiskBytes = 256 * 1024 * 1024;  // of a file system to fill

constexpr const char* kUsage =
    "Usage: salt_crash_driver [--mode kill|truncate|enospc] [--kills N] [--seed N]\n"
    "                         [--seconds MOST] [--disk DIR]\n"
    "truncate: also cuts the newest log at a random place.\n"
    "enospc: writes fail at times, by a limit on the size of files or, with DIR on a file system\n"
    "of some megabytes, by filling it.\n";

struct Options {
  uint64_t kills = 200;
  uint64_t seed = 1;
  uint64_t seconds = 86400;  // at most
  std::string mode = "kill";
  std::string disk;  // a directory on its own small file system, which workers fill
};

struct Tally {
  uint64_t kills = 0;
  uint64_t whileOpening = 0;
  uint64_t whileMerging = 0;
  uint64_t databases = 0;
  uint64_t operations = 0;
  uint64_t failedForSpace = 0;
  uint64_t lostTails = 0;  // databases that lost operations to a truncated log
};

testsupport::Process startWorker(const WorkerTask& task, const std::string& log) {
  return {{"/proc/self/exe", "--worker", task.path, std::to_string(task.seed),
           std::to_string(task.first), std::to_string(task.generation), std::to_string(task.create),
           std::to_string(static_cast<int>(task.shortage))},
          {},
          log};
}

// Appends reports of the worker until `end`. False when it has ended.
bool read(const testsupport::Process& worker, Clock::time_point end, std::string* reports) {
  const auto left = std::chrono::ceil<microseconds>(end - Clock::now());
  const timespec time{left.count() / 1'000'000, left.count() % 1'000'000 * 1000};
  pollfd waiting{worker.output(), POLLIN, 0};
  if (left.count() <= 0 || ppoll(&waiting, 1, &time, nullptr) <= 0) return true;
  char bytes[4096];
  const ssize_t size = ::read(worker.output(), bytes, sizeof bytes);
  if (size > 0) reports->append(bytes, static_cast<size_t>(size));
  return size > 0;
}

// One database through all its kills.
class Trial {
 public:
  Trial(const Options& options, uint32_t seed, Tally* tally)
      : _truncates(options.mode == "truncate"),
        _shortage(options.mode != "enospc" ? Shortage::none
                  : options.disk.empty()   ? Shortage::fileSize
                                           : Shortage::fullDisk),
        _path(options.disk.empty() ? _directory / "index" : options.disk + "/index"),
        _seed(seed),
        _tally(*tally),
        _random(seed),
        _model(workloadOptions(seed, _shortage)) {}

  [[nodiscard]] bool over() const {
    return _generation >= kGenerations || _model.places.size() > kMaxPlaces;
  }
  [[nodiscard]] const std::string& path() const { return _path; }

  // Starts a worker that continues where the last one was killed. Returns the first fault, or
  // empty.
  std::string nextGeneration() {
    WorkerTask task;
    task.path = _path;
    task.seed = _seed;
    task.first = _next;
    task.generation = ++_generation;
    task.create = !_created;
    task.shortage = _shortage;
    std::string reports;
    testsupport::Process worker = startWorker(task, _directory / "log");
    const int status = killed(worker, &reports);
    ++_tally.kills;
    std::filesystem::remove(ballastOf(_path));
    if (status != 128 + SIGKILL) {
      return fmt::format("the worker ended with status {}\n{}", status, worker.log());
    }
    std::string fault = believe(reports);
    if (fault.empty() && _truncates && _created) cutNewestLog();
    if (fault.empty() && _created) fault = check(reports.size() > 1);
    return fault;
  }

 private:
  // Kills during opening, or some time after a number of reports, or right after a failed write.
  int killed(testsupport::Process& worker, std::string* reports) {
    const microseconds pause(_random() % 3000);
    const size_t quota = 1 + _random() % 80;
    const bool atFailure = _random() % 4 == 0;
    const auto part = static_cast<int>(_random() % 100);
    const auto start = Clock::now();
    auto end = start + (_random() % 5 == 0 ? _opening * part / 100 : kForever);
    for (bool chosen = false; Clock::now() < end && read(worker, end, reports);) {
      if (reports->size() == 1) _opening = std::chrono::ceil<microseconds>(Clock::now() - start);
      if (chosen) continue;
      const bool failed = reports->find(static_cast<char>(Report::failed)) != std::string::npos;
      chosen = (atFailure && failed) || reports->size() >= quota;
      if (chosen) end = atFailure ? start : std::min(end, Clock::now() + pause);
    }
    const int status = worker.end(SIGKILL);
    while (read(worker, Clock::now() + kForever, reports)) {
    }
    return status;
  }

  // Updates the expectations from the worker's reports.
  std::string believe(const std::string& reports) {
    if (reports.empty()) ++_tally.whileOpening;
    for (const char byte : reports) {
      const auto report = static_cast<Report>(byte);
      _created = true;
      if (report == Report::failed) ++_tally.failedForSpace;
      if (report != Report::done && report != Report::refused) continue;
      ++_tally.operations;
      if (carryOut(_model, workloadOperation(_seed, _next)) != (report == Report::done)) {
        return fmt::format("operation {} was answered {}", _next, byte);
      }
      ++_next;
    }
    return "";
  }

  void cutNewestLog() {
    const std::filesystem::path log = newestLog(_path);
    const uint64_t size = std::filesystem::file_size(log);
    const uint64_t block = _random() % (size / kLogBlock + 1) * kLogBlock;
    const uint64_t places[] = {
        _random() % (size + 1), size - std::min<uint64_t>(size, _random() % 300),
        block + _random() % 8, block - std::min<uint64_t>(block, _random() % 8)};
    std::filesystem::resize_file(log, std::min(size, places[_random() % std::size(places)]));
  }

  // Works on copies, so that the next worker is the first to open the database.
  std::string check(bool worked) {
    const Keys keys = readKeys(freshCopy());
    if (keys.size() < 2 && _truncates) {  // without metrics there is no index
      startAnew();
      return "";
    }
    if (worked && storedMetrics(keys).VacuumInProgress) ++_tally.whileMerging;
    if (!catchUpWith(keys)) return fmt::format("operations before {} are missing", _next);
    if (std::string fault = difference(keys, &_model); !fault.empty()) return fault;

    const testsupport::LogCapture log;
    const auto index = loadIndex(freshCopy());
    if (!index) return "LoadIndex";
    if (!index->Validate() || log.count("Validation failed") != 0) return "Validate";
    if (scan(*index, "") != _model.scan("")) return "scan";
    return _model.difference(index->GetMetrics());
  }

  std::string freshCopy() {
    std::string copy = _directory / "copy";
    std::filesystem::remove_all(copy);
    std::filesystem::copy(_path, copy);
    return copy;
  }

  // Updates the model to what the keys contain: the operation after the last acknowledged one may
  // be there, and after a truncation any number of the last ones may be missing. False if the keys
  // contain anything else.
  bool catchUpWith(const Keys& keys) {
    const auto agree = [&] {
      return _model.indexingCalls == storedMetrics(keys).IndexingCalls &&
             _model.deleted == storedDeletions(keys);
    };
    const auto take = [this] { carryOut(_model, workloadOperation(_seed, _next++)); };
    if (agree()) return true;
    const uint32_t acknowledged = _next;
    if (_truncates) {
      take();
      if (agree()) return true;
      ++_tally.lostTails;
      startAnew();
      _created = true;
      while (!agree() && _next < acknowledged) take();
    } else {
      take();
    }
    return agree();
  }

  void startAnew() {
    _model = Model(_model.op);
    _next = 0;
    _created = false;
  }

  const testsupport::TemporaryDirectory _directory;
  const bool _truncates;
  const Shortage _shortage;
  const std::string _path;
  const uint32_t _seed;
  Tally& _tally;
  std::mt19937 _random;
  Model _model;
  microseconds _opening{10000};  // duration of the last opening
  uint32_t _generation = 0;
  uint32_t _next = 0;  // number of the first operation not yet in the model
  bool _created = false;
};

int drive(const Options& options) {
  Tally tally;
  const auto start = Clock::now();
  std::mt19937 seeds(static_cast<uint32_t>(options.seed));
  std::optional<Trial> trial;
  while (tally.kills < options.kills &&
         Clock::now() - start < std::chrono::seconds(options.seconds)) {
    if (!trial || trial->over()) {
      trial.emplace(options, seeds(), &tally);
      ++tally.databases;
    }
    if (const std::string fault = trial->nextGeneration(); !fault.empty()) {
      fmt::print(stderr, "FAULT at kill {} of seed {}: {}\n{} is left\n", tally.kills, options.seed,
                 fault, trial->path());
      _exit(1);
    }
  }
  const std::chrono::duration<double> seconds = Clock::now() - start;
  fmt::print(
      "kills={} while_merging={} while_opening={} databases={} operations={} lost_tails={} "
      "failed_for_space={} seconds={:.1f}\n",
      tally.kills, tally.whileMerging, tally.whileOpening, tally.databases, tally.operations,
      tally.lostTails, tally.failedForSpace, seconds.count());
  return 0;
}

uint32_t number(const char* text) {
  return static_cast<uint32_t>(std::strtoul(text, nullptr, 10));
}

int worker(char** words) {
  return runWorker({words[0], number(words[1]), number(words[2]), number(words[3]),
                    number(words[4]) != 0, static_cast<Shortage>(number(words[5]))});
}

}  // namespace

int main(int count, char** words) {
  if (count == 8 && std::strcmp(words[1], "--worker") == 0) return worker(words + 2);
  Options options;
  testsupport::readOptions(count, words, kUsage,
                           {{"--mode", &options.mode},
                            {"--kills", &options.kills},
                            {"--seed", &options.seed},
                            {"--seconds", &options.seconds},
                            {"--disk", &options.disk}});
  constexpr std::string_view kModes[] = {"kill", "truncate", "enospc"};
  if (std::ranges::find(kModes, options.mode) == std::end(kModes)) {
    fmt::print(stderr, "{}", kUsage);
    return 2;
  }
  if (!options.disk.empty() && std::filesystem::space(options.disk).capacity > kMaxDiskBytes) {
    fmt::print(stderr, "{} is not on a small file system\n", options.disk);
    return 2;
  }
  // Workers log refused and failed operations, which are expected.
  setenv("TALLOW_LOG", "fault", 0);
  return drive(options);
}
