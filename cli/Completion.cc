#include "cli/Completion.h"

#include <fmt/format.h>
#include <fmt/ranges.h>

#include <functional>
#include <map>
#include <set>

namespace cli {

namespace {

using Command = CompletionTable::Command;
using Option = CompletionTable::Option;

// The text with a backslash before each of these characters.
std::string escaped(std::string_view text, std::string_view characters) {
  std::string result;
  for (const char c : text) {
    if (characters.find(c) != std::string_view::npos) result += '\\';
    result += c;
  }
  return result;
}

// In single quotes, for bash and zsh.
std::string shellQuoted(std::string_view text) {
  std::string result = "'";
  for (const char c : text) result += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return result + '\'';
}

// The script with each %NAME% replaced by its value, which is not looked into.
std::string filled(std::string_view script, const std::map<std::string, std::string>& values) {
  std::string result;
  for (size_t at = 0; at < script.size();) {
    const size_t begin = std::min(script.find('%', at), script.size());
    const size_t end = script.find('%', begin + 1);
    result += script.substr(at, begin - at);
    if (end == std::string_view::npos) break;
    result += values.at(std::string(script.substr(begin + 1, end - begin - 1)));
    at = end + 1;
  }
  return result;
}

template <typename Rows, typename Which>
std::string namesOf(const Rows& rows, const Which& which, const char* between = " ") {
  std::vector<std::string> names;
  for (const auto& row : rows) {
    if (which(row)) names.push_back(row.name);
  }
  return fmt::format("{}", fmt::join(names, between));
}

std::string allNames(const CompletionTable& table) {
  return namesOf(table.commands, [](const Command&) { return true; });
}

// --- bash

std::string optionNames(const std::vector<Option>& options) {
  std::vector<std::string> names;
  for (const Option& option : options) {
    names.insert(names.end(), option.names.begin(), option.names.end());
  }
  return fmt::format("{}", fmt::join(names, " "));
}

// The options of all commands that take a value, each once.
std::vector<Option> optionsWithValue(const CompletionTable& table) {
  std::vector<Option> all;
  std::set<std::string> seen;
  const auto add = [&](const std::vector<Option>& options) {
    for (const Option& option : options) {
      if (!option.value.empty() && seen.insert(option.names.back()).second) all.push_back(option);
    }
  };
  add(table.global);
  for (const Command& command : table.commands) add(command.options);
  return all;
}

std::string bashValue(const Option& option) {
  const char* const end = "return ;;\n";
  const std::string start = fmt::format("    {}) ", fmt::join(option.names, " | "));
  if (!option.choices.empty()) {
    return start + fmt::format("mapfile -t COMPREPLY < <(compgen -W '{}' -- \"$cur\"); {}",
                               fmt::join(option.choices, " "), end);
  }
  if (option.takesDirectory()) return start + "compopt -o dirnames; " + end;
  if (option.takesFile()) return start + "compopt -o default; " + end;
  return start + end;
}

constexpr const char* kBash =
    R"shell(# Bash completion of tallow(1), made by `tallow completion bash`.

# The names of saved searches.
_tallow_saved() {
  command tallow save 2>/dev/null | cut -d ' ' -f 1
}

# The options that can follow a command.
_tallow_options() {
  echo %global%
  case $1 in
%options%  esac
}

_tallow() {
  local cur=${COMP_WORDS[COMP_CWORD]} prev=${COMP_WORDS[COMP_CWORD - 1]}
  local commands=%commands%
  local takes=%takes%
  # Bash takes --option=value apart.
  if [[ $prev == = ]]; then
    prev=${COMP_WORDS[COMP_CWORD - 2]}
  elif [[ $cur == = ]]; then
    prev=${COMP_WORDS[COMP_CWORD - 1]} cur=
  fi
  COMPREPLY=()
  case $prev in
%values%  esac
  local command= i
  for ((i = 1; i < COMP_CWORD; i++)); do
    if [[ ${COMP_WORDS[i + 1]} == = ]]; then
      i=$((i + 2))
    elif [[ " $takes " == *" ${COMP_WORDS[i]} "* ]]; then
      i=$((i + 1))
    elif [[ ${COMP_WORDS[i]} != -* ]]; then
      command=${COMP_WORDS[i]}
      break
    fi
  done
  if [[ $cur == -* ]]; then
    mapfile -t COMPREPLY < <(compgen -W "$(_tallow_options "$command")" -- "$cur")
    return
  fi
  case $command in
    '' | %asking%) mapfile -t COMPREPLY < <(compgen -W "$commands" -- "$cur") ;;
    %files%) compopt -o default ;;
    %searches%)
      # Bash takes @NAME apart as well, and yet replaces all of it.
      [[ $prev == @ || $cur == @* ]] &&
        mapfile -t COMPREPLY < <(compgen -P @ -W "$(_tallow_saved)" -- "${cur#@}")
      ;;
  esac
}

complete -F _tallow tallow
)shell";

std::string bashScript(const CompletionTable& table) {
  std::string options;
  for (const Command& command : table.commands) {
    if (command.options.empty()) continue;
    options += fmt::format("    {}) echo {} ;;\n", command.name,
                           shellQuoted(optionNames(command.options)));
  }
  std::string values;
  const std::vector<Option> withValue = optionsWithValue(table);
  for (const Option& option : withValue) values += bashValue(option);
  return filled(
      kBash, {{"global", shellQuoted(optionNames(table.global))},
              {"options", options},
              {"commands", shellQuoted(allNames(table))},
              {"takes", shellQuoted(optionNames(withValue))},
              {"values", values},
              {"asking", namesOf(table.commands, std::mem_fn(&Command::takesCommands), " | ")},
              {"files", namesOf(table.commands, std::mem_fn(&Command::takesFiles), " | ")},
              {"searches", namesOf(table.commands, std::mem_fn(&Command::takesSearches), " | ")}});
}

// --- zsh

std::string zshValue(const Option& option) {
  if (option.value.empty()) return "";
  const std::string start = ':' + escaped(option.value, ":[]") + ':';
  if (!option.choices.empty()) return start + fmt::format("({})", fmt::join(option.choices, " "));
  if (option.takesDirectory()) return start + "_files -/";
  return option.takesFile() ? start + "_files" : start;
}

// One line for _arguments. Two names exclude each other.
std::string zshOption(const Option& option) {
  const std::string help = '[' + escaped(option.help, "[]\\") + ']' + zshValue(option);
  const auto named = [&](const std::string& name) {
    if (option.value.empty()) return name;
    return name + (name.starts_with("--") ? '=' : '+');
  };
  const char* const repeated = option.repeated ? "*" : "";
  if (option.names.size() == 1) return shellQuoted(repeated + named(option.names[0]) + help);
  return fmt::format("'({})'{{{},{}}}{}", fmt::join(option.names, " "), named(option.names[0]),
                     named(option.names[1]), shellQuoted(help));
}

std::string zshOperand(const Command& command) {
  const std::string start = "*:" + command.operand + ':';
  if (command.takesCommands()) return "'1:COMMAND:_tallow_commands'";
  if (command.takesFiles()) return shellQuoted(start + "_files");
  return command.takesSearches() ? shellQuoted(start + "_tallow_saved") : "";
}

constexpr const char* kZsh = R"shell(#compdef tallow
# Zsh completion of tallow(1), made by `tallow completion zsh`.

_tallow_commands() {
  local -a commands
  commands=(
%commands%  )
  _describe command commands
}

# The names of saved searches.
_tallow_saved() {
  local -a saved
  saved=(${(f)"$(command tallow save 2>/dev/null | cut -d ' ' -f 1)"})
  compadd -- @${^saved}
}

local curcontext=$curcontext state line
local -a global
global=(
%global%)
_arguments -C -S $global '1:command:_tallow_commands' '*::arguments:->arguments' && return
[[ $state == arguments ]] || return 1
case $words[1] in
%cases%esac
)shell";

std::string zshScript(const CompletionTable& table) {
  std::string commands;
  std::string cases;
  for (const Command& command : table.commands) {
    commands +=
        fmt::format("    {}\n", shellQuoted(command.name + ':' + escaped(command.help, "\\")));
    cases += fmt::format("  {})\n    _arguments -S $global", command.name);
    for (const Option& option : command.options) cases += " \\\n      " + zshOption(option);
    const std::string operand = zshOperand(command);
    cases += (operand.empty() ? "" : " \\\n      " + operand) + "\n    ;;\n";
  }
  std::string global;
  for (const Option& option : table.global) global += "  " + zshOption(option) + '\n';
  return filled(kZsh, {{"commands", commands}, {"global", global}, {"cases", cases}});
}

// --- fish

std::string quotedForFish(std::string_view text) {
  return '\'' + escaped(text, "\\'") + '\'';
}

// One line of `complete`; `command` is empty for an option of all commands.
std::string fishOption(const std::string& command, const Option& option) {
  std::string line = "complete -c tallow";
  if (!command.empty()) line += fmt::format(" -n '__tallow_in {}'", command);
  for (const std::string& name : option.names) {
    line += name.starts_with("--") ? " -l " + name.substr(2) : " -s " + name.substr(1);
  }
  if (!option.value.empty()) line += option.takesFile() ? " -r -F" : " -x";
  if (option.takesDirectory()) line += " -a '(__fish_complete_directories)'";
  if (!option.choices.empty()) line += fmt::format(" -a '{}'", fmt::join(option.choices, " "));
  return line + " -d " + quotedForFish(option.help) + '\n';
}

constexpr const char* kFish =
    R"shell(# Fish completion of tallow(1), made by `tallow completion fish`.

# Whether the command, the first word that is one, is among the arguments; without arguments, whether
# there is none yet.
function __tallow_in
    for word in (commandline -opc)[2..]
        if contains -- $word %commands%
            contains -- $word $argv
            return
        end
    end
    test (count $argv) -eq 0
end

# The names of saved searches.
function __tallow_saved
    for name in (command tallow save 2>/dev/null | string split -f 1 ' ')
        echo @$name
    end
end

complete -c tallow -f
complete -c tallow -n '__tallow_in %files%' -F
complete -c tallow -n '__tallow_in %searches%' -a '(__tallow_saved)'
complete -c tallow -n '__tallow_in %asking%' -a '%commands%'
%lines%)shell";

std::string fishScript(const CompletionTable& table) {
  std::string lines;
  for (const Command& command : table.commands) {
    lines += fmt::format("complete -c tallow -n __tallow_in -a {} -d {}\n", command.name,
                         quotedForFish(command.help));
  }
  for (const Option& option : table.global) lines += fishOption("", option);
  for (const Command& command : table.commands) {
    for (const Option& option : command.options) lines += fishOption(command.name, option);
  }
  return filled(kFish, {{"commands", allNames(table)},
                        {"lines", lines},
                        {"files", namesOf(table.commands, std::mem_fn(&Command::takesFiles))},
                        {"searches", namesOf(table.commands, std::mem_fn(&Command::takesSearches))},
                        {"asking", namesOf(table.commands, std::mem_fn(&Command::takesCommands))}});
}

}  // namespace

std::optional<std::string> completionScript(const CompletionTable& table, std::string_view shell) {
  if (shell == "bash") return bashScript(table);
  if (shell == "zsh") return zshScript(table);
  if (shell == "fish") return fishScript(table);
  return std::nullopt;
}

}  // namespace cli
