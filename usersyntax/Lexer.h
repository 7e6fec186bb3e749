#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "usersyntax/Names.h"

// The lexer of typed queries; internal to this library.
namespace usersyntax {

struct Token {
  enum class Type { word, phrase, open, close, connective };

  Type type = Type::word;
  std::string text;  // for a word or phrase
  bool negated = false;
  Field field = Field::any;
  Connective connective = Connective::none;
  std::string_view source;  // the whole token, as typed
};

// Splits the text, which must outlive the tokens. The result is balanced: parentheses are in pairs,
// not empty and nested at most kMaxDepth deep, and connectives have their operands. Everything else
// has become words, with a remark.
[[nodiscard]] std::vector<Token> tokensOf(std::string_view text, std::vector<std::string>& remarks);

}  // namespace usersyntax
