#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Log.h"
#include "platform/Text.h"
#include "query/Parser.h"
#include "records/TLQuery.h"

// From the text of a query (see Parser.h) to the record that a search takes: attribute names and
// time functions become keys and times, free text leaves the tree, and only conditions stay in it.
//
// There are no error objects. A text that is no query gives a record without `root` and with an
// empty `originalQuery`, and a line in the log; a time that cannot be formed is the reference date,
// 2001-01-01 00:00:00 UTC, from which times in a tree are counted in seconds; a name that is not
// known becomes the key UNKNOWN. No query and no value reaches the log in clear.
//
// No instances. Threads: any, each with queries and trees of its own.
class TLQueryAdditions {
 public:
  TLQueryAdditions() = delete;

  using Node = std::shared_ptr<TLQueryNode>;
  // Free text that was taken out of a tree, in order.
  using Parts = std::vector<TLString>;
  // The open AND and OR nodes of a tree that is being built; the last takes new children.
  using Stack = std::vector<Node>;

  // How many nodes lie at most above each other in a tree: as many as a query can carry.
  static constexpr size_t kMaximumTreeHeight = kMaximumRecordDepth;

  // Sets rawQuery and originalQuery to the text, and no root.
  [[nodiscard]] static std::shared_ptr<TLQuery> initWithQueryString(const TLString& string);

  // Reads the text as a query. With `optimize`, free text goes to originalQuery, its parts joined
  // by blanks; without, originalQuery is empty and the tree as it was built.
  [[nodiscard]] static std::shared_ptr<TLQuery> initWithBeaconQueryString(const TLString& string,
                                                                          bool optimize);

  // Reads the filters, joined by " && ", into the query's root, which replaces what was there. With
  // `optimize`, free text among them is lost. An empty list leaves the query as it is.
  static void addFiltersToQuery(TLQuery& query, const std::vector<TLString>& filters,
                                bool optimize);

  // What `optimize` asks of the two operations above, for a query that they have built without: who
  // wants to see a tree before it is optimised calls these afterwards.
  static void optimizeQuery(TLQuery& query);
  static void optimizeFiltersOfQuery(TLQuery& query);

  // The tree of a text before optimisation, an AND node; null, with a fault in the log, for a text
  // that does not parse or is nested deeper than kMaximumTreeHeight.
  [[nodiscard]] static Node _parse(const TLString& string);

  // Adds one parse node to the last element of the stack, which must be AND or OR: with an error in
  // the log, nothing is added otherwise. AND in AND and OR in OR become one node. False, with a
  // part of it added, for a tree that would be too high.
  static bool _build(const sq::node* node, Stack& stack);

  // UNKNOWN, with an error in the log, for a name that is not in the vocabulary.
  [[nodiscard]] static TLAttributeKey _lookupAttribute(std::string_view name);

  // STRING_EQUAL for a token that is no comparison.
  [[nodiscard]] static TLQueryNodeOp _lookupOperator(int32_t token);

  // Seconds since the reference date, of a time function at this moment.
  [[nodiscard]] static double _evalTimeExpression(int32_t token, std::string_view deltaString);

  // One asterisk less at the front and one at the back. A single character stays as it is.
  [[nodiscard]] static TLString removeWildCard(const TLString& string);

  // Rewrites a tree, at most kMaximumTreeHeight high, in place, and returns the node that takes its
  // place, null where nothing is left. Words that are looked for in any attribute, or in five or
  // more by one OR, go to `originalQueryParts`; constants are worked in; what stands twice below
  // one node stands once. An OR of nothing but false disappears as well.
  [[nodiscard]] static Node optimizeQuery(const Node& node, Parts& originalQueryParts);

  // One line a node, each behind a line feed, indented by a tab a level: names of the ops and keys,
  // values, strings redacted unless `inClear`. Empty for no tree.
  [[nodiscard]] static std::string _stringifyQueryTree(const TLQueryNode* node, size_t indent,
                                                       bool inClear = false);

  // Writes that text to the log, where info is logged.
  static void _printQueryTree(const TLQueryNode* node);

  static const platform::Log& log();
};

// The time function at another moment, in seconds since 1970-01-01 00:00:00 UTC.
[[nodiscard]] double evalTimeExpressionAt(int32_t token, std::string_view deltaString, double now);

// Reads digits at their places, YYYY-MM-DDThh:mm:ss+hh:mm or parts of that from the left; a blank
// or "Z" may stand for the "T", "Z" for the offset. Nothing is checked: what is no digit counts as
// 0. Without zone the time is local. Seconds since the reference date; false for a time that the
// calendar does not hold.
[[nodiscard]] bool evalTimeISO8601(std::string_view text, double* time);
