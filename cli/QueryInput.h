#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "cli/Options.h"
#include "cli/SearchPlan.h"
#include "platform/TLError.h"
#include "records/TLQuery.h"

namespace cli {

// The interpretation of one text of the query language, step by step.
struct Understanding {
  std::string expression;               // the text
  std::string parseTree;                // as grouped by the parser
  std::shared_ptr<TLQueryNode> before;  // the tree before optimisation
  std::shared_ptr<TLQueryNode> after;   // after optimisation; null if nothing is left
};

// The query of a command line.
struct QueryInput {
  std::string words;  // as typed, joined by single spaces; empty with --query
  std::shared_ptr<TLQuery> query;
  Understanding main;
  std::optional<Understanding> filter;  // all filters together
  usersyntax::Query typed;              // the words, parsed in the user syntax
  SearchPlan plan;
  // Notes for the user about parts of an expression that are ignored or unknown.
  std::vector<std::string> remarks;

  // The words to mark in results, as one text.
  [[nodiscard]] std::string markedWords() const;
};

// Plain words become a query like that of a mail client: one disjunction over the text attributes,
// which the optimiser turns into free text again. Anything else, and conditions that the daemon
// does not look up, becomes a plan of several queries and checks. Nullopt with an error for invalid
// expressions or parameters. `now` is in seconds since 1970.
[[nodiscard]] std::optional<QueryInput> queryInput(const Options& options, double now,
                                                   TLErrorOut error);

// The arguments of a search that was typed as one line, split as a shell does: at spaces outside of
// quotes. Joined by spaces, they give the line again.
[[nodiscard]] std::vector<std::string> argumentsOf(const std::string& line);

}  // namespace cli
