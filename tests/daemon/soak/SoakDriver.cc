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
#include <condition_variable>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <map>
#include <mutex>
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

struct Options {
  seconds length{1800};  // without the warming up
  seconds warmUp{0};
  int clients = 16;
  seconds killEvery{60};
  int purgeEvery = 5;      // kills
  milliseconds pause{20};  // maximum, between two calls of a client; a long one makes a steady load
  uint32_t seed = std::random_device()();
};

// Counters of all threads.
struct Tally {
  std::atomic<uint64_t> calls{0};
  std::atomic<uint64_t> searches{0};
  std::atomic<uint64_t> refused{0};  // while locked
  std::atomic<uint64_t> failed{0};   // by a kill
  std::atomic<bool> wrong{false};
};

// False when a stop was requested before the time had passed.
bool pauseFor(const std::stop_token& stop, milliseconds time) {
  std::mutex mutex;
  std::condition_variable_any wake;
  std::unique_lock lock(mutex);
  wake.wait_for(lock, stop, time, [] { return false; });
  return !stop.stop_requested();
}

// One client with its own mails in one class.
class Client {
 public:
  Client(int number, const Options& options, std::string directory, Tally& tally)
      : _prefix(fmt::format("c{}m", number)),
        _class(kClasses[static_cast<size_t>(number) % std::size(kClasses)]),
        _directory(std::move(directory)),
        _pause(options.pause),
        _random(options.seed + static_cast<uint32_t>(number)),
        _tally(tally) {}

  void work(const std::stop_token& stop) {
    while (!_tally.wrong && pauseFor(stop, milliseconds(_random() % (_pause.count() + 1)))) {
      if (!_service) _service.emplace(_directory, kPatience);
      ++_tally.calls;
      switch (_random() % 10) {
        case 0:
        case 1:
        case 2:
          add();
          break;
        case 3:
        case 4:
          remove();
          break;
        case 5:
          diagnose();
          break;
        default:
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
    TLQuery query;
    const std::string word = wordOf(mail);
    query.setRawQuery(platform::fromUTF8(word));
    query.setOriginalQuery(platform::fromUTF8(word));
    std::optional<TLError> error;
    const auto items =
        _service->searchItems(query, 0, _class, SearchServiceProxy::kNoMaximum, &error);
    if (!settle(items.has_value(), error)) return;
    ++_tally.searches;
    size_t count = 0;
    for (const auto& item : *items) {
      if (item->identifier() == platform::fromUTF8(word)) ++count;
    }
    if (count == (gone ? 0U : 1U)) return;
    fmt::print(stderr, "WRONG: {} of {} is found {} times\n", word, _class, count);
    _tally.wrong = true;
  }

  void diagnose() {
    client::DebugServiceProxy debug(_directory, kPatience);
    std::optional<TLError> error;
    switch (_random() % 40) {
      case 0:
        settle(debug.forceVacuumAndCompact(_class, &error), error);
        break;
      case 1:
        settle(debug.fetchStatsForIndexer(kName, _class, &error).has_value(), error);
        break;
      case 2:
        settle(_service->fetchLastClientState(kName, _class, &error).has_value(), error);
        break;
      default:
        settle(debug.ping(_prefix, &error).has_value(), error);
    }
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
  const milliseconds _pause;
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
      : _options(options), _directory(directory), _random(options.seed) {
    _daemon.emplace(directory);
  }

  [[nodiscard]] std::string runtimeDirectory() const { return _directory + "/run"; }

  // Runs until the end of the time or a wrong answer. False if the daemon ended unexpectedly.
  bool supervise(const Tally& tally) {
    const auto start = Clock::now() + _options.warmUp;
    auto nextKill = Clock::now() + _options.killEvery;
    while (Clock::now() - start < _options.length && !tally.wrong) {
      std::this_thread::sleep_for(milliseconds(200));
      if (Clock::now() >= start) measure(Clock::now() - start);
      if (_random() % 25 == 0) _daemon->signal(SIGUSR1);
      if (_random() % 25 == 0) {
        platform::writeFileAtomically(runtimeDirectory() + "/lock_status",
                                      _random() % 2 == 0 ? "1 1\n" : "0 1\n", nullptr);
      }
      if (Clock::now() < nextKill) continue;
      nextKill = Clock::now() + _options.killEvery;
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
    _daemon->signal(SIGTERM);
    const int status = _daemon->wait();
    return status == 0 || ended(status);
  }

  void report(const Tally& tally) const {
    fmt::print(
        "calls={} searches={} refused_while_locked={} failed_by_kills={} kills={} purges={} "
        "wrong={:d} rss_anon_median_mb={:.1f},{:.1f},{:.1f} rss_anon_max_mb={:.1f},{:.1f},{:.1f} "
        "seed={}\n",
        tally.calls.load(), tally.searches.load(), tally.refused.load(), tally.failed.load(),
        _kills, _purges, tally.wrong.load(), percentile(0, 50), percentile(1, 50),
        percentile(2, 50), percentile(0, 100), percentile(1, 100), percentile(2, 100),
        _options.seed);
  }

 private:
  void measure(Clock::duration time) {
    const auto third = static_cast<size_t>(3 * time / _options.length);
    const size_t memory = _daemon->anonymousKilobytes();
    if (memory != 0) _memory[std::min<size_t>(third, 2)].push_back(memory);
  }

  // Of the measured values of a third, in megabytes; 0 if there are none.
  [[nodiscard]] double percentile(size_t third, size_t percent) const {
    std::vector<size_t> sorted = _memory[third];
    if (sorted.empty()) return 0;
    std::ranges::sort(sorted);
    return static_cast<double>(sorted[(sorted.size() - 1) * percent / 100]) / 1024;
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
    fmt::print(stderr, "the daemon ended with status {}\n{}\n", status,
               _daemon->log().substr(0, 4000));
    return false;
  }

  const Options& _options;
  const std::string _directory;
  std::mt19937 _random;
  std::optional<DaemonProcess> _daemon;
  std::vector<size_t> _memory[3];  // for each third, in kilobytes
  int _kills = 0;
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
    for (int number = 0; number < options.clients; ++number) {
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
  for (int i = 1; i < argc; i += 2) {
    const std::string_view name = argv[i];
    const int value = i + 1 < argc ? std::atoi(argv[i + 1]) : -1;
    if (name == "--seconds" && value > 0) {
      options.length = seconds(value);
    } else if (name == "--warm-up" && value >= 0) {
      options.warmUp = seconds(value);
    } else if (name == "--purge-every" && value > 0) {
      options.purgeEvery = value;
    } else if (name == "--pause" && value >= 0) {
      options.pause = milliseconds(value);
    } else if (name == "--clients" && value > 0) {
      options.clients = value;
    } else if (name == "--kill-every" && value > 0) {
      options.killEvery = seconds(value);
    } else if (name == "--seed" && value >= 0) {
      options.seed = static_cast<uint32_t>(value);
    } else {
      fmt::print(stderr, "{}", kUsage);
      return 2;
    }
  }
  return soak(options);
}
