#include <fmt/format.h>

#include <iterator>

#include "platform/Assert.h"
#include "platform/Redaction.h"
#include "querylang/TLQueryAdditions.h"

namespace {

void append(const TLQueryNode& node, size_t indent, bool inClear, std::string& out) {
  const auto put = [&out]<typename... Args>(fmt::format_string<Args...> format, Args&&... args) {
    fmt::format_to(std::back_inserter(out), format, std::forward<Args>(args)...);
  };
  out += '\n';
  out.append(indent, '\t');
  if (node.hasMergeOp()) put("{}, ", TLQueryNode::mergeOpAsString(node.mergeOp()));
  if (node.hasOp()) put("{}, ", TLQueryNode::opAsString(node.op()));
  for (size_t i = 0; i < node.keysCount(); ++i) {
    put("{}, ", TLQueryNode::keysAsString(node.keys()[i]));
  }
  if (node.hasIntValue()) put("{}, ", node.intValue());
  if (node.hasFloatValue()) put("{:f}, ", node.floatValue());
  if (node.hasDoubleValue()) put("{:f}, ", node.doubleValue());
  if (node.hasBoolValue()) put("{}, ", static_cast<int>(node.boolValue()));
  if (node.hasStringValue()) {
    out +=
        inClear ? platform::printable(node.stringValue()) : platform::redacted(node.stringValue());
  }
}

// `height` is the distance of the node from the root, which bounds the recursion.
void appendTree(const TLQueryNode& node, size_t indent, size_t height, bool inClear,
                std::string& out) {
  TL_ASSERT(height <= TLQueryAdditions::kMaxTreeHeight);
  append(node, indent, inClear, out);
  for (const auto& child : node.childs()) {
    appendTree(*child, indent + 1, height + 1, inClear, out);
  }
}

}  // namespace

std::string TLQueryAdditions::_stringifyQueryTree(const TLQueryNode* node, size_t indent,
                                                  bool inClear) {
  std::string out;
  if (node != nullptr) appendTree(*node, indent, 1, inClear, out);
  return out;
}

void TLQueryAdditions::_printQueryTree(const TLQueryNode* node) {
  if (!log().enabled(platform::LogLevel::info)) return;
  log().info("\n{}\n", _stringifyQueryTree(node, 0));
}
