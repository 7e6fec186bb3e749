#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/TLError.h"
#include "records/TLQuery.h"
#include "usersyntax/Syntax.h"

namespace cli {

// Maximum number of alternatives of a search. Each is one query to the daemon.
inline constexpr size_t kMaxBranches = 64;

// A condition that the client checks on each result.
struct Check {
  usersyntax::Node node;  // not a conjunction, disjunction or negation
  bool negated = false;
};

// One alternative of a search: the results of `query` minus those of each `without`, if all checks
// hold. The query finds every mail that can be a result.
struct Branch {
  std::shared_ptr<TLQuery> query;
  std::vector<std::shared_ptr<TLQuery>> without;
  std::vector<Check> checks;
  bool modifiable = true;  // the daemon may replace words without results
};

// A typed search as queries to the daemon and checks of their results. The union of all branches is
// the result of the search.
struct SearchPlan {
  std::vector<Branch> branches;
  // The search is sent to the daemon as typed; there is only one branch.
  bool asTyped = false;
  std::vector<std::string> remarks;
};

// Plans a search for mails that match `tree` and `conditions` (null for none). `freeText` is the
// text of a search for plain words. An error if there are more than kMaxBranches alternatives. The
// user's `parameters` (null for none) are kept.
[[nodiscard]] std::optional<SearchPlan> planSearch(const usersyntax::Node& tree,
                                                   const TLString& freeText,
                                                   const TLQueryNode* conditions,
                                                   const TLParameters* parameters,
                                                   TLErrorOut error);

// Whether the tree has conditions that the daemon accepts but does not evaluate.
[[nodiscard]] bool hasCheckedConditions(const TLQueryNode* tree);

// The plan in readable form: the query, exclusions and checks of each branch.
[[nodiscard]] std::string planText(const SearchPlan& plan);

// Sets a parameter of a query unless it is there.
void addParameter(TLQuery& query, const char* key, int32_t value);

}  // namespace cli
