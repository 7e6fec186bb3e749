#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

// The parser of the query language: comparisons of an attribute with a value, joined by && and ||,
// with parentheses, the constants true and false, and time functions as values.
//
//   expression  =  operand [connective expression]
//   operand     =  "(" expression ")"
//               |  "true" | "false"
//               |  attribute ("=" | "==" | "!=") string [modifier]
//               |  attribute ("=" | "==" | "!=" | ">" | "<" | ">=" | "<=") time
//   connective  =  "&&" | "||"
//   time        =  "$time." function ["(" argument ")"]
//
// Attributes, strings and modifiers are bare words, or quoted with ' or "; inside quotes a
// backslash escapes the next byte. A modifier has no effect.
//
// The language is lax. Both connectives have the same precedence and associate to the right. A
// missing ")" is not an error, and everything after a complete expression is ignored, so an extra
// ")" ends the query.
//
// The parser does not interpret attributes or times; see TLQueryAdditions.h.
namespace sq {

// The numbers are shared by the scanner and node::type. 3 is unused.
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
  kTokenError = 23,  // invalid input; also the type of an error node
};

// A node of the parse tree: a connective with two expressions, a comparison with the leaves of its
// attribute and its value, or a leaf. A leaf is a string or a time function with its argument.
struct node {
  explicit node(int32_t nodeType, std::string nodeText = {})
      : text(std::move(nodeText)), type(nodeType) {}
  // Destroys the tree in a loop, whatever its depth.
  ~node();
  node(const node&) = delete;
  node& operator=(const node&) = delete;

  std::string text;  // of a leaf
  int32_t type;      // a Token
  std::unique_ptr<node> left;
  std::unique_ptr<node> right;
};

using Tree = std::unique_ptr<node>;

// Parses a NUL-terminated text of any size in linear time. True with the tree in `out`. After a
// failure `out` holds an error node or part of a tree, without meaning.
//
// `stop`, unless null, receives the position of the last token read: after a failure where the
// comparison is invalid, after success the token that ended the expression.
[[nodiscard]] bool parse(const char* input, Tree& out, size_t* stop = nullptr);

// True for the tokens of the time functions.
[[nodiscard]] bool isTimeOperator(int32_t token);

// The expression as text that parses to the same tree, with parentheses wherever && and || mix.
// Only for trees from `parse`.
[[nodiscard]] std::string expressionText(const node& tree);

// Escapes a text for use inside either kind of quotes: puts a backslash before quotes, backslashes
// and asterisks. The text must not contain NUL.
[[nodiscard]] std::string escaped(std::string_view text);

}  // namespace sq
