#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "usersyntax/Names.h"

// The pieces of a typed query, of the library alone.
namespace usersyntax {

struct Token {
  enum class Type { word, phrase, open, close, connective };

  Type type = Type::word;
  std::string text;  // of a word or phrase
  bool negated = false;
  Field field = Field::any;
  Connective connective = Connective::none;
  std::string_view source;  // all of it, as it was typed
};

// Cuts the text, which outlives the tokens. What is left balances: parentheses are in pairs, not
// empty and at most kMaxDepth deep, and connectives have their operands. All else has become words,
// with a remark.
[[nodiscard]] std::vector<Token> tokensOf(std::string_view text, std::vector<std::string>& remarks);

}  // namespace usersyntax
