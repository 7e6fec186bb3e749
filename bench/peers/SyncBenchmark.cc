#include <fmt/format.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <map>
#include <memory>
#include <stdexcept>
#include <thread>

#include "bench/ChildProcess.h"
#include "bench/Corpus.h"
#include "bench/MemoryWatch.h"
#include "bench/Percentiles.h"
#include "bench/Queries.h"
#include "bench/peers/SyncMailbox.h"
#include "bench/peers/SyncSystems.h"

// Keeping an index in step with a mailbox, beside other indexers of mail: the same mailbox, in one
// run.
namespace {

using peers::SyncSystem;

struct Options {
  std::string maildir = TALLOW_SAMPLE_MAILDIR;
  std::vector<size_t> times{1};
  size_t folders = 20;
  size_t rounds = 3;
  size_t deliveries = 20;
  double idleSeconds = 1;
  bool requireAll = false;
};

constexpr size_t kNewMails = 10;

// After this the time of a directory that was changed tells the next change as well.
constexpr std::chrono::milliseconds kSettling{2500};

constexpr double kUnknown = std::numeric_limits<double>::quiet_NaN();

struct Figures {
  bench::Run first{kUnknown, kUnknown, 0};
  bench::Percentiles unchanged;  // in seconds
  bench::Percentiles withNew;
  bench::Percentiles unchangedCPU;

  [[nodiscard]] static double milliseconds(const bench::Percentiles& seconds, double part) {
    return seconds.size() == 0 ? kUnknown : seconds.at(part) * 1e3;
  }
};

using AllFigures = std::map<std::string, Figures>;

// Each line as soon as there is one: the whole takes its time.
void printLine(const std::string& line) {
  fmt::print("{}\n", line);
  std::fflush(stdout);
}

void printSystem(const std::string& name, const Figures& figures) {
  printLine(fmt::format(
      "system={} first_s={:.2f} first_cpu_s={:.2f} unchanged_ms={:.1f} unchanged_max_ms={:.1f} "
      "unchanged_cpu_ms={:.1f} new{}_ms={:.1f} new{}_max_ms={:.1f}",
      name, figures.first.seconds, figures.first.cpuSeconds,
      Figures::milliseconds(figures.unchanged, 0.5), Figures::milliseconds(figures.unchanged, 1),
      Figures::milliseconds(figures.unchangedCPU, 0.5), kNewMails,
      Figures::milliseconds(figures.withNew, 0.5), kNewMails,
      Figures::milliseconds(figures.withNew, 1)));
}

void expectAdded(const SyncSystem& system, uint64_t mails) {
  if (system.added().value_or(mails) == mails) return;
  throw std::runtime_error(fmt::format("{} has added {} mails, and there were {}", system.name(),
                                       *system.added(), mails));
}

// The systems that stay in step, in turns, so that none always comes first.
class Turns {
 public:
  explicit Turns(std::vector<std::unique_ptr<SyncSystem>>& systems) : _systems(systems) {}

  template <typename Visit>
  void forEach(const Visit& visit) {
    const size_t first = _turn++;
    for (size_t i = 0; i < _systems.size(); ++i) visit(*_systems[(first + i) % _systems.size()]);
  }

  // Changes are taken in by all, and are so old that nobody has a second look at them.
  void settle() {
    for (int i = 0; i < 2; ++i) {
      std::this_thread::sleep_for(kSettling);
      forEach([](SyncSystem& system) { system.update(); });
    }
  }

 private:
  std::vector<std::unique_ptr<SyncSystem>>& _systems;
  size_t _turn = 0;
};

void measureUpdates(std::vector<std::unique_ptr<SyncSystem>>& systems, peers::SyncMailbox& mailbox,
                    size_t rounds, AllFigures& figures) {
  Turns turns(systems);
  turns.settle();
  for (size_t round = 0; round < rounds; ++round) {
    turns.forEach([&](SyncSystem& system) {
      const bench::Run run = system.update();
      expectAdded(system, 0);
      figures[system.name()].unchanged.add(run.seconds);
      figures[system.name()].unchangedCPU.add(run.cpuSeconds);
    });
    for (size_t i = 0; i < kNewMails; ++i) mailbox.deliver();
    turns.forEach([&](SyncSystem& system) {
      figures[system.name()].withNew.add(system.update().seconds);
      expectAdded(system, kNewMails);
    });
    turns.settle();
  }
}

// Seconds until a search finds the word.
double awaitWord(client::SearchServiceProxy& service, const std::string& word, double start) {
  constexpr double kMaxSeconds = 60;
  constexpr std::chrono::milliseconds kPoll{1};
  while (bench::timedSearch(service, word, true).results == 0) {
    if (bench::secondsNow() - start > kMaxSeconds)
      throw std::runtime_error("the watch finds nothing");
    std::this_thread::sleep_for(kPoll);
  }
  return bench::secondsNow() - start;
}

void measureWatch(const peers::TallowSync& tallow, peers::SyncMailbox& mailbox,
                  const Options& options) {
  constexpr std::chrono::milliseconds kPause{200};
  client::SearchServiceProxy service(tallow.daemon().runtimeDirectory());
  const auto watch = tallow.startWatch();
  const std::string firstWord = mailbox.deliver();
  awaitWord(service, firstWord, bench::secondsNow());
  bench::Percentiles found;
  for (size_t i = 0; i < options.deliveries; ++i) {
    std::this_thread::sleep_for(kPause);
    const double start = bench::secondsNow();
    const std::string word = mailbox.deliver();
    found.add(awaitWord(service, word, start));
  }
  std::this_thread::sleep_for(2 * kSettling);
  const double watchCPU = watch->cpuSeconds();
  const double daemonCPU = tallow.daemon().cpuSeconds();
  const uint64_t sleeps = watch->sleeps();
  std::this_thread::sleep_for(std::chrono::duration<double>(options.idleSeconds));
  printLine(fmt::format(
      "watch folders={} deliveries={} found_p50_ms={:.0f} found_p99_ms={:.0f} found_max_ms={:.0f} "
      "idle_s={:.0f} idle_cpu_ms={:.2f} idle_wakeups={} daemon_idle_cpu_ms={:.2f} "
      "rss_anon_mb={:.1f}",
      options.folders, found.size(), found.at(0.5) * 1e3, found.at(0.99) * 1e3, found.at(1) * 1e3,
      options.idleSeconds, (watch->cpuSeconds() - watchCPU) * 1e3, watch->sleeps() - sleeps,
      (tallow.daemon().cpuSeconds() - daemonCPU) * 1e3,
      static_cast<double>(bench::statusNumber(watch->pid(), "RssAnon:")) / 1e3));
  watch->stop();
}

double ratio(const bench::Percentiles& ours, const bench::Percentiles& theirs) {
  return Figures::milliseconds(ours, 0.5) / Figures::milliseconds(theirs, 0.5);
}

void printRatios(AllFigures& figures) {
  const Figures& tallow = figures["tallow"];
  std::string line = fmt::format("ratios first_vs_tallow_index={:.2f}",
                                 tallow.first.seconds / figures["tallow_index"].first.seconds);
  for (const char* name : {"notmuch", "mu"}) {
    const Figures& other = figures[name];
    line += fmt::format(" first_vs_{0}={1:.2f} unchanged_vs_{0}={2:.2f} new{3}_vs_{0}={4:.2f}",
                        name, tallow.first.seconds / other.first.seconds,
                        ratio(tallow.unchanged, other.unchanged), kNewMails,
                        ratio(tallow.withNew, other.withNew));
  }
  printLine(line + fmt::format(" unchanged_behind_notmuch_ms={:.1f}",
                               Figures::milliseconds(tallow.unchanged, 0.5) -
                                   Figures::milliseconds(figures["notmuch"].unchanged, 0.5)));
}

// Whether the program is there; what is missing is asked for before hours of work.
bool isInstalled(const char* name, const Options& options, const bench::ScratchDirectory& scratch) {
  if (bench::versionOf(name, scratch / "version")) return true;
  if (options.requireAll) throw std::runtime_error(std::string(name) + " is not installed");
  fmt::print(stderr, "sync_benchmark: {} is not installed; its figures will be nan\n", name);
  return false;
}

void measureSize(const Options& options, size_t times, const std::vector<std::string>& tools) {
  const bench::ScratchDirectory scratch;
  peers::SyncMailbox mailbox(scratch / "mail", options.maildir, times, options.folders);
  printLine(fmt::format("mails={} folders={} mail_mb={:.1f}", mailbox.mails(), options.folders,
                        static_cast<double>(mailbox.bytes()) / 1e6));
  AllFigures figures;
  const auto measureFirst = [&](SyncSystem& system) {
    sync();
    figures[system.name()].first = system.update();
  };
  {
    peers::TallowIndex index(mailbox.root());
    measureFirst(index);
  }
  std::vector<std::unique_ptr<SyncSystem>> systems;
  auto owned = std::make_unique<peers::TallowSync>(mailbox.root());
  const peers::TallowSync& tallow = *owned;
  systems.push_back(std::move(owned));
  for (const std::string& tool : tools) {
    systems.push_back(std::make_unique<peers::ToolSync>(
        tool, tool == "mu" ? peers::mu : peers::notmuch, mailbox.root()));
  }
  for (const auto& system : systems) measureFirst(*system);
  measureUpdates(systems, mailbox, options.rounds, figures);
  for (const char* name : {"tallow", "tallow_index", "notmuch", "mu"}) {
    printSystem(name, figures[name]);
  }
  measureWatch(tallow, mailbox, options);
  printRatios(figures);
}

int run(int argc, char** argv) {
  Options options;
  CLI::App app("Measures how an index is kept in step with a mailbox, beside mu and notmuch.",
               "sync_benchmark");
  app.add_option("MAILDIR", options.maildir,
                 "The Maildir whose mails the mailbox is made of (default: of the sample mail)")
      ->check(CLI::ExistingDirectory);
  app.add_option("--times", options.times,
                 "How many times as many mails; several sizes, parted by commas, are measured one "
                 "after the other (default: 1)")
      ->delimiter(',')
      ->allow_extra_args(false)
      ->check(CLI::Range(size_t{1}, size_t{10000}));
  app.add_option("--folders", options.folders, "Folders of the mailbox (default: 20)")
      ->check(CLI::Range(size_t{1}, size_t{100000}));
  app.add_option("--rounds", options.rounds, "How often it is brought in step (default: 3)")
      ->check(CLI::Range(size_t{1}, size_t{1000}));
  app.add_option("--deliveries", options.deliveries,
                 "Mails that a watch is timed with (default: 20)")
      ->check(CLI::Range(size_t{1}, size_t{100000}));
  app.add_option("--idle", options.idleSeconds,
                 "Seconds for which the watch is looked at while nothing happens (default: 1)")
      ->check(CLI::Range(0.0, 86400.0));
  app.add_flag("--require-all", options.requireAll, "Fail when mu or notmuch is not installed");
  CLI11_PARSE(app, argc, argv);
  const bench::ScratchDirectory scratch;
  std::vector<std::string> tools;
  for (const char* name : {"notmuch", "mu"}) {
    if (isInstalled(name, options, scratch)) tools.emplace_back(name);
  }
  for (const size_t times : options.times) measureSize(options, times, tools);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("sync_benchmark", run, argc, argv);
}
