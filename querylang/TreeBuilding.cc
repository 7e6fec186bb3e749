#include <cstdlib>

#include "platform/Assert.h"
#include "platform/Redaction.h"
#include "querylang/TLQueryAdditions.h"

namespace {

using Node = TLQueryAdditions::Node;
using Stack = TLQueryAdditions::Stack;
using enum TLQueryNodeMergeOp;

struct OperatorRow {
  int32_t token;
  TLQueryNodeOp op;
};
constexpr OperatorRow kOperators[] = {
    {sq::kTokenEqual, TLQueryNodeOp::STRING_EQUAL},
    {sq::kTokenNotEqual, TLQueryNodeOp::STRING_NOT_EQUAL},
    {sq::kTokenGreater, TLQueryNodeOp::FLOAT_GREATER},
    {sq::kTokenLess, TLQueryNodeOp::FLOAT_LESS},
    {sq::kTokenGreaterEqual, TLQueryNodeOp::FLOAT_GREATER_EQUAL},
    {sq::kTokenLessEqual, TLQueryNodeOp::FLOAT_LESS_EQUAL},
};

bool isOpen(const Node& node) {
  return node->mergeOp() == AND || node->mergeOp() == OR;
}

// Attributes with numeric values. REPLIED_TO is in the same range of numbers but has none.
bool comparesNumbers(TLAttributeKey key) {
  using enum TLAttributeKey;
  return key == READ || key == FLAGGED || key == FLAG_COLOR || key == PRIORITY;
}

Node newLeaf(TLQueryNodeOp op) {
  auto leaf = std::make_shared<TLQueryNode>();
  leaf->setMergeOp(LEAF);
  leaf->setOp(op);
  return leaf;
}

Node constantLeaf(bool value) {
  Node leaf = newLeaf(TLQueryNodeOp::BOOL_CONSTANT);
  leaf->setBoolValue(value);
  return leaf;
}

// An empty text is 0; a number out of range is clamped. False if the text as a whole is not a
// number.
bool readInteger(const std::string& text, int64_t* number) {
  char* end = nullptr;
  *number = std::strtoll(text.c_str(), &end, 10);
  return end == text.c_str() + text.size();
}

Node comparisonLeaf(const sq::node& comparison) {
  const TLQueryNodeOp op = TLQueryAdditions::_lookupOperator(comparison.type);
  const TLAttributeKey key = TLQueryAdditions::_lookupAttribute(comparison.left->text);
  const sq::node& value = *comparison.right;
  Node leaf = newLeaf(op);
  int64_t number = 0;
  if (sq::isTimeOperator(value.type)) {
    leaf->setDoubleValue(TLQueryAdditions::_evalTimeExpression(value.type, value.text));
  } else if (op == TLQueryNodeOp::STRING_EQUAL && comparesNumbers(key) &&
             readInteger(value.text, &number)) {
    leaf->setIntValue(number);
    leaf->setOp(TLQueryNodeOp::INT_EQUAL);
  } else {
    leaf->setStringValue(platform::fromUTF8(value.text));
  }
  leaf->addKey(key);
  return leaf;
}

// The leaf for a parse node that is not a connective; null if it adds nothing.
Node leafOf(const sq::node& node) {
  switch (node.type) {
    case sq::kTokenString:
      return node.text == "true" || node.text == "false" ? constantLeaf(node.text == "true")
                                                         : nullptr;
    case sq::kTokenAssign:
    case sq::kTokenEqual:
    case sq::kTokenNotEqual:
    case sq::kTokenGreater:
    case sq::kTokenLess:
    case sq::kTokenGreaterEqual:
    case sq::kTokenLessEqual:
      return comparisonLeaf(node);
    default:
      return nullptr;
  }
}

}  // namespace

TLQueryNodeOp TLQueryAdditions::_lookupOperator(int32_t token) {
  for (const OperatorRow& row : kOperators) {
    if (row.token == token) return row.op;
  }
  return TLQueryNodeOp::STRING_EQUAL;
}

TLAttributeKey TLQueryAdditions::_lookupAttribute(std::string_view name) {
  const auto key = TLAttributeKeyForQueryName(name);
  if (!key) {
    log().error("Unknown attribute key: {}", name);
  }
  return key.value_or(TLAttributeKey::UNKNOWN);
}

// Traverses the parse tree with its own stack, because a chain of connectives is as deep as it is
// long; only the resulting tree is bounded in height.
bool TLQueryAdditions::_build(const sq::node* node, Stack& stack) {
  if (stack.empty() || !isOpen(stack.back())) {
    log().error("Stack is empty or contains non AND or OR TLNodeQuery: {}",
                stack.empty() ? "(null)" : _stringifyQueryTree(stack.back().get(), 0));
    return true;
  }
  // Work that remains, the next step on top.
  struct Step {
    const sq::node* node;
    bool pops;  // the node of this connective is complete
  };
  std::vector<Step> steps{{node, false}};
  while (!steps.empty()) {
    const Step step = steps.back();
    steps.pop_back();
    if (step.pops) {
      stack.pop_back();
      continue;
    }
    if (step.node == nullptr) {
      platform::assertionFailed("n != nil", "-[TLQuery(InitMethods) _build:stack:]", __LINE__);
    }
    const bool isAnd = step.node->type == sq::kTokenAnd;
    if (!isAnd && step.node->type != sq::kTokenOr) {
      if (Node leaf = leafOf(*step.node)) stack.back()->addChild(std::move(leaf));
      continue;
    }
    const TLQueryNodeMergeOp mergeOp = isAnd ? AND : OR;
    if (stack.back()->mergeOp() != mergeOp) {
      // The new node has at least a leaf below it.
      if (stack.size() + 2 > kMaxTreeHeight) return false;
      auto inner = std::make_shared<TLQueryNode>();
      inner->setMergeOp(mergeOp);
      stack.back()->addChild(inner);
      stack.push_back(std::move(inner));
      steps.push_back({nullptr, true});
    }
    steps.push_back({step.node->right.get(), false});
    steps.push_back({step.node->left.get(), false});
  }
  return true;
}
