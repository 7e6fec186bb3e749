#include "bench/peers/Tools.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <utility>

#include "bench/Queries.h"

namespace peers {

namespace {

// All words except the last, each in quotes, so that none is an operator, and followed by a space.
std::string quotedWords(const std::vector<std::string>& words) {
  std::string text;
  for (size_t i = 0; i + 1 < words.size(); ++i) text += '"' + words[i] + "\" ";
  return text;
}

// The last word as a prefix for notmuch, which takes these words for operators in any case, star or
// not, unless the search is for the body alone.
std::string notmuchPrefix(const std::string& word) {
  static const std::array<std::string, 4> operators{"and", "or", "not", "xor"};
  std::string lower = word;
  for (char& c : lower) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  const bool isOperator = std::find(operators.begin(), operators.end(), lower) != operators.end();
  return (isOperator ? "body:" : "") + word + '*';
}

const std::string kMaxResultsText = std::to_string(bench::kMaxResults);

bench::Variables variablesOf(const bench::ScratchDirectory& scratch) {
  return {{"HOME", scratch / ""}, {"LC_ALL", "C.UTF-8"}};
}

}  // namespace

bench::Run Tool::run(const Arguments& arguments, const std::string& output,
                     std::vector<int> statuses, bool watchMemory) const {
  return bench::runProgram({arguments, variables, output, std::move(statuses)}, watchMemory);
}

Tool mu(const std::string& mail, const bench::ScratchDirectory& scratch) {
  const std::string home = "--muhome=" + scratch / "mu";
  const auto search = [home](const std::string& query) -> Arguments {
    const auto words = bench::wordsOfQuery(query);
    return {"mu", "find", home, "--maxnum=" + kMaxResultsText,
            quotedWords(words) + words.back() + '*'};
  };
  return {scratch / "mu/xapian",
          variablesOf(scratch),
          {"mu", "init", home, "--maildir=" + mail},
          {"mu", "index", home, "--quiet"},
          search,
          {0, 2, 4}};  // nothing found is 2 or 4, by version
}

Tool notmuch(const std::string& mail, const bench::ScratchDirectory& scratch) {
  const std::string directory = scratch / "notmuch";
  const std::string configuration = scratch / "config";
  std::filesystem::create_directory(directory);
  std::ofstream(configuration) << "[database]\npath=" << directory << "\nmail_root=" << mail
                               << "\n[user]\nname=Bench\nprimary_email=bench@example.org\n"
                                  "[new]\ntags=\n[search]\nexclude_tags=\n"
                                  "[maildir]\nsynchronize_flags=false\n";
  const auto search = [](const std::string& query) -> Arguments {
    const auto words = bench::wordsOfQuery(query);
    return {"notmuch", "search", "--limit=" + kMaxResultsText,
            quotedWords(words) + notmuchPrefix(words.back())};
  };
  bench::Variables variables = variablesOf(scratch);
  variables.emplace_back("NOTMUCH_CONFIG", configuration);
  return {directory, std::move(variables), {}, {"notmuch", "new", "--no-hooks", "--quiet"}, search,
          {0}};
}

}  // namespace peers
