#include "usersyntax/Lexer.h"

#include <fmt/format.h>

#include <algorithm>

#include "platform/Text.h"
#include "usersyntax/Syntax.h"

namespace usersyntax {

namespace {

using platform::isWhiteSpace;
using Type = Token::Type;

constexpr size_t kMaxNameBytes = 24;
constexpr size_t kShownBytes = 40;

// Letters of any script; of ASCII, only letters.
bool isName(std::string_view text) {
  return !text.empty() && std::all_of(text.begin(), text.end(), [](char c) {
    return static_cast<unsigned char>(c) >= 0x80 || (c >= 'a' && c <= 'z') ||
           (c >= 'A' && c <= 'Z');
  });
}

std::string shown(std::string_view text) {
  if (text.size() <= kShownBytes) return std::string(text);
  return std::string(text.substr(0, kShownBytes)) + "...";
}

class Lexer {
 public:
  Lexer(std::string_view text, std::vector<std::string>& remarks)
      : _text(text), _remarks(remarks) {}

  std::vector<Token> run() {
    while (true) {
      while (_at < _text.size() && isWhiteSpace(_text[_at])) ++_at;
      if (_at == _text.size()) return std::move(_tokens);
      next();
    }
  }

 private:
  void next() {
    _begin = _at;
    Token token;
    if (_text[_at] == '-' && _at + 1 < _text.size() && _text[_at + 1] != '-' &&
        !isWhiteSpace(_text[_at + 1])) {
      token.negated = true;
      ++_at;
    }
    readField(token);
    readValue(token);
    token.source = _text.substr(_begin, _at - _begin);
    _tokens.push_back(std::move(token));
  }

  // Reads a known name, a colon and a value.
  void readField(Token& token) {
    const size_t length = _text.substr(_at, kMaxNameBytes + 1).find(':');
    if (length == std::string_view::npos || !isName(_text.substr(_at, length))) return;
    const std::string_view name = _text.substr(_at, length);
    const size_t colon = _at + length;
    const bool hasValue = colon + 1 < _text.size() && !isWhiteSpace(_text[colon + 1]) &&
                          _text[colon + 1] != ')' && _text[colon + 1] != '/';
    const bool path = colon + 1 < _text.size() && _text[colon + 1] == '/';
    const auto field = fieldNamed(name);
    if (field && (hasValue || (path && *field == Field::folder))) {
      token.field = *field;
      _at = colon + 1;
    } else if (field && !path) {
      _remarks.push_back(fmt::format("\"{}:\" has no value, so it is taken as a word", name));
    } else if (hasValue) {
      _remarks.push_back(fmt::format("there is no field \"{}\", so it is taken as a word", name));
    }
  }

  void readValue(Token& token) {
    const char first = _text[_at];
    if (first == '(') {
      token.type = Type::open;
      ++_depth;
      ++_at;
    } else if (first == ')' && !token.negated) {
      token.type = Type::close;
      if (_depth > 0) --_depth;
      ++_at;
    } else if (first == '"') {
      readQuoted(token);
    } else {
      readWord(token);
    }
  }

  void readQuoted(Token& token) {
    const size_t end = _text.find('"', _at + 1);
    if (end == std::string_view::npos) {
      _remarks.emplace_back("the quote is not closed, so what follows it is taken as words");
      token.source = _text.substr(_at, 1);
      ++_at;
      if (_at < _text.size() && !isWhiteSpace(_text[_at])) {
        readWord(token);
      } else if (token.field != Field::any || token.negated) {
        asTyped(token);
      }
      return;
    }
    token.type = Type::phrase;
    token.text = _text.substr(_at + 1, end - _at - 1);
    _at = end + 1;
  }

  // Reads up to a space, or to the parenthesis that closes the enclosing group.
  void readWord(Token& token) {
    const size_t begin = _at;
    size_t inner = 0;
    for (; _at < _text.size() && !isWhiteSpace(_text[_at]); ++_at) {
      if (_text[_at] == '(') ++inner;
      if (_text[_at] != ')') continue;
      if (inner == 0 && _depth > 0) break;
      if (inner > 0) --inner;
    }
    token.text = _text.substr(begin, _at - begin);
    if (token.field != Field::any || token.negated) return;
    token.connective = connectiveNamed(token.text);
    if (token.connective != Connective::none) token.type = Type::connective;
  }

  void asTyped(Token& token) {
    token.field = Field::any;
    token.negated = false;
    token.text = _text.substr(_begin, _at - _begin);
  }

  const std::string_view _text;
  std::vector<std::string>& _remarks;
  std::vector<Token> _tokens;
  size_t _begin = 0;
  size_t _at = 0;
  size_t _depth = 0;
};

void makeWord(Token& token) {
  token.text = std::string(token.source);
  token.type = Type::word;
  token.field = Field::any;
  token.negated = false;
  token.connective = Connective::none;
}

// Turns parentheses that are unmatched, empty or nested too deeply into words.
void balance(std::vector<Token>& tokens, std::vector<std::string>& remarks) {
  std::vector<size_t> open;
  const auto refuse = [&](size_t i, const char* why) {
    remarks.push_back(fmt::format("the parenthesis in \"{}\" {}, so it is taken as text",
                                  shown(tokens[i].source), why));
    makeWord(tokens[i]);
  };
  for (size_t i = 0; i < tokens.size(); ++i) {
    if (tokens[i].type == Type::open) {
      open.push_back(i);
    } else if (tokens[i].type == Type::close) {
      if (open.empty()) {
        refuse(i, "has no partner");
        continue;
      }
      const size_t partner = open.back();
      open.pop_back();
      if (partner + 1 == i || open.size() >= kMaxDepth) {
        const char* const why = partner + 1 == i ? "holds nothing" : "is nested too deep";
        refuse(partner, why);
        makeWord(tokens[i]);
      }
    }
  }
  for (const size_t i : open) refuse(i, "is not closed");
}

bool beginsOperand(const Token& token) {
  return token.type == Type::word || token.type == Type::phrase || token.type == Type::open ||
         token.connective == Connective::negation;
}
bool endsOperand(const Token& token) {
  return token.type == Type::word || token.type == Type::phrase || token.type == Type::close;
}

// Turns connectives without operands into words.
void checkConnectives(std::vector<Token>& tokens, std::vector<std::string>& remarks) {
  const auto refuse = [&](Token& token) {
    remarks.push_back(
        fmt::format("\"{}\" stands beside nothing, so it is taken as a word", token.source));
    makeWord(token);
  };
  for (size_t i = tokens.size(); i > 0; --i) {
    Token& token = tokens[i - 1];
    if (token.type != Type::connective) continue;
    if (i == tokens.size() || !beginsOperand(tokens[i])) refuse(token);
  }
  for (size_t i = 0; i < tokens.size(); ++i) {
    Token& token = tokens[i];
    if (token.type != Type::connective || token.connective == Connective::negation) continue;
    if (i == 0 || !endsOperand(tokens[i - 1])) refuse(token);
  }
}

}  // namespace

std::vector<Token> tokensOf(std::string_view text, std::vector<std::string>& remarks) {
  std::vector<Token> tokens = Lexer(text, remarks).run();
  balance(tokens, remarks);
  checkConnectives(tokens, remarks);
  return tokens;
}

}  // namespace usersyntax
