#include "usersyntax/Syntax.h"

#include <fmt/format.h>

#include <utility>

#include "usersyntax/Lexer.h"

namespace usersyntax {

namespace {

using Type = Token::Type;

Node joined(Kind kind, std::vector<Node> children) {
  if (children.size() == 1) return std::move(children.front());
  Node node;
  node.kind = kind;
  node.children = std::move(children);
  return node;
}

Node negationOf(Node operand) {
  Node node;
  node.kind = Kind::negation;
  node.children.push_back(std::move(operand));
  return node;
}

// The node of a field with a value other than text; nullopt if the value is invalid.
std::optional<Node> valueNode(Field field, const std::string& text, double now) {
  Node node;
  const auto withDates = [&](std::optional<DateRange> dates) -> std::optional<Node> {
    if (!dates) return std::nullopt;
    node.kind = Kind::date;
    node.dates = *dates;
    return node;
  };
  switch (field) {
    case Field::is:
    case Field::has:
      if (const auto flag = flagNamed(field, text)) {
        node.kind = Kind::flag;
        node.flag = *flag;
        return node;
      }
      return std::nullopt;
    case Field::date:
      return withDates(rangeNamed(text, now));
    case Field::before:
      if (const auto period = periodNamed(text, now)) return withDates({{{}, period->from}});
      return std::nullopt;
    case Field::after:
      if (const auto period = periodNamed(text, now)) return withDates({{period->until, {}}});
      return std::nullopt;
    case Field::larger:
    case Field::smaller:
      if (const auto bytes = sizeNamed(text)) {
        node.kind = Kind::size;
        node.bytes = *bytes;
        node.larger = field == Field::larger;
        return node;
      }
      return std::nullopt;
    default:
      return std::nullopt;
  }
}

const char* allowedValues(Field field) {
  switch (field) {
    case Field::is:
      return "read, unread, flagged, replied or junk";
    case Field::has:
      return "attachment";
    case Field::larger:
    case Field::smaller:
      return "a size such as 500K or 2M";
    default:
      return "a date such as 2010, 2010-03, 2010-03-15, yesterday or 3w";
  }
}

// An open group and what has been read of it.
struct Frame {
  std::vector<Node> alternatives;  // complete alternatives
  std::vector<Node> sequence;      // the current alternative
  Field field = Field::any;        // for the words inside: from:(a OR b)
  bool negated = false;            // applies to the whole group
};

// Builds the tree in a loop, with one frame for each open group.
class Builder {
 public:
  Builder(std::string_view text, double now, Query& query)
      : _text(text), _now(now), _query(query), _frames(1) {}

  void take(const Token& token) {
    const bool plain = token.type == Type::word && token.field == Field::any && !token.negated;
    if (!plain) _query.plain = false;
    switch (token.type) {
      case Type::open:
        _frames.push_back({{}, {}, token.field, token.negated != _negated});
        if (_frames.back().field == Field::any) {
          _frames.back().field = _frames[_frames.size() - 2].field;
        }
        _negated = false;
        break;
      case Type::close:
        add(closeFrame());
        break;
      case Type::connective:
        takeConnective(token.connective);
        break;
      case Type::word:
      case Type::phrase:
        addOperand(leafOf(token), token.negated != std::exchange(_negated, false));
        break;
    }
  }

  void finish() {
    Frame& frame = _frames.front();
    endSequence(frame);
    _query.root = joined(Kind::disjunction, std::move(frame.alternatives));
    if (_query.root.children.empty() && _query.root.kind == Kind::disjunction) {
      _query.root.kind = Kind::conjunction;
    }
  }

 private:
  static void endSequence(Frame& frame) {
    if (frame.sequence.empty()) return;
    frame.alternatives.push_back(joined(Kind::conjunction, std::move(frame.sequence)));
    frame.sequence.clear();
  }

  Node closeFrame() {
    Frame frame = std::move(_frames.back());
    _frames.pop_back();
    endSequence(frame);
    Node node = joined(Kind::disjunction, std::move(frame.alternatives));
    return frame.negated ? negationOf(std::move(node)) : node;
  }

  void takeConnective(Connective connective) {
    if (connective == Connective::negation) _negated = !_negated;
    if (connective == Connective::disjunction) endSequence(_frames.back());
  }

  void addOperand(Node node, bool negated) {
    add(negated ? negationOf(std::move(node)) : std::move(node));
  }
  void add(Node node) { _frames.back().sequence.push_back(std::move(node)); }

  Node leafOf(const Token& token) {
    Field field = token.field != Field::any ? token.field : _frames.back().field;
    std::string text = token.text;
    const bool prefix = isLast(token);
    if (field >= Field::is) {
      if (auto node = valueNode(field, text, _now)) return std::move(*node);
      _query.remarks.push_back(fmt::format("\"{}\" is not {}, so \"{}:{}\" is taken as words", text,
                                           allowedValues(field), nameOf(field), text));
      text = fmt::format("{} {}", nameOf(field), text);
      field = Field::any;
    }
    Node node;
    node.kind = Kind::text;
    node.field = field;
    node.phrase = token.type == Type::phrase;
    node.prefix = prefix && !node.phrase;
    node.text = std::move(text);
    return node;
  }

  // Whether the token ends where the text ends: it is still being typed.
  [[nodiscard]] bool isLast(const Token& token) const {
    return token.source.data() + token.source.size() == _text.data() + _text.size();
  }

  const std::string_view _text;
  const double _now;
  Query& _query;
  std::vector<Frame> _frames;
  bool _negated = false;  // a NOT applies to the next operand
};

}  // namespace

Query parse(std::string_view text, double now) {
  Query query;
  Builder builder(text, now, query);
  for (const Token& token : tokensOf(text, query.remarks)) builder.take(token);
  builder.finish();
  return query;
}

}  // namespace usersyntax
