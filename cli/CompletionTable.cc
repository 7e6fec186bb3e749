#include "cli/CompletionTable.h"

#include <algorithm>
#include <sstream>

namespace cli {

namespace {

// An option with a few allowed values has them as the name of its validator; see oneOf.
std::vector<std::string> choicesOf(CLI::Option& option) {
  std::vector<std::string> choices;
  try {
    std::istringstream names(option.get_validator(0)->get_name());
    for (std::string name; names >> name;) choices.push_back(name);
  } catch (const CLI::OptionNotFound&) {
    // It takes any value.
  }
  return choices;
}

CompletionTable::Option rowOf(CLI::Option& option) {
  CompletionTable::Option row;
  for (const std::string& name : option.get_snames()) row.names.push_back('-' + name);
  for (const std::string& name : option.get_lnames()) row.names.push_back("--" + name);
  row.help = option.get_description();
  if (option.get_items_expected_max() > 0) row.value = option.get_type_name();
  row.choices = choicesOf(option);
  row.repeated = !row.value.empty() && option.get_expected_max() > 1;
  return row;
}

bool isAmong(const std::vector<CompletionTable::Option>& options,
             const CompletionTable::Option& row) {
  return std::ranges::any_of(options, [&](const auto& other) { return other.names == row.names; });
}

}  // namespace

CompletionTable completionTable(CLI::App& app) {
  CompletionTable table;
  for (CLI::Option* const option : app.get_options()) table.global.push_back(rowOf(*option));
  for (CLI::App* const sub : app.get_subcommands([](const CLI::App*) { return true; })) {
    if (sub->get_group().empty()) continue;
    CompletionTable::Command command{sub->get_name(), sub->get_description(), "", {}};
    for (CLI::Option* const option : sub->get_options()) {
      if (option->get_positional()) {
        command.operand = option->get_single_name();
      } else if (auto row = rowOf(*option); !isAmong(table.global, row)) {
        command.options.push_back(std::move(row));
      }
    }
    table.commands.push_back(std::move(command));
  }
  return table;
}

}  // namespace cli
