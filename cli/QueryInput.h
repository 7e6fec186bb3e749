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

// How one text of the query language is understood, step by step.
struct Understanding {
  std::string expression;               // the text
  std::string parseTree;                // as the parser groups it
  std::shared_ptr<TLQueryNode> before;  // the tree before it is optimised
  std::shared_ptr<TLQueryNode> after;   // null where nothing is left
};

// The query that a command line asks for.
struct QueryInput {
  std::string words;  // as they were typed, joined by single blanks; empty with --query
  std::shared_ptr<TLQuery> query;
  Understanding main;
  std::optional<Understanding> filter;  // all filters together
  usersyntax::Query typed;              // what the words are in a person's syntax
  SearchPlan plan;
  // What the user should know: what of an expression is not read, or not known.
  std::vector<std::string> remarks;

  // The words to mark in results, as one text.
  [[nodiscard]] std::string markedWords() const;
};

// Nothing but words goes the way of the query of a mail client: one disjunction over the attributes
// that hold text, out of which optimising makes free text again. All else, and conditions that the
// daemon does not look up, becomes a plan of several queries and checks. None, with an error, for
// expressions or parameters that cannot be read. `now` is in seconds since 1970.
[[nodiscard]] std::optional<QueryInput> queryInput(const Options& options, double now,
                                                   TLErrorOut error);

}  // namespace cli
