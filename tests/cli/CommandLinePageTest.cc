#include <gmock/gmock.h>

#include <array>
#include <cstdio>
#include <regex>
#include <set>

#include "platform/Files.h"

using testing::Contains;

// The program's own help and its man page name the same commands and options.
namespace {

using Names = std::set<std::string>;

std::string read(const char* path) {
  return platform::readFile(path, size_t{1} << 20, nullptr).value_or("");
}

std::string help(const std::string& command = "") {
  FILE* const pipe = popen((TALLOW_PROGRAM " help " + command).c_str(), "r");
  std::string text;
  std::array<char, 4096> bytes;
  while (const size_t count = fread(bytes.data(), 1, bytes.size(), pipe)) {
    text.append(bytes.data(), count);
  }
  EXPECT_EQ(pclose(pipe), 0) << command;
  return text;
}

Names found(const std::string& text, const char* pattern) {
  const std::regex expression(pattern);
  Names names;
  for (std::sregex_iterator at(text.begin(), text.end(), expression), end; at != end; ++at) {
    names.insert((*at)[1]);
  }
  return names;
}

Names commands() {
  const std::string text = help();
  return found(text.substr(text.find("Subcommands:")), "\n  ([a-z]+) ");
}

Names options() {
  const std::string any = "(?:^|[ ,])(--[a-z][a-z0-9-]*)";
  Names names = found(help(), any.c_str());
  for (const std::string& command : commands()) {
    const std::string text = help(command);
    names.merge(found(text.substr(0, text.find("Examples:")), any.c_str()));
  }
  return names;
}

// The page without the marks of its fonts, and with plain hyphens.
std::string page() {
  const std::string text = std::regex_replace(read(TALLOW_PAGE), std::regex("\\\\f[A-Z]"), "");
  return std::regex_replace(text, std::regex("\\\\-"), "-");
}

}  // namespace

TEST(CommandLinePageTest, ThePageHasEveryCommandAndOption) {
  const Names commandsOfPage = found(page(), "\n\\.B[IR]? \"?([a-z]+)");
  for (const std::string& command : commands()) EXPECT_THAT(commandsOfPage, Contains(command));
  const Names optionsOfPage = found(page(), "(--[a-z][a-z0-9-]*)");
  const Names known = options();
  for (const std::string& option : known) EXPECT_THAT(optionsOfPage, Contains(option));
  for (const std::string& option : optionsOfPage) {
    // Options of other programs.
    if (option == "--user" || option == "--now") continue;
    EXPECT_THAT(known, Contains(option));
  }
}
