#include "cli/Arguments.h"

#include <algorithm>
#include <array>

namespace cli {

namespace {

constexpr char kMinusOfWord = '\x01';

// Whether the next argument is the value of this option, of the program or of any command.
bool takesNext(const std::string& option, const CLI::App& app) {
  const auto takesValue = [&option](const CLI::App* owner) {
    const CLI::Option* const found = owner->get_option_no_throw(option);
    return found != nullptr && found->get_items_expected_min() > 0;
  };
  if (takesValue(&app)) return true;
  const auto commands = app.get_subcommands([](const CLI::App*) { return true; });
  return std::any_of(commands.begin(), commands.end(), takesValue);
}

bool isOption(const std::string& argument) {
  return argument.size() > 1 && argument[0] == '-';
}

// After `search` and similar commands, a word that begins with one minus is an option only if it is
// one of the short options.
void markWords(std::vector<std::string>& arguments) {
  const std::string& command = arguments.front();
  constexpr std::array<std::string_view, 4> kWithWords{"search", "explain", "save", "screen"};
  if (std::ranges::find(kWithWords, command) == kWithWords.end()) return;
  for (std::string& argument : arguments) {
    if (argument == "--") break;
    const bool isShort = argument == "-h" || argument == "-v" || argument == "-y";
    if (isOption(argument) && argument[1] != '-' && !isShort) argument[0] = kMinusOfWord;
  }
}

}  // namespace

std::vector<std::string> commandFirst(int argc, const char* const* argv, const CLI::App& app) {
  std::vector<std::string> arguments(argv + std::min(argc, 1), argv + argc);
  size_t at = 0;
  while (at < arguments.size() && isOption(arguments[at]) && arguments[at] != "--") {
    at += takesNext(arguments[at], app) ? 2 : 1;
  }
  if (at >= arguments.size() || arguments[at] == "--") return arguments;
  const auto begin = arguments.begin();
  std::rotate(begin, begin + static_cast<ptrdiff_t>(at), begin + static_cast<ptrdiff_t>(at) + 1);
  markWords(arguments);
  return arguments;
}

void restoreWords(std::vector<std::string>& words) {
  for (std::string& word : words) {
    if (word.starts_with(kMinusOfWord)) word[0] = '-';
  }
}

}  // namespace cli
