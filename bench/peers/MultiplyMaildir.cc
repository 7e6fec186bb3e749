#include <CLI/CLI.hpp>
#include <algorithm>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <random>
#include <stdexcept>
#include <string_view>

#include "bench/DaemonRun.h"

// Multiplies a Maildir to measure sizes that are not at hand: the copies differ in the Message-ID
// and in one word, so no indexer takes them for duplicates.
namespace {

namespace fs = std::filesystem;

// Position of the header field with this name; npos if there is none.
size_t findField(std::string_view mail, std::string_view name) {
  for (size_t line = 0; line < mail.size() && mail[line] != '\n' && mail[line] != '\r';) {
    const std::string_view start = mail.substr(line, name.size());
    const bool same = std::equal(start.begin(), start.end(), name.begin(), name.end(),
                                 [](unsigned char a, char b) { return std::tolower(a) == b; });
    if (same) return line;
    const size_t end = mail.find('\n', line);
    if (end == std::string_view::npos) break;
    line = end + 1;
  }
  return std::string_view::npos;
}

// Changes the Message-ID, if there is one, and appends a line with the word.
std::string changed(std::string mail, size_t copy, const std::string& word) {
  constexpr std::string_view kField = "message-id:";
  if (const size_t field = findField(mail, kField); field != std::string_view::npos) {
    const size_t id = mail.find_first_not_of("< \t\r\n", field + kField.size());
    const bool empty = id == std::string::npos || mail[id - 1] == '\n';
    if (!empty) mail.insert(id, "copy" + std::to_string(copy) + '.');
  }
  if (!mail.ends_with('\n')) mail += '\n';
  return mail + word + '\n';
}

class Multiplier {
 public:
  explicit Multiplier(size_t times) : _times(times) {}

  // Processes mails in order of their names, so the same Maildir always gives the same copies.
  void multiply(const fs::path& source, const fs::path& target) {
    std::vector<fs::path> mails;
    for (const auto& entry : fs::directory_iterator(source)) {
      if (entry.is_regular_file()) mails.push_back(entry.path());
    }
    std::sort(mails.begin(), mails.end());
    for (const fs::path& path : mails) {
      std::ifstream file(path, std::ios::binary);
      const std::string mail{std::istreambuf_iterator<char>(file), {}};
      if (!file) throw std::runtime_error(path.string() + ": cannot be read");
      const std::string name = path.filename();
      write(target / name, mail);
      // The number comes first, so the copies of one mail are not neighbours.
      for (size_t copy = 1; copy < _times; ++copy) {
        write(target / ("copy" + std::to_string(copy) + '.' + name), changed(mail, copy, word()));
      }
    }
  }

 private:
  static void write(const fs::path& path, const std::string& mail) {
    std::ofstream file(path, std::ios::binary);
    if (!(file << mail).flush()) throw std::runtime_error(path.string() + ": cannot be written");
  }

  std::string word() {
    constexpr size_t kLetters = 10;
    std::string word(kLetters, ' ');
    for (char& letter : word) letter = static_cast<char>('a' + _random() % 26);
    return word;
  }

  const size_t _times;
  std::mt19937 _random;  // with the default seed
};

int run(int argc, char** argv) {
  std::string source;
  std::string target;
  size_t times = 1;
  CLI::App app("Makes a Maildir with all mails of another one and changed copies of them.",
               "multiply_maildir");
  app.add_option("SOURCE", source, "The Maildir to copy")
      ->required()
      ->check(CLI::ExistingDirectory);
  app.add_option("TARGET", target, "The Maildir to make, new or empty")->required();
  app.add_option("--times", times, "How many times as many mails (default: 1)")
      ->check(CLI::Range(size_t{1}, size_t{10000}));
  CLI11_PARSE(app, argc, argv);
  if (fs::exists(target) && !fs::is_empty(target)) {
    throw std::runtime_error(target + " is not empty");
  }
  Multiplier multiplier(times);
  for (const char* folder : {"cur", "new", "tmp"})
    fs::create_directories(fs::path(target) / folder);
  for (const char* folder : {"cur", "new"}) {
    if (!fs::is_directory(fs::path(source) / folder)) continue;
    multiplier.multiply(fs::path(source) / folder, fs::path(target) / folder);
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("multiply_maildir", run, argc, argv);
}
