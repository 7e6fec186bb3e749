#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/TLError.h"
#include "records/TLQuery.h"
#include "usersyntax/Syntax.h"

namespace cli {

// How many alternatives a search is taken apart into at most, each a query of the daemon's.
inline constexpr size_t kMaxBranches = 64;

// A condition that is decided here, on each result.
struct Check {
  usersyntax::Node node;  // no conjunction, disjunction or negation
  bool negated = false;
};

// One alternative of a search: what `query` finds, without what any of `without` finds, as far as
// all checks hold. The queries find each mail that can be a result.
struct Branch {
  std::shared_ptr<TLQuery> query;
  std::vector<std::shared_ptr<TLQuery>> without;
  std::vector<Check> checks;
  bool modifiable = true;  // the daemon may replace words that find nothing
};

// What was typed, as searches of the daemon's and checks of their results. The results of all
// branches together are those of the search.
struct SearchPlan {
  std::vector<Branch> branches;
  // The search goes to the daemon as it stands: it is the only branch.
  bool asTyped = false;
  std::vector<std::string> remarks;
};

// Plans a search for a tree, of which `conditions` (null for none) hold as well, and `freeText` as
// a search for words has it. An error for more than kMaxBranches alternatives. `parameters` of the
// user's, null for none, are kept.
[[nodiscard]] std::optional<SearchPlan> planSearch(const usersyntax::Node& tree,
                                                   const TLString& freeText,
                                                   const TLQueryNode* conditions,
                                                   const TLParameters* parameters,
                                                   TLErrorOut error);

// Whether the tree holds conditions that the daemon carries and does not look up.
[[nodiscard]] bool hasCheckedConditions(const TLQueryNode* tree);

// The plan for people: for each branch its query, what is taken out, and the checks.
[[nodiscard]] std::string planText(const SearchPlan& plan);

// Sets a parameter of a query unless it is there.
void addParameter(TLQuery& query, const char* key, int32_t value);

}  // namespace cli
