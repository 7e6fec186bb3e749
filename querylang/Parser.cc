#include "querylang/Parser.h"

#include <algorithm>
#include <array>
#include <utility>
#include <vector>

#include "platform/Text.h"

namespace sq {

namespace {

using platform::isDigit;
using platform::isWhiteSpace;

constexpr bool isAlphanumeric(char c) {
  return isDigit(c) || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z');
}
constexpr bool startsWord(char c) {
  return isAlphanumeric(c) || c == '*';
}
constexpr bool continuesWord(char c) {
  return startsWord(c) || c == '-' || c == '.' || c == '_';
}
constexpr bool isTimeArgument(char c) {
  return isDigit(c) || isWhiteSpace(c) || c == '+' || c == '-' || c == '.' || c == ':' ||
         c == 'T' || c == 'Z';
}

struct Spelling {
  std::string_view text;
  Token token;
};

// Tried in this order; the first that the text begins with applies.
constexpr std::array<Spelling, 11> kOperators{{{")", kTokenClose},
                                               {"(", kTokenOpen},
                                               {"||", kTokenOr},
                                               {"&&", kTokenAnd},
                                               {"!=", kTokenNotEqual},
                                               {"==", kTokenEqual},
                                               {"=", kTokenAssign},
                                               {">=", kTokenGreaterEqual},
                                               {"<=", kTokenLessEqual},
                                               {"<", kTokenLess},
                                               {">", kTokenGreater}}};
constexpr std::array<Spelling, 9> kTimeFunctions{{{"time.now", kTokenTimeNow},
                                                  {"time.today", kTokenTimeToday},
                                                  {"time.absolute", kTokenTimeAbsolute},
                                                  {"time.this_week", kTokenTimeThisWeek},
                                                  {"time.this_month", kTokenTimeThisMonth},
                                                  {"time.this_year", kTokenTimeThisYear},
                                                  {"time.yesterday", kTokenTimeYesterday},
                                                  {"time.last_week", kTokenTimeLastWeek},
                                                  {"time.iso", kTokenTimeIso}}};

// Stops at the first difference, so the NUL at the end of the text stops it.
bool beginsWith(const char* at, std::string_view prefix) {
  for (const char c : prefix) {
    if (*at++ != c) return false;
  }
  return true;
}

// Splits the input into tokens. The text of a token remains until another token sets it; only
// strings and time functions do, even invalid ones.
class Scanner {
 public:
  explicit Scanner(const char* input) : _begin(input), _at(input), _tokenAt(input) {}

  Token next();

  // Skips the next token if it is of this kind.
  void skip(Token kind) {
    const char* const before = _at;
    if (next() != kind) _at = before;
  }

  [[nodiscard]] const std::string& text() const { return _text; }
  // The start of the last token.
  [[nodiscard]] size_t position() const { return static_cast<size_t>(_tokenAt - _begin); }

 private:
  void skipWhiteSpace() {
    while (isWhiteSpace(*_at)) ++_at;
  }
  template <typename Class>
  void takeRun(const Class& isMember) {
    const char* const start = _at;
    while (isMember(*_at)) ++_at;
    _text.assign(start, _at);
  }
  Token word();
  Token literal();
  Token timeFunction();

  const char* const _begin;
  const char* _at;
  const char* _tokenAt;
  std::string _text;
};

Token Scanner::next() {
  skipWhiteSpace();
  _tokenAt = _at;
  if (*_at == '\0') return kTokenEnd;
  if (startsWord(*_at)) return word();
  if (*_at == '"' || *_at == '\'') return literal();
  if (*_at == '$') return timeFunction();
  for (const Spelling& spelling : kOperators) {
    if (!beginsWith(_at, spelling.text)) continue;
    _at += spelling.text.size();
    return spelling.token;
  }
  return kTokenError;
}

Token Scanner::word() {
  takeRun(continuesWord);
  return kTokenString;
}

// A literal without its closing quote is an error, repeated by the next call.
Token Scanner::literal() {
  const char quote = *_at;
  const char* at = _at + 1;
  _text.clear();
  while (*at != quote) {
    if (*at == '\\') ++at;
    if (*at == '\0') return kTokenError;
    _text.push_back(*at++);
  }
  _at = at + 1;
  return kTokenString;
}

Token Scanner::timeFunction() {
  ++_at;
  for (const Spelling& function : kTimeFunctions) {
    if (!beginsWith(_at, function.text)) continue;
    _at += function.text.size();
    skipWhiteSpace();
    if (*_at != '(') {
      _text = "0";
      return function.token;
    }
    ++_at;
    skipWhiteSpace();
    takeRun(isTimeArgument);
    if (*_at != ')') return kTokenError;
    ++_at;
    return function.token;
  }
  return kTokenError;
}

bool isEquality(Token token) {
  return token == kTokenAssign || token == kTokenEqual || token == kTokenNotEqual;
}
bool isComparison(int32_t token) {
  return (token >= kTokenAssign && token <= kTokenNotEqual) ||
         (token >= kTokenGreater && token <= kTokenLessEqual);
}
bool isConnective(int32_t token) {
  return token == kTokenAnd || token == kTokenOr;
}

constexpr char lowered(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c | 0x20) : c;
}

// "true" or "false" if the text is one of them in any case, otherwise empty.
std::string_view constantNamed(std::string_view text) {
  for (const std::string_view name : {"true", "false"}) {
    if (std::equal(text.begin(), text.end(), name.begin(), name.end(),
                   [](char c, char wanted) { return lowered(c) == wanted; })) {
      return name;
    }
  }
  return {};
}

Tree joined(int32_t type, Tree left, Tree right) {
  auto result = std::make_unique<node>(type);
  result->left = std::move(left);
  result->right = std::move(right);
  return result;
}

// A recursive-descent parser with its own stack, so no input is nested too deeply.
class Parser {
 public:
  explicit Parser(const char* input) : _scanner(input) {}

  bool parse(Tree& out);
  [[nodiscard]] size_t position() const { return _scanner.position(); }

 private:
  // An expression that waits for an inner one: the content of its parentheses, or the right side of
  // its connective.
  struct Waiting {
    Token token;
    Tree left;
  };

  // Reads an expression from its first token to the one after its operand. False on failure; `out`
  // is null if an inner expression must be read first.
  bool readOperand(Tree& out);
  // The rest of a comparison with this attribute; null on failure.
  Tree readComparison(Tree attribute);

  Scanner _scanner;
  std::vector<Waiting> _waiting;
};

Tree Parser::readComparison(Tree attribute) {
  const Token comparison = _scanner.next();
  if (!isComparison(comparison)) return nullptr;
  const Token value = _scanner.next();
  const bool isString = value == kTokenString && isEquality(comparison);
  if (!isString && !isTimeOperator(value)) return nullptr;
  Tree result =
      joined(comparison, std::move(attribute), std::make_unique<node>(value, _scanner.text()));
  if (isString) _scanner.skip(kTokenString);  // a modifier
  return result;
}

// Only a parenthesis counts as first token: an expression that begins with something else has the
// text of the string before it as its attribute.
bool Parser::readOperand(Tree& out) {
  if (_scanner.next() == kTokenOpen) {
    _waiting.push_back({kTokenOpen, nullptr});
    return true;
  }
  const std::string_view constant = constantNamed(_scanner.text());
  if (!constant.empty()) {
    out = std::make_unique<node>(kTokenString, std::string(constant));
    return true;
  }
  out = readComparison(std::make_unique<node>(kTokenString, _scanner.text()));
  if (out != nullptr) return true;
  out = std::make_unique<node>(kTokenError);
  return false;
}

bool Parser::parse(Tree& out) {
  for (;;) {
    Tree current;
    bool good = readOperand(current);
    if (current == nullptr) continue;
    // The operand may end its expression, and that may end the enclosing ones. The token that ends
    // an expression is dropped, whatever it is.
    for (;;) {
      const Token token = good ? _scanner.next() : kTokenError;
      if (isConnective(token)) {
        _waiting.push_back({token, std::move(current)});
        break;
      }
      while (!_waiting.empty() && (!good || _waiting.back().token != kTokenOpen)) {
        Waiting outer = std::move(_waiting.back());
        _waiting.pop_back();
        if (outer.token == kTokenOpen) continue;
        current = joined(outer.token, std::move(outer.left), std::move(current));
      }
      if (_waiting.empty()) {
        out = std::move(current);
        return good;
      }
      _waiting.pop_back();
    }
  }
}

// The spelling of an operator or, without "$", of a time function.
std::string_view spellingOf(int32_t token) {
  for (const Spelling& one : kOperators) {
    if (one.token == token) return one.text;
  }
  for (const Spelling& one : kTimeFunctions) {
    if (one.token == token) return one.text;
  }
  return {};
}

void appendEscaped(std::string_view text, std::string_view special, std::string& out) {
  for (const char c : text) {
    if (special.find(c) != std::string_view::npos) out.push_back('\\');
    out.push_back(c);
  }
}

void appendLeaf(const node& leaf, std::string& out) {
  if (isTimeOperator(leaf.type)) {
    out.append("$").append(spellingOf(leaf.type)).append("(").append(leaf.text).append(")");
  } else if (!leaf.text.empty() && startsWord(leaf.text[0]) &&
             std::all_of(leaf.text.begin(), leaf.text.end(), continuesWord)) {
    out += leaf.text;
  } else {
    out.push_back('"');
    appendEscaped(leaf.text, "\"\\", out);
    out.push_back('"');
  }
}

}  // namespace

node::~node() {
  if (left == nullptr && right == nullptr) return;
  std::vector<Tree> open;
  open.push_back(std::move(left));
  open.push_back(std::move(right));
  while (!open.empty()) {
    const Tree last = std::move(open.back());
    open.pop_back();
    if (last == nullptr) continue;
    if (last->left != nullptr) open.push_back(std::move(last->left));
    if (last->right != nullptr) open.push_back(std::move(last->right));
  }
}

bool parse(const char* input, Tree& out, size_t* stop) {
  Parser parser(input);
  const bool good = parser.parse(out);
  if (stop != nullptr) *stop = parser.position();
  return good;
}

bool isTimeOperator(int32_t token) {
  return token >= kTokenTimeAbsolute && token <= kTokenTimeIso;
}

std::string expressionText(const node& tree) {
  // A piece of output on the stack: a tree or, without one, a fixed text.
  struct Piece {
    const node* tree;
    std::string_view text;
  };
  std::vector<Piece> pieces{{&tree, {}}};
  const auto push = [&](const node& operand, bool enclosed) {
    if (enclosed) pieces.push_back({nullptr, ")"});
    pieces.push_back({&operand, {}});
    if (enclosed) pieces.push_back({nullptr, "("});
  };
  std::string out;
  while (!pieces.empty()) {
    const Piece piece = pieces.back();
    pieces.pop_back();
    if (piece.tree == nullptr) {
      out += piece.text;
    } else if (piece.tree->left == nullptr) {
      appendLeaf(*piece.tree, out);
    } else {
      const node& whole = *piece.tree;
      // A chain of one connective nested to the right needs no parentheses.
      push(*whole.right, isConnective(whole.right->type) && whole.right->type != whole.type);
      pieces.push_back({nullptr, " "});
      pieces.push_back({nullptr, spellingOf(whole.type)});
      pieces.push_back({nullptr, " "});
      push(*whole.left, isConnective(whole.left->type));
    }
  }
  return out;
}

std::string escaped(std::string_view text) {
  std::string out;
  appendEscaped(text, "\"'\\*", out);
  return out;
}

}  // namespace sq
