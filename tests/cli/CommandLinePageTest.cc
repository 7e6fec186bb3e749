#include <gmock/gmock.h>

#include <regex>
#include <set>

#include "platform/Files.h"
#include "tests/support/ShellTest.h"

using testing::Contains;

// The program's own help and its man page name the same commands and options.
namespace {

using Names = std::set<std::string>;

Names found(const std::string& text, const char* pattern) {
  const std::regex expression(pattern);
  Names names;
  for (std::sregex_iterator at(text.begin(), text.end(), expression), end; at != end; ++at) {
    names.insert((*at)[1]);
  }
  return names;
}

class CommandLinePageTest : public testsupport::ShellTest {
 protected:
  CommandLinePageTest() { tallow = TALLOW_PROGRAM " help"; }

  Names commands() {
    const std::string text = outputOf("");
    return found(text.substr(text.find("Subcommands:")), "\n  ([a-z]+) ");
  }
  Names options() {
    constexpr const char* kAny = "(?:^|[ ,])(--[a-z][a-z0-9-]*)";
    Names names = found(outputOf(""), kAny);
    for (const std::string& command : commands()) {
      const std::string text = outputOf(command);
      names.merge(found(text.substr(0, text.find("Examples:")), kAny));
    }
    return names;
  }
};

// The page without the marks of its fonts, and with plain hyphens.
std::string page() {
  const auto source = platform::readFile(TALLOW_PAGE, size_t{1} << 20, nullptr).value_or("");
  const std::string text = std::regex_replace(source, std::regex("\\\\f[A-Z]"), "");
  return std::regex_replace(text, std::regex("\\\\-"), "-");
}

}  // namespace

TEST_F(CommandLinePageTest, ThePageHasEveryCommandAndOption) {
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
