#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "bench/ChildProcess.h"
#include "bench/DaemonRun.h"
#include "bench/peers/Fts5.h"
#include "bench/peers/Peers.h"
#include "bench/peers/Tools.h"

namespace peers {

namespace {

// Every search prints one line per result.
class ToolRun {
 public:
  ToolRun(Tool tool, const Workload& work, std::string output)
      : _tool(std::move(tool)), _work(work), _output(std::move(output)) {}

  // The figures of indexing only.
  [[nodiscard]] Figures index() const {
    Figures figures;
    if (!_tool.prepare.empty()) (void)_tool.run(_tool.prepare, _output);
    sync();
    const bench::Run indexing = _tool.run(_tool.index, _output, {0}, true);
    figures.mailsPerSecond = static_cast<double>(_work.mails) / indexing.seconds;
    figures.cpuSeconds = indexing.cpuSeconds;
    figures.residentPeak = static_cast<double>(indexing.residentPeak);
    figures.diskBytes = static_cast<double>(bench::bytesOnDisk(_tool.directory));
    return figures;
  }

  Figures measure() {
    Figures figures = index();
    const Search searchAndStart = [this](const std::string& query) {
      constexpr uint64_t kQueriesAStart = 5;
      if (_queries++ % kQueriesAStart == 0) _starts.add(search("zqxjvwzqxjvw").seconds);
      return search(query);
    };
    timeQueries(_work, searchAndStart, figures);
    takeStartOff(figures);
    return figures;
  }

 private:
  [[nodiscard]] bench::TimedSearch search(const std::string& query) const {
    const double seconds = _tool.run(_tool.search(query), _output, _tool.searchStatuses).seconds;
    std::ifstream lines(_output, std::ios::binary);
    const auto results = std::count(std::istreambuf_iterator<char>(lines), {}, '\n');
    return {seconds, static_cast<size_t>(results)};
  }

  // Measures, in turns with the queries, a search without results: starting the program and opening
  // its index.
  void takeStartOff(Figures& figures) const {
    figures.startSeconds = _starts.at(0.5);
    figures.first.takeOff(figures.startSeconds);
    figures.again.takeOff(figures.startSeconds);
  }

  const Tool _tool;
  const Workload& _work;
  const std::string _output;
  uint64_t _queries = 0;
  bench::Percentiles _starts;
};

}  // namespace

Figures measureMu(const Workload& work) {
  const bench::ScratchDirectory scratch;
  return ToolRun(mu(work.maildir, scratch), work, scratch / "output").measure();
}

Figures indexByMu(const Workload& work) {
  const bench::ScratchDirectory scratch;
  return ToolRun(mu(work.maildir, scratch), work, scratch / "output").index();
}

Figures measureNotmuch(const Workload& work) {
  const bench::ScratchDirectory scratch;
  return ToolRun(notmuch(work.maildir, scratch), work, scratch / "output").measure();
}

Figures measureFts5(const Workload& work, bool optimize) {
  const bench::ScratchDirectory scratch;
  const std::string directory = scratch / "fts5";
  const std::string path = directory + "/mail.db";
  std::filesystem::create_directory(directory);
  Figures figures;
  sync();
  const bench::Run indexing = bench::runProgram(
      {{bench::programBeside("fts5_index"), work.spoolPath, path}, {}, scratch / "output"}, true);
  figures.mailsPerSecond = static_cast<double>(work.mails) / indexing.seconds;
  figures.cpuSeconds = indexing.cpuSeconds;
  figures.residentPeak = static_cast<double>(indexing.residentPeak);
  Fts5Database database(path);
  if (optimize) {
    database.optimize();
    database.checkpoint();
  }
  figures.diskBytes = static_cast<double>(bench::bytesOnDisk(directory));
  const Search search = [&](const std::string& query) {
    const double start = bench::secondsNow();
    const size_t results = database.search(query);
    return bench::TimedSearch{bench::secondsNow() - start, results};
  };
  timeQueries(work, search, figures);
  return figures;
}

}  // namespace peers
