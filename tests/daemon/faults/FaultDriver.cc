// Runs the daemon while single system calls fail or it is killed before them, and while
// descriptors, threads or address space run out. It must continue to answer or end in order, and
// after a restart everything acknowledged must be there exactly once. Exits with 1 at the first
// fault.
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <sys/resource.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <list>
#include <map>
#include <random>
#include <set>

#include "client/DebugServiceProxy.h"
#include "client/SearchServiceProxy.h"
#include "platform/Paths.h"
#include "salt/Index.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/daemon/DaemonSupport.h"
#include "tests/support/DriverOptions.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

using client::SearchServiceProxy;
using testsupport::DaemonProcess;
using testsupport::found;
namespace fs = std::filesystem;

constexpr const char* kUsage =
    "Usage: fault_driver [--mode faults] [--runs N] [--seed N]\n"
    "       fault_driver --mode descriptors|threads|memory\n"
    "faults: N random ones; without --runs each call at each place.\n";

constexpr const char* kClient = "fault driver";
constexpr const char* kClass = "default";
constexpr int kBefore = 60;  // mails indexed before the daemon under test starts
constexpr int kBatches = 6;
constexpr int kMailsInBatch = 25;
constexpr int kPlaces = 50;         // faults per call
constexpr int kOtherClasses = 10;   // classes opened with each batch, if needed to reach all calls
constexpr unsigned kPatience = 60;  // seconds
constexpr unsigned kLongPatience = 600;

// The possible errors of each call. Some calls are made mainly when a class or a connection is
// opened or closed.
struct Call {
  const char* name;
  std::vector<int> errors;
  bool opens = false;
};
const Call kCalls[] = {{"write", {ENOSPC, EIO, EINTR}},
                       {"pwrite64", {ENOSPC, EIO}},
                       {"fdatasync", {EIO, ENOSPC}},
                       {"openat", {EMFILE, EIO}},
                       {"fsync", {EIO, ENOSPC}, true},
                       {"rename", {EIO, ENOSPC}, true},
                       {"unlink", {EIO}, true},
                       {"mmap", {ENOMEM, EIO}, true},
                       {"accept4", {EMFILE, EINTR}, true},
                       {"clone3", {EAGAIN}, true},
                       {"ftruncate", {EIO, ENOSPC}, true}};

struct Trial {
  const Call* call;
  int at;              // counted from 1
  std::string action;  // an errno, or "kill"
  [[nodiscard]] std::string text() const { return fmt::format("{} {} {}", call->name, at, action); }
};

std::vector<Trial> allTrials() {
  std::vector<Trial> trials;
  for (const Call& call : kCalls) {
    for (int at = 1; at <= kPlaces; ++at) {
      for (const int error : call.errors) trials.push_back({&call, at, std::to_string(error)});
      trials.push_back({&call, at, "kill"});
    }
  }
  return trials;
}

// Aborts the daemon that is watched when the alarm of this process goes off.
pid_t watched = 0;
volatile std::sig_atomic_t hangs = 0;

void watch(const DaemonProcess& daemon, unsigned seconds) {
  watched = daemon.pid();
  hangs = 0;
  std::signal(SIGALRM, [](int) {
    hangs = 1;
    kill(watched, SIGABRT);
  });
  alarm(seconds);
}

std::string nameOf(int batch, int mail) {
  return fmt::format("b{}x{}", batch, mail);
}

std::string className(int number) {
  return fmt::format("class{}", number);
}

// What the daemon has acknowledged, and what it may or may not have done.
class Ledger {
 public:
  Ledger() {
    for (int i = 0; i < kBefore; ++i) _mails[fmt::format("old{}", i)] = State::present;
  }

  // Sends the batch of this number: new mails, and the deletion of two earlier ones. When sent
  // again, mails only, because the deletions may have been done. Returns the error, if any.
  std::optional<TLError> send(SearchServiceProxy& service, int batch, bool again) {
    const auto items = testsupport::mails(fmt::format("b{}x", batch), kMailsInBatch);
    std::vector<std::string> going;
    for (int i = 0; i < 2 && !again; ++i) going.push_back(fmt::format("old{}", 2 * batch + i));
    std::optional<TLError> error;
    const bool done =
        service.indexItems(items, going, std::to_string(batch), kClient, kClass, &error);
    for (const std::string& name : going) _mails[name] = done ? State::gone : State::unknown;
    for (const auto& item : items) _mails[item.identifier] = done ? State::present : State::unknown;
    if (done) _state = batch;
    if (!done) _statesTried.insert(batch);
    return error;
  }

  // Sends a mail to each of several more classes, over its own connection.
  void openClasses(const std::string& runtimeDirectory) {
    for (int i = 0; i < kOtherClasses; ++i) {
      SearchServiceProxy service(runtimeDirectory);
      const std::string name = className(_classesTried++);
      std::optional<TLError> error;
      if (service.indexItems(testsupport::mails("m", 1), kClient, name, &error)) {
        _classes.insert(name);
      }
    }
  }

  // What is wrong with these classes after a restart, or empty.
  [[nodiscard]] std::string checkClasses(SearchServiceProxy& service) const {
    for (const std::string& name : _classes) {
      if (testsupport::search(service, "word", name) != 1) return name + " has lost its mail";
    }
    return "";
  }

  // The first error in the results of a search, or empty.
  [[nodiscard]] std::string check(const std::multiset<std::string>& identifiers) const {
    for (const std::string& name : identifiers) {
      const auto mail = _mails.find(name);
      if (mail == _mails.end()) return name + " is unknown";
      if (identifiers.count(name) != 1) return name + " is found twice";
      if (mail->second == State::gone) return name + " was deleted and is found";
    }
    for (const auto& [name, state] : _mails) {
      if (state == State::present && !identifiers.contains(name)) {
        return name + " was acknowledged and is not found";
      }
    }
    return "";
  }

  // The first error in a stored client state: it must be the last acknowledged one or a later
  // attempt, and everything it covers must be found.
  [[nodiscard]] std::string checkState(const std::optional<std::string>& state,
                                       const std::multiset<std::string>& identifiers) const {
    if (!state) return _state < 0 ? "" : "the client state is gone";
    const int batch = std::atoi(state->c_str());
    if (batch != _state && !_statesTried.contains(batch)) return "the client state is " + *state;
    for (int i = 0; i < kMailsInBatch; ++i) {
      if (!identifiers.contains(nameOf(batch, i))) {
        return nameOf(batch, i) + " is covered by the client state and not found";
      }
    }
    return "";
  }

 private:
  enum class State { present, gone, unknown };

  std::map<std::string, State> _mails;
  int _state = -1;
  std::set<int> _statesTried;
  int _classesTried = 0;
  std::set<std::string> _classes;  // whose mail was acknowledged
};

struct Tally {
  int runs = 0;
  std::map<std::string, int> notReached;  // by call
  int ended = 0;                          // by the daemon, in order
  int killed = 0;
  int errors = 0;  // calls that were answered with one
};

// A state directory with mail, left by a killed daemon, so that opening it recovers.
void makeTemplate(const std::string& directory) {
  DaemonProcess daemon(directory);
  SearchServiceProxy service(daemon.runtimeDirectory());
  std::optional<TLError> error;
  if (!service.indexItems(testsupport::mails("old", kBefore), kClient, kClass, &error)) {
    throw std::runtime_error("no mail could be indexed: " + platform::printable(error));
  }
  daemon.signal(SIGKILL);
  daemon.wait();
}

// Uses a daemon with a fault until it ends. Returns what is wrong, or empty.
std::string work(DaemonProcess& daemon, const Trial& trial, Ledger& ledger, Tally& tally) {
  if (daemon.ready()) {
    SearchServiceProxy service(daemon.runtimeDirectory());
    client::DebugServiceProxy debug(daemon.runtimeDirectory());
    for (int batch = 0; batch < kBatches; ++batch) {
      if (ledger.send(service, batch, false)) {
        ++tally.errors;
        ledger.send(service, batch, true);
      }
      std::optional<TLError> error;
      if (const auto identifiers = found(service, "word", kClass, &error)) {
        if (std::string fault = ledger.check(*identifiers); !fault.empty()) return fault;
      }
      if (trial.call->opens) ledger.openClasses(daemon.runtimeDirectory());
      if (batch == kBatches / 2) debug.forceVacuumAndCompact(kClass, &error);
    }
    daemon.signal(SIGTERM);
  }
  const bool ready = daemon.ready();
  const int status = daemon.wait();
  if (status == 128 + SIGKILL && trial.action == "kill") {
    ++tally.killed;
    return "";
  }
  if (!ready) ++tally.ended;
  if (status == 0 || (!ready && status == 1)) return "";
  return fmt::format("the daemon ended with status {}", status);
}

std::string checkAfterRestart(const std::string& directory, Ledger& ledger) {
  {
    DaemonProcess daemon(directory);
    SearchServiceProxy service(daemon.runtimeDirectory());
    std::optional<TLError> error;
    const auto identifiers = found(service, "word", kClass, &error);
    if (!identifiers) return "no search after the restart: " + platform::printable(error);
    if (std::string fault = ledger.check(*identifiers); !fault.empty()) {
      return "after the restart " + fault;
    }
    const auto state = service.fetchLastClientState(kClient, kClass, &error);
    if (std::string fault = ledger.checkState(state, *identifiers); !fault.empty()) return fault;
    if (std::string fault = ledger.checkClasses(service); !fault.empty()) return fault;
    for (int batch = 0; batch < kBatches; ++batch) {
      error = ledger.send(service, batch, true);
      if (error) return "sending again failed: " + platform::printable(error);
    }
    const auto all = found(service, "word", kClass, &error);
    if (!all) return "no search after sending again: " + platform::printable(error);
    if (std::string fault = ledger.check(*all); !fault.empty()) {
      return "after sending again " + fault;
    }
    if (const int status = daemon.stop(); status != 0) {
      return fmt::format("the restarted daemon ended with status {}", status);
    }
  }
  const std::unique_ptr<salt::Index> index(
      salt::LoadIndex(platform::textIndexPath(platform::dataRoot(directory + "/state"), kClass)));
  return index != nullptr && index->Validate() ? "" : "the index does not validate";
}

std::string run(const Trial& trial, const std::string& pattern, const std::string& directory,
                Tally& tally) {
  ++tally.runs;
  fs::remove_all(directory);
  fs::create_directories(directory);
  fs::copy(pattern + "/state", directory + "/state", fs::copy_options::recursive);
  const std::string mark = directory + "/mark";
  Ledger ledger;
  {
    DaemonProcess daemon(directory, {{"LD_PRELOAD", TALLOW_FAULT_INJECTION},
                                     {"TALLOW_FAULT", trial.text()},
                                     {"TALLOW_FAULT_MARK", mark}});
    watch(daemon, kPatience);
    std::string fault = work(daemon, trial, ledger, tally);
    alarm(0);
    if (hangs != 0) fault = "the daemon hung";
    if (!fs::exists(mark)) ++tally.notReached[trial.call->name];
    if (!fault.empty()) {
      fmt::print(stderr, "{}\n", daemon.log().substr(0, 20000));
      return fault;
    }
  }
  return checkAfterRestart(directory, ledger);
}

int runFaults(uint64_t runs, uint32_t seed) {
  const testsupport::TemporaryDirectory scratch;
  const std::string pattern = scratch / "template";
  makeTemplate(pattern);
  std::vector<Trial> trials = allTrials();
  if (runs > 0) {
    std::mt19937 random(seed);
    std::shuffle(trials.begin(), trials.end(), random);
    trials.resize(std::min<size_t>(trials.size(), runs));
  }
  Tally tally;
  const auto start = std::chrono::steady_clock::now();
  for (const Trial& trial : trials) {
    const std::string fault = run(trial, pattern, scratch / "run", tally);
    if (fault.empty()) continue;
    fmt::print(stderr, "FAULT under \"{}\" of seed {}: {}\n{} is left\n", trial.text(), seed, fault,
               scratch / "run");
    _exit(1);
  }
  const std::chrono::duration<double> seconds = std::chrono::steady_clock::now() - start;
  fmt::print(
      "runs={} not_reached={} ended_in_order={} killed={} failed_calls={} seed={} "
      "seconds={:.1f}\n",
      tally.runs, tally.notReached, tally.ended, tally.killed, tally.errors, seed, seconds.count());
  return 0;
}

// ---- descriptors, threads and memory run out ----

constexpr int kClasses = 500;
constexpr size_t kConnections = 100;
constexpr int kMailsInClass = 5;

// Asks for many classes and opens many connections. Then the classes that were opened must answer
// correctly, if possible over another connection.
std::string exhaust(DaemonProcess& daemon) {
  std::set<int> open;
  std::map<std::string, int> refusals;
  std::optional<SearchServiceProxy> service;
  for (int number = 0; number < kClasses; ++number) {
    if (!service) service.emplace(daemon.runtimeDirectory());
    std::optional<TLError> error;
    const auto items = testsupport::mails("m", kMailsInClass);
    if (service->indexItems(items, kClient, className(number), &error)) {
      open.insert(number);
    } else if (error) {
      ++refusals[fmt::format("{} {}", error->domain, error->code)];
    }
  }
  std::list<client::DebugServiceProxy> idle;
  while (idle.size() < kConnections) {
    static_cast<void>(idle.emplace_back(daemon.runtimeDirectory()).ping("x", nullptr));
  }
  int wrong = 0;
  int unanswered = 0;
  SearchServiceProxy other(daemon.runtimeDirectory());
  for (const int number : open) {
    std::optional<TLError> error;
    auto identifiers = found(other, "word", className(number), &error);
    if (!identifiers) identifiers = found(*service, "word", className(number), &error);
    unanswered += identifiers ? 0 : 1;
    wrong += identifiers && identifiers->size() != kMailsInClass ? 1 : 0;
  }
  fmt::print("classes_open={} refused={} wrong={} unanswered={}\n", open.size(), refusals, wrong,
             unanswered);
  if (open.empty()) return "no class was opened";
  if (open.size() == kClasses) return "nothing ran out";
  if (wrong != 0) return "a class answered wrongly";
  if (unanswered != 0) return "an open class did not answer";
  return "";
}

struct Limit {
  const char* mode;
  int resource;  // of setrlimit, -1 for none
  rlim_t most;
};

constexpr Limit kLimits[] = {{"descriptors", RLIMIT_NOFILE, 256},
                             {"threads", -1, 200},
                             {"memory", RLIMIT_AS, rlim_t{1} << 30}};

int runLimit(const Limit& limit) {
  const testsupport::TemporaryDirectory scratch;
  testsupport::Process::Variables variables;
  if (limit.resource < 0) {
    variables = {{"LD_PRELOAD", TALLOW_FAULT_INJECTION},
                 {"TALLOW_FAULT_THREADS", std::to_string(limit.most)}};
  }
  DaemonProcess daemon(scratch.path(), variables);
  if (limit.resource >= 0) {
    const rlimit most{limit.most, limit.most};
    prlimit(daemon.pid(), static_cast<__rlimit_resource>(limit.resource), &most, nullptr);
  }
  watch(daemon, kLongPatience);
  std::string fault = exhaust(daemon);
  const int status = daemon.stop();
  alarm(0);
  if (hangs != 0) fault = "the daemon hung";
  if (status != 0) fault = fmt::format("the daemon ended with status {}; {}", status, fault);
  if (fault.empty()) return 0;
  fmt::print(stderr, "{}\nFAULT without {}: {}\n", daemon.endOfLog(), limit.mode, fault);
  return 1;
}

}  // namespace

int main(int argc, char** argv) {
  std::string mode = "faults";
  uint64_t runs = 0;
  uint64_t seed = std::random_device()();
  testsupport::readOptions(argc, argv, kUsage,
                           {{"--mode", &mode}, {"--runs", &runs}, {"--seed", &seed}});
  if (mode == "faults") return runFaults(runs, static_cast<uint32_t>(seed));
  for (const Limit& limit : kLimits) {
    if (mode == limit.mode) return runLimit(limit);
  }
  fmt::print(stderr, "{}", kUsage);
  return 2;
}
