#include <fmt/format.h>
#include <poll.h>
#include <pty.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <stdexcept>
#include <string_view>

#include "bench/ChildProcess.h"
#include "bench/Corpus.h"
#include "bench/DaemonRun.h"
#include "bench/Percentiles.h"
#include "bench/Queries.h"

// How long it takes from a key of `tallow` on a terminal until the results are drawn.
namespace {

constexpr int kPatienceMilliseconds = 30000;
// Without output for so long, the screen is as it will be.
constexpr int kQuietMilliseconds = 30;

// The program at the other end of a terminal of its own. It marks each drawing of the screen: one
// for the line that has changed, the next for the results.
class Terminal {
 public:
  Terminal(const std::string& runtimeDirectory, const std::string& stateDirectory) {
    const std::string program = bench::programBeside("tallow");
    winsize size{};
    size.ws_row = 50;
    size.ws_col = 160;
    const pid_t parent = getpid();
    _process = forkpty(&_terminal, nullptr, nullptr, &size);
    if (_process < 0) throw std::system_error(errno, std::generic_category(), "forkpty");
    if (_process == 0) {
      prctl(PR_SET_PDEATHSIG, SIGKILL);
      if (getppid() != parent) _exit(127);
      setenv("TERM", "xterm-256color", 1);
      setenv("LC_ALL", "C.UTF-8", 1);
      execl(program.c_str(), "tallow", "--runtime-dir", runtimeDirectory.c_str(), "--state-dir",
            stateDirectory.c_str(), nullptr);
      _exit(127);
    }
    awaitDrawing();
    settle();
  }
  ~Terminal() {
    kill(_process, SIGKILL);
    waitpid(_process, nullptr, 0);
    close(_terminal);
  }
  Terminal(const Terminal&) = delete;
  Terminal& operator=(const Terminal&) = delete;

  void press(std::string_view keys) const {
    if (write(_terminal, keys.data(), keys.size()) != static_cast<ssize_t>(keys.size())) {
      throw std::system_error(errno, std::generic_category(), "write");
    }
  }

  // Returns once the screen has been drawn once more.
  void awaitDrawing() {
    while (_drawings == 0) {
      if (!readFor(kPatienceMilliseconds)) throw std::runtime_error("nothing is drawn");
    }
    --_drawings;
  }

  // Waits until nothing is drawn any more.
  void settle() {
    while (readFor(kQuietMilliseconds)) {
    }
    _drawings = 0;
  }

 private:
  // False where there is no output in that time.
  bool readFor(int milliseconds) {
    pollfd output{_terminal, POLLIN, 0};
    if (poll(&output, 1, milliseconds) == 0) return false;
    std::array<char, 16384> buffer;
    const ssize_t count = read(_terminal, buffer.data(), buffer.size());
    if (count <= 0) throw std::runtime_error("tallow has ended");
    _output.append(buffer.data(), static_cast<size_t>(count));
    constexpr std::string_view kEnd = "\x1b[?2026l";
    for (size_t at = _output.find(kEnd); at != std::string::npos; at = _output.find(kEnd)) {
      ++_drawings;
      _output.erase(0, at + kEnd.size());
    }
    if (_output.size() > kEnd.size()) _output.erase(0, _output.size() - kEnd.size());
    return true;
  }

  int _terminal = -1;
  pid_t _process = -1;
  std::string _output;  // that may hold the beginning of a mark
  size_t _drawings = 0;
};

struct Times {
  bench::Percentiles line;
  bench::Percentiles results;
};

// Types a query key by key.
void typeQuery(Terminal& terminal, const std::string& query, bool verbose, Times& times) {
  for (size_t i = 0; i < query.size(); ++i) {
    const double start = bench::secondsNow();
    terminal.press({&query[i], 1});
    terminal.awaitDrawing();
    const double line = bench::secondsNow() - start;
    terminal.awaitDrawing();
    const double results = bench::secondsNow() - start;
    terminal.settle();
    times.line.add(line);
    times.results.add(results);
    if (verbose) {
      fmt::print("{:8.2f} {:8.2f} {}\n", line * 1e3, results * 1e3, query.substr(0, i + 1));
    }
  }
  terminal.press("\x15");  // Ctrl-U
  terminal.settle();
}

int run(int argc, char** argv) {
  std::vector<std::string> paths{TALLOW_SAMPLE_MAIL};
  std::string stateDirectory;
  size_t queryCount = 5;
  uint32_t seed = 1;
  bool verbose = false;
  CLI::App app("Types searches on a terminal, and times each key until the results are drawn.",
               "screen_benchmark");
  app.add_option("MAIL", paths, "Maildirs, mbox files, directories (default: the sample mail)");
  app.add_option(
      "--state", stateDirectory,
      "Search the index that ingest_benchmark has kept here instead of indexing the mail");
  app.add_option("--queries", queryCount, "How many (default: 5)")
      ->check(CLI::Range(size_t{1}, size_t{100000}));
  app.add_option("--seed", seed, "Of the choice of words (default: 1)");
  app.add_flag("-v,--verbose", verbose, "Print each key's milliseconds and what was typed");
  CLI11_PARSE(app, argc, argv);
  const bool indexed = !stateDirectory.empty();

  const bench::ScratchDirectory scratch;
  if (!indexed) stateDirectory = scratch / "state";
  bench::ItemSpool spool(scratch);
  bench::QuerySource source(seed);
  spool.fill(paths, [&](const client::EncodedItem& item) { source.see(item); });
  bench::DaemonRun daemon(scratch, stateDirectory);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  if (!indexed) spool.send(service);
  static_cast<void>(bench::timedSearch(service, "warm"));  // opens the index
  Times times;
  {
    Terminal terminal(daemon.runtimeDirectory(), stateDirectory);
    for (const std::string& query : source.drawAll(queryCount)) {
      typeQuery(terminal, query, verbose, times);
    }
  }
  daemon.stop();
  fmt::print(
      "mails={} keys={} line_median_ms={:.2f} line_p99_ms={:.2f} results_median_ms={:.2f} "
      "results_p95_ms={:.2f} results_p99_ms={:.2f} results_max_ms={:.2f}\n",
      spool.items(), times.results.size(), times.line.at(0.5) * 1e3, times.line.at(0.99) * 1e3,
      times.results.at(0.5) * 1e3, times.results.at(0.95) * 1e3, times.results.at(0.99) * 1e3,
      times.results.at(1) * 1e3);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("screen_benchmark", run, argc, argv);
}
