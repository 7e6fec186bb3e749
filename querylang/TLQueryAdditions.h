#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Log.h"
#include "platform/Text.h"
#include "querylang/Parser.h"
#include "records/TLQuery.h"

// Converts the text of a query (see Parser.h) into the record that a search takes: attribute names
// and time functions become keys and times, free text is moved out of the tree, and only conditions
// remain in it.
//
// There are no error objects. An invalid text gives a record without `root` and with an empty
// `originalQuery`, and a log line. An invalid time becomes the reference date, 2001-01-01 00:00:00
// UTC, from which times in a tree are counted in seconds. An unknown name becomes the key UNKNOWN.
// Queries and values are never logged in clear.
//
// No instances. Threads: any, each with its own queries and trees.
class TLQueryAdditions {
 public:
  TLQueryAdditions() = delete;

  using Node = std::shared_ptr<TLQueryNode>;
  // Free text removed from a tree, in order.
  using Parts = std::vector<TLString>;
  // The open AND and OR nodes of a tree under construction; the last receives new children.
  using Stack = std::vector<Node>;

  // Upper bound of the height of a tree: as much as a query can carry.
  static constexpr size_t kMaxTreeHeight = kMaxRecordDepth;

  // Sets rawQuery and originalQuery to the text; no root.
  [[nodiscard]] static std::shared_ptr<TLQuery> initWithQueryString(const TLString& string);

  // Parses the text as a query. With `optimize`, free text goes to originalQuery, its parts joined
  // by spaces; without, originalQuery is empty and the tree is left as built.
  [[nodiscard]] static std::shared_ptr<TLQuery> initWithBeaconQueryString(const TLString& string,
                                                                          bool optimize);

  // Parses the filters, joined by " && ", into the query's root, replacing it. With `optimize`,
  // free text in them is lost. An empty list leaves the query unchanged.
  static void addFiltersToQuery(TLQuery& query, const std::vector<TLString>& filters,
                                bool optimize);

  // The two optimisations as separate steps, for callers that want to see the tree before it is
  // optimised.
  static void optimizeQuery(TLQuery& query);
  static void optimizeFiltersOfQuery(TLQuery& query);

  // The tree of a text before optimisation, an AND node; null, with a fault in the log, if the text
  // does not parse or nests deeper than kMaxTreeHeight.
  [[nodiscard]] static Node _parse(const TLString& string);

  // Adds one parse node to the last element of the stack, which must be AND or OR; otherwise logs
  // an error and adds nothing. AND in AND and OR in OR become one node. False, with part of the
  // node added, if the tree would be too high.
  static bool _build(const sq::node* node, Stack& stack);

  // UNKNOWN, with an error in the log, for an unknown name.
  [[nodiscard]] static TLAttributeKey _lookupAttribute(std::string_view name);

  // STRING_EQUAL for a token that is not a comparison.
  [[nodiscard]] static TLQueryNodeOp _lookupOperator(int32_t token);

  // The value of a time function at the current time, in seconds since the reference date.
  [[nodiscard]] static double _evalTimeExpression(int32_t token, std::string_view deltaString);

  // Removes one asterisk at the front and one at the back. A single character is unchanged.
  [[nodiscard]] static TLString removeWildCard(const TLString& string);

  // Rewrites a tree, at most kMaxTreeHeight high, in place, and returns the node that replaces
  // it, null if nothing is left. Words searched for in any attribute, or in five or more attributes
  // by one OR, are moved to `originalQueryParts`; constants are folded; duplicates below one node
  // are removed. An OR of nothing but false disappears as well.
  [[nodiscard]] static Node optimizeQuery(const Node& node, Parts& originalQueryParts);

  // One line per node, each after a line feed and indented by one tab per level: names of ops and
  // keys, values, strings redacted unless `inClear`. Empty without a tree.
  [[nodiscard]] static std::string _stringifyQueryTree(const TLQueryNode* node, size_t indent,
                                                       bool inClear = false);

  // Logs that text at level info.
  static void _printQueryTree(const TLQueryNode* node);

  static const platform::Log& log();
};

// The value of a time function at a given time, in seconds since 1970-01-01 00:00:00 UTC.
[[nodiscard]] double evalTimeExpressionAt(int32_t token, std::string_view deltaString, double now);

// Reads digits by position: YYYY-MM-DDThh:mm:ss+hh:mm or a leading part of it; a space or "Z" may
// replace the "T", "Z" may replace the offset. Nothing is validated: a non-digit counts as 0.
// Without a zone the time is local. Seconds since the reference date; false if the calendar cannot
// represent it.
[[nodiscard]] bool evalTimeISO8601(std::string_view text, double* time);
