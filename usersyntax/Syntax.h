#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "usersyntax/DateRange.h"
#include "usersyntax/Names.h"

// The syntax of typed searches: words, "phrases", -without, from:mara, date:2010..2011, OR and
// parentheses; see tallow-search(7).
//
//   alternatives =  sequence {OR sequence}
//   sequence     =  operand {[AND] operand}
//   operand      =  {"-" | NOT} (word | phrase | "(" alternatives ")" | field ":" value)
//
// Nothing is an error. Anything invalid (an open quote, an unmatched parenthesis, an unknown field,
// a date that does not exist) is taken as words, with a remark. Independent of the daemon. Any
// thread.
namespace usersyntax {

// Maximum nesting of parentheses; deeper ones are taken as text.
inline constexpr size_t kMaxDepth = 64;

enum class Kind { text, date, flag, size, conjunction, disjunction, negation };

struct Node {
  Kind kind = Kind::conjunction;
  // For text: its field, what was typed, and how the words must match.
  Field field = Field::any;
  std::string text;
  bool phrase = false;  // quoted
  bool prefix = false;  // the last word is still being typed and matches as a prefix
  // For date, flag and size.
  DateRange dates;
  Flag flag = Flag::unread;
  uint64_t bytes = 0;
  bool larger = false;  // larger than `bytes`, otherwise smaller
  // For the three kinds with children; a negation has one child. At most 3 * kMaxDepth levels.
  std::vector<Node> children;
};

struct Query {
  // A conjunction without children matches every mail.
  Node root;
  // True if only words were typed: a search for the text as it is.
  bool plain = true;
  std::vector<std::string> remarks;
};

// Parses UTF-8 text. `now`, in seconds since 1970, is the reference for today and 3w.
[[nodiscard]] Query parse(std::string_view text, double now);

// The tree on one line, such as (and any:"a" (not from:"b"*)); times are in seconds since 1970, and
// an asterisk marks a prefix.
[[nodiscard]] std::string printed(const Node& node);

}  // namespace usersyntax
