#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "usersyntax/DateRange.h"
#include "usersyntax/Names.h"

// What a person types to search: words, "phrases", -without, from:mara, date:2010..2011, OR and
// parentheses. tallow-search(7) has all of it.
//
//   alternatives =  sequence {OR sequence}
//   sequence     =  operand {[AND] operand}
//   operand      =  {"-" | NOT} (word | phrase | "(" alternatives ")" | field ":" value)
//
// Nothing is an error. What cannot be what it looks like (an open quote, a parenthesis without its
// partner, an unknown field, a date that does not exist) is taken as words, with a remark. Knows
// nothing of the daemon. Any thread.
namespace usersyntax {

// How deep parentheses nest; deeper ones are taken as text.
inline constexpr size_t kMaxDepth = 64;

enum class Kind { text, date, flag, size, conjunction, disjunction, negation };

struct Node {
  Kind kind = Kind::conjunction;
  // Text: of which field, what was typed, and how the words have to stand in it.
  Field field = Field::any;
  std::string text;
  bool phrase = false;  // quoted
  bool prefix = false;  // the last word may go on; it is still being typed
  // Date, flag, size.
  DateRange dates;
  Flag flag = Flag::unread;
  uint64_t bytes = 0;
  bool larger = false;  // than `bytes`, else smaller
  // Of the three kinds that join others; a negation has one. At most 3 * kMaxDepth levels.
  std::vector<Node> children;
};

struct Query {
  // A conjunction without children matches every mail.
  Node root;
  // True where nothing but words was typed: a search for the text as it stands.
  bool plain = true;
  std::vector<std::string> remarks;
};

// Reads UTF-8 text. `now`, in seconds since 1970, is what today and 3w count from.
[[nodiscard]] Query parse(std::string_view text, double now);

// The tree on one line, such as (and any:"a" (not from:"b"*)); times are seconds since 1970, and an
// asterisk marks a word that may go on.
[[nodiscard]] std::string printed(const Node& node);

}  // namespace usersyntax
