#include <unistd.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "bench/ChildProcess.h"
#include "bench/DaemonRun.h"
#include "bench/peers/Fts5.h"
#include "bench/peers/Peers.h"

namespace peers {

namespace {

using Arguments = std::vector<std::string>;

// A mail indexer with commands for indexing and searching.
struct Tool {
  std::string directory;  // of its database
  bench::Variables variables;
  Arguments prepare;  // not timed; may be empty
  Arguments index;
  std::function<Arguments(const std::string& query)> search;
  std::vector<int> searchStatuses;  // found or nothing found
};

// All words but the last, quoted so that none is an operator, each followed by a space.
std::string quotedWords(const std::vector<std::string>& words) {
  std::string text;
  for (size_t i = 0; i + 1 < words.size(); ++i) text += '"' + words[i] + "\" ";
  return text;
}

// The last word as a prefix for notmuch, which takes these words for operators in any case, with or
// without star, unless the search is restricted to the body.
std::string notmuchPrefix(const std::string& word) {
  static const std::array<std::string, 4> operators{"and", "or", "not", "xor"};
  std::string lower = word;
  for (char& c : lower) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  const bool isOperator = std::find(operators.begin(), operators.end(), lower) != operators.end();
  return (isOperator ? "body:" : "") + word + '*';
}

// Every search prints one line per result.
class ToolRun {
 public:
  ToolRun(Tool tool, const Workload& work, std::string output)
      : _tool(std::move(tool)), _work(work), _output(std::move(output)) {}

  // The figures of indexing only.
  [[nodiscard]] Figures index() const {
    Figures figures;
    if (!_tool.prepare.empty()) run(_tool.prepare, {0}, false);
    sync();
    const bench::Run indexing = run(_tool.index, {0}, true);
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
  bench::Run run(const Arguments& arguments, std::vector<int> statuses, bool watchMemory) const {
    return bench::runProgram({arguments, _tool.variables, _output, std::move(statuses)},
                             watchMemory);
  }

  [[nodiscard]] bench::TimedSearch search(const std::string& query) const {
    const double seconds = run(_tool.search(query), _tool.searchStatuses, false).seconds;
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

const std::string kMaxResultsText = std::to_string(bench::kMaxResults);

Tool mu(const Workload& work, const bench::ScratchDirectory& scratch) {
  const std::string home = "--muhome=" + scratch / "mu";
  const auto search = [home](const std::string& query) -> Arguments {
    const auto words = bench::wordsOfQuery(query);
    return {"mu", "find", home, "--maxnum=" + kMaxResultsText,
            quotedWords(words) + words.back() + '*'};
  };
  return {scratch / "mu/xapian",
          {{"HOME", scratch / ""}, {"LC_ALL", "C.UTF-8"}},
          {"mu", "init", home, "--maildir=" + work.maildir},
          {"mu", "index", home, "--quiet"},
          search,
          {0, 2, 4}};  // nothing found is 2 or 4, depending on the version
}

}  // namespace

Figures measureMu(const Workload& work) {
  const bench::ScratchDirectory scratch;
  return ToolRun(mu(work, scratch), work, scratch / "output").measure();
}

Figures indexByMu(const Workload& work) {
  const bench::ScratchDirectory scratch;
  return ToolRun(mu(work, scratch), work, scratch / "output").index();
}

Figures measureNotmuch(const Workload& work) {
  const bench::ScratchDirectory scratch;
  const std::string directory = scratch / "notmuch";
  const std::string configuration = scratch / "config";
  std::filesystem::create_directory(directory);
  std::ofstream(configuration) << "[database]\npath=" << directory << "\nmail_root=" << work.maildir
                               << "\n[user]\nname=Bench\nprimary_email=bench@example.org\n"
                                  "[new]\ntags=\n[search]\nexclude_tags=\n"
                                  "[maildir]\nsynchronize_flags=false\n";
  const auto search = [](const std::string& query) -> Arguments {
    const auto words = bench::wordsOfQuery(query);
    return {"notmuch", "search", "--limit=" + kMaxResultsText,
            quotedWords(words) + notmuchPrefix(words.back())};
  };
  const Tool tool{
      directory, {{"HOME", scratch / ""}, {"LC_ALL", "C.UTF-8"}, {"NOTMUCH_CONFIG", configuration}},
      {},        {"notmuch", "new", "--no-hooks", "--quiet"},
      search,    {0}};
  return ToolRun(tool, work, scratch / "output").measure();
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
