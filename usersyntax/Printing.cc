#include <fmt/format.h>

#include "usersyntax/Syntax.h"

namespace usersyntax {

namespace {

std::string timeText(const std::optional<double>& time) {
  return time ? fmt::format("{:.0f}", *time) : std::string();
}

std::string leafText(const Node& node) {
  switch (node.kind) {
    case Kind::text:
      return fmt::format("{}:{}\"{}\"{}", nameOf(node.field), node.phrase ? "=" : "", node.text,
                         node.prefix ? "*" : "");
    case Kind::date:
      return fmt::format("date:{}..{}", timeText(node.dates.from), timeText(node.dates.until));
    case Kind::flag:
      return fmt::format("is:{}", nameOf(node.flag));
    case Kind::size:
      return fmt::format("{}:{}", node.larger ? "larger" : "smaller", node.bytes);
    default:
      return {};
  }
}

// Recursion depth at most 3 * kMaxDepth.
void append(const Node& node, std::string& out) {
  const char* const name = node.kind == Kind::conjunction   ? "(and"
                           : node.kind == Kind::disjunction ? "(or"
                           : node.kind == Kind::negation    ? "(not"
                                                            : nullptr;
  if (name == nullptr) {
    out += leafText(node);
    return;
  }
  out += name;
  for (const Node& child : node.children) {
    out += ' ';
    append(child, out);
  }
  out += ')';
}

}  // namespace

std::string printed(const Node& node) {
  std::string out;
  append(node, out);
  return out;
}

}  // namespace usersyntax
