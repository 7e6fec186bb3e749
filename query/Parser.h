#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

// The query language as text: comparisons of an attribute with a value, joined by && and ||, with
// parentheses, the constants true and false, and time functions as values.
//
//   expression  =  operand [connective expression]
//   operand     =  "(" expression ")"
//               |  "true" | "false"
//               |  attribute ("=" | "==" | "!=") string [modifier]
//               |  attribute ("=" | "==" | "!=" | ">" | "<" | ">=" | "<=") time
//   connective  =  "&&" | "||"
//   time        =  "$time." function ["(" argument ")"]
//
// Attributes, strings and modifiers are bare words or quoted with ' or "; in quotes a backslash
// takes the next byte as it is. A modifier is read and means nothing.
//
// The language is lax. Both connectives have one priority and group to the right. A missing ")" is
// no fault, and what stands behind a complete expression is ignored, so that a ")" too many ends
// the query.
//
// Knows nothing of attributes and of time; see TLQueryAdditions.h.
namespace sq {

// The numbers are shared by the scanner and node::type. 3 is free.
enum Token : int32_t {
  kTokenEnd = 0,
  kTokenOpen = 1,
  kTokenClose = 2,
  kTokenString = 4,
  kTokenTimeAbsolute = 5,
  kTokenTimeNow = 6,
  kTokenTimeToday = 7,
  kTokenTimeThisWeek = 8,
  kTokenTimeThisMonth = 9,
  kTokenTimeThisYear = 10,
  kTokenTimeYesterday = 11,
  kTokenTimeLastWeek = 12,
  kTokenTimeIso = 13,
  kTokenAssign = 14,
  kTokenEqual = 15,
  kTokenNotEqual = 16,
  kTokenAnd = 17,
  kTokenOr = 18,
  kTokenGreater = 19,
  kTokenLess = 20,
  kTokenGreaterEqual = 21,
  kTokenLessEqual = 22,
  kTokenError = 23,  // what cannot be read; also the type of an error node
};

// A node of the parse tree: a connective over two expressions, a comparison over the leaves of its
// attribute and its value, or a leaf. A leaf is a string or a time function with its argument.
struct node {
  explicit node(int32_t nodeType, std::string nodeText = {})
      : text(std::move(nodeText)), type(nodeType) {}
  // Takes the tree apart in a loop, whatever its depth.
  ~node();
  node(const node&) = delete;
  node& operator=(const node&) = delete;

  std::string text;  // of a leaf
  int32_t type;      // a Token
  std::unique_ptr<node> left;
  std::unique_ptr<node> right;
};

using Tree = std::unique_ptr<node>;

// Reads a NUL-terminated text of any size; no byte behind the NUL is looked at, and the time is
// linear. True with the tree in `out`. After a failure `out` holds an error node or a part of a
// tree, which means nothing.
//
// `stop`, unless null, becomes the position of the last token that was looked at: where a
// comparison cannot go on after a failure, and after success the token that ended the expression.
[[nodiscard]] bool parse(const char* input, Tree& out, size_t* stop = nullptr);

// True for the tokens of the time functions.
[[nodiscard]] bool isTimeOperator(int32_t token);

// The expression as text that parses to the same tree, with parentheses wherever && and || meet. A
// tree of `parse` only.
[[nodiscard]] std::string expressionText(const node& tree);

// A text as it stands between quotes of either kind: quotes, backslashes and asterisks have a
// backslash before them. The text holds no NUL.
[[nodiscard]] std::string escaped(std::string_view text);

}  // namespace sq
