#pragma once

#include <CLI/CLI.hpp>
#include <string>
#include <vector>

namespace cli {

// The command line as completions need it, read from the table that parses it.
struct CompletionTable {
  struct Option {
    std::vector<std::string> names;  // such as "-o", "--output"; short ones first
    std::string help;
    std::string value;                 // its name, such as "FILE"; empty for a flag
    std::vector<std::string> choices;  // all allowed values, if they are a few
    bool repeated = false;             // may be given several times

    [[nodiscard]] bool takesDirectory() const { return value == "DIR"; }
    [[nodiscard]] bool takesFile() const { return value == "FILE"; }
  };
  struct Command {
    std::string name;
    std::string help;
    std::string operand;  // what its arguments are, such as "PATH"; empty if it has none
    std::vector<Option> options;

    [[nodiscard]] bool takesFiles() const { return operand.find("PATH") != std::string::npos; }
    [[nodiscard]] bool takesSearches() const { return operand.find("WORDS") != std::string::npos; }
    [[nodiscard]] bool takesCommands() const { return operand == "COMMAND"; }
  };

  std::vector<Option> global;  // before and after every command
  std::vector<Command> commands;
};

// Hidden commands are left out.
[[nodiscard]] CompletionTable completionTable(CLI::App& app);

}  // namespace cli
