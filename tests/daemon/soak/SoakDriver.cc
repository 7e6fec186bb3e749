// Runs clients of all kinds against one daemon for any length of time, while it is locked and
// unlocked, asked for its state, and killed and restarted. Each client knows what it must find; a
// wrong answer exits with 1. Reports the memory of the daemon for each third of the time after
// warming up.
//
// Deleted mail stays in the index until it is purged. The clients delete and add all the time, so
// without purges the index and with it the daemon's memory would grow.
#include <fmt/format.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <map>
#include <optional>
#include <random>
#include <set>
#include <stop_token>
#include <thread>
#include <vector>

#include "client/DebugServiceProxy.h"
#include "client/SearchServiceProxy.h"
#include "inspect/Purge.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/daemon/DaemonSupport.h"
#include "tests/support/DriverOptions.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

using client::SearchServiceProxy;
using testsupport::DaemonProcess;
using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;
using std::chrono::seconds;

constexpr const char* kUsage =
    "Usage: soak_driver [--seconds N] [--warm-up SECONDS] [--clients N] [--kill-every SECONDS]\n"
    "                   [--purge-every KILLS] [--pause MILLISECONDS] [--seed N]\n";

// The classes of clients by number; the first is refused while the device is locked.
constexpr const char* kClasses[] = {"SysFileProtectionComplete", "default", "other"};
constexpr const char* kName = "soak";
constexpr size_t kMaxMails = 200;  // per client
constexpr rpc::Patience kPatience{20000};

// Times are in seconds, without another unit.
struct Options {
  uint64_t seconds = 1800;  // without the warming up
  uint64_t warmUp = 0;
  uint64_t clients = 16;
  uint64_t killEvery = 60;
  uint64_t purgeEvery = 5;  // kills
  // The maximum between two calls of a client; a long pause makes a steady load.
  uint64_t pauseMillis = 20;
  uint64_t seed = std::random_device()();
};

// Counters of all threads.
struct Tally {
  std::atomic<uint64_t> calls{0};
  std::atomic<uint64_t> searches{0};
  std::atomic<uint64_t> refused{0};  // while locked
  std::atomic<uint64_t> failed{0};   // by a kill
  std::atomic<bool> wrong{false};
};

// One client with its own mails in one class.
class Client {
 public:
  Client(uint64_t number, const Options& options, std::string directory, Tally& tally)
      : _prefix(fmt::format("c{}m", number)),
        _class(kClasses[number % std::size(kClasses)]),
        _directory(std::move(directory)),
        _pause(options.pauseMillis),
        _random(static_cast<uint32_t>(options.seed + number)),
        _tally(tally) {}

  void work(const std::stop_token& stop) {
    while (!_tally.wrong && !stop.stop_requested()) {
      std::this_thread::sleep_for(milliseconds(_random() % (_pause + 1)));
      if (!_service) _service.emplace(_directory, kPatience);
      ++_tally.calls;
      const auto die = _random() % 10;
      if (die < 3) {
        add();
      } else if (die < 5) {
        remove();
      } else if (die < 6) {
        diagnose();
      } else {
        searchOne();
      }
    }
  }

 private:
  enum class State { present, gone, unknown };

  [[nodiscard]] std::string wordOf(uint32_t mail) const {
    return fmt::format("{}{}z", _prefix, mail);
  }

  void add() {
    std::vector<uint32_t> numbers;
    for (const auto& [mail, state] : _mails) {  // sends again what a kill interrupted
      if (state == State::unknown && numbers.size() < 20) numbers.push_back(mail);
    }
    for (size_t i = _random() % 5 + 1; i > 0 && _mails.size() < kMaxMails; --i) {
      numbers.push_back(_next++);
      _mails[numbers.back()] = State::unknown;
    }
    std::vector<client::EncodedItem> items;
    for (const uint32_t mail : numbers) {
      std::string body;
      for (int i = 0; i < 20; ++i) body += fmt::format("text{} ", _random() % 5000);
      items.push_back(testsupport::mail(wordOf(mail), "soak " + wordOf(mail), body));
    }
    std::optional<TLError> error;
    if (settle(_service->indexItems(items, kName, _class, &error), error)) {
      for (const uint32_t mail : numbers) _mails[mail] = State::present;
    }
  }

  void remove() {
    std::vector<std::string> identifiers;
    std::vector<uint32_t> numbers;
    for (const auto& [mail, state] : _mails) {
      if (state == State::present && _random() % 20 == 0) {
        numbers.push_back(mail);
        identifiers.push_back(wordOf(mail));
      }
    }
    if (numbers.empty()) return;
    std::optional<TLError> error;
    const bool done = _service->deleteItemsWithIdentifiers(identifiers, kName, _class, &error);
    const State state = settle(done, error) ? State::gone : State::unknown;
    for (const uint32_t mail : numbers) {
      if (state == State::gone) {
        _mails.erase(mail);
        _gone.insert(mail);
      } else if (!refusedByLock(error)) {
        _mails[mail] = state;
      }
    }
    while (_gone.size() > kMaxMails) _gone.erase(_gone.begin());
  }

  void searchOne() {
    const bool gone = !_gone.empty() && _random() % 4 == 0;
    if (!gone && _mails.empty()) return;
    const uint32_t mail = gone ? *std::next(_gone.begin(), _random() % _gone.size())
                               : std::next(_mails.begin(), _random() % _mails.size())->first;
    if (!gone && _mails[mail] == State::unknown) return;
    const std::string word = wordOf(mail);
    std::optional<TLError> error;
    const auto identifiers = testsupport::found(*_service, word, _class, &error);
    if (!settle(identifiers.has_value(), error)) return;
    ++_tally.searches;
    const size_t count = identifiers->count(word);
    if (count == (gone ? 0U : 1U)) return;
    fmt::print(stderr, "WRONG: {} of {} is found {} times\n", word, _class, count);
    _tally.wrong = true;
  }

  void diagnose() {
    client::DebugServiceProxy debug(_directory, kPatience);
    std::optional<TLError> error;
    const auto die = _random() % 40;
    if (die == 0) {
      debug.forceVacuumAndCompact(_class, &error);
    } else if (die == 1) {
      static_cast<void>(debug.fetchStatsForIndexer(kName, _class, &error));
    } else if (die == 2) {
      static_cast<void>(_service->fetchLastClientState(kName, _class, &error));
    } else {
      static_cast<void>(debug.ping(_prefix, &error));
    }
    settle(!error, error);
  }

  static bool refusedByLock(const std::optional<TLError>& error) {
    return error && error->domain == "com.quill.tallow.TALIndexerManager";
  }

  // Counts the outcome of a call; after a failure the next call reconnects.
  bool settle(bool done, const std::optional<TLError>& error) {
    if (done || !error) return done;
    if (refusedByLock(error)) {
      ++_tally.refused;
    } else {
      ++_tally.failed;
      _service.reset();
    }
    return false;
  }

  const std::string _prefix;
  const std::string _class;
  const std::string _directory;
  const uint64_t _pause;
  std::mt19937 _random;
  Tally& _tally;
  std::optional<SearchServiceProxy> _service;
  std::map<uint32_t, State> _mails;
  std::set<uint32_t> _gone;  // the latest
  uint32_t _next = 0;
};

// Controls the daemon, on the main thread.
class Supervisor {
 public:
  Supervisor(const Options& options, const std::string& directory)
      : _options(options), _directory(directory), _random(static_cast<uint32_t>(options.seed)) {
    _daemon.emplace(directory);
  }

  [[nodiscard]] std::string runtimeDirectory() const { return _directory + "/run"; }

  // Runs until the end of the time or a wrong answer. False if the daemon ended unexpectedly.
  bool supervise(const Tally& tally) {
    const auto start = Clock::now() + seconds(_options.warmUp);
    auto nextKill = Clock::now() + seconds(_options.killEvery);
    while (Clock::now() - start < seconds(_options.seconds) && !tally.wrong) {
      std::this_thread::sleep_for(milliseconds(200));
      if (Clock::now() >= start) measure(Clock::now() - start);
      if (_random() % 25 == 0) _daemon->signal(SIGUSR1);
      if (_random() % 25 == 0) {
        platform::writeFileAtomically(runtimeDirectory() + "/lock_status",
                                      _random() % 2 == 0 ? "1 1\n" : "0 1\n", nullptr);
      }
      if (Clock::now() < nextKill) continue;
      nextKill = Clock::now() + seconds(_options.killEvery);
      _daemon->signal(SIGKILL);
      const int status = _daemon->wait();
      if (status != 128 + SIGKILL) return ended(status);
      ++_kills;
      if (_kills % _options.purgeEvery == 0 && !purge()) return false;
      _daemon.emplace(_directory);
      if (!_daemon->ready()) return ended(_daemon->wait());
    }
    return true;
  }

  // Shuts the daemon down; false if it fails.
  bool end() {
    const int status = _daemon->stop();
    return status == 0 || ended(status);
  }

  void report(const Tally& tally) const {
    fmt::print(
        "calls={} searches={} refused_while_locked={} failed_by_kills={} kills={} purges={} "
        "wrong={:d} rss_anon_median_mb={} rss_anon_max_mb={} seed={}\n",
        tally.calls.load(), tally.searches.load(), tally.refused.load(), tally.failed.load(),
        _kills, _purges, tally.wrong.load(), megabytes(0.5), megabytes(1), _options.seed);
  }

 private:
  void measure(Clock::duration time) {
    const auto third = static_cast<size_t>(3 * time / seconds(_options.seconds));
    const auto kilobytes = static_cast<double>(_daemon->anonymousKilobytes());
    if (kilobytes != 0) _megabytes[std::min<size_t>(third, 2)].push_back(kilobytes / 1024);
  }

  // A percentile for each third.
  [[nodiscard]] std::string megabytes(double part) const {
    const auto at = [&](size_t third) { return testsupport::percentile(_megabytes[third], part); };
    return fmt::format("{:.1f},{:.1f},{:.1f}", at(0), at(1), at(2));
  }

  // Removes the remains of deleted mail from all classes, while no daemon runs.
  bool purge() {
    const std::string state = _directory + "/state";
    for (const char* protectionClass : kClasses) {
      if (!std::filesystem::exists(platform::dataRoot(state) + "/" + protectionClass)) continue;
      std::optional<TLError> error;
      if (!inspect::purge(
              state, protectionClass, [](const char*) {}, &error)) {
        fmt::print(stderr, "no purge of {}: {}\n", protectionClass, platform::printable(error));
        return false;
      }
      ++_purges;
    }
    return true;
  }

  bool ended(int status) const {
    fmt::print(stderr, "the daemon ended with status {}\n{}\n", status, _daemon->endOfLog());
    return false;
  }

  const Options& _options;
  const std::string _directory;
  std::mt19937 _random;
  std::optional<DaemonProcess> _daemon;
  std::vector<double> _megabytes[3];  // for each third
  uint64_t _kills = 0;
  int _purges = 0;
};

int soak(const Options& options) {
  setenv("TALLOW_LOG", "error", 1);
  const testsupport::TemporaryDirectory scratch;
  Tally tally;
  Supervisor supervisor(options, scratch.path());
  bool sound = true;
  {
    std::vector<std::jthread> threads;
    for (uint64_t number = 0; number < options.clients; ++number) {
      threads.emplace_back([&, number](const std::stop_token& stop) {
        Client(number, options, supervisor.runtimeDirectory(), tally).work(stop);
      });
    }
    sound = supervisor.supervise(tally);
  }
  sound = sound && supervisor.end();
  supervisor.report(tally);
  return sound && !tally.wrong ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
  Options options;
  testsupport::readOptions(argc, argv, kUsage,
                           {{"--seconds", &options.seconds},
                            {"--warm-up", &options.warmUp},
                            {"--clients", &options.clients},
                            {"--kill-every", &options.killEvery},
                            {"--purge-every", &options.purgeEvery},
                            {"--pause", &options.pauseMillis},
                            {"--seed", &options.seed}});
  if (options.seconds * options.clients * options.killEvery * options.purgeEvery != 0) {
    return soak(options);
  }
  fmt::print(stderr, "{}", kUsage);
  return 2;
}
