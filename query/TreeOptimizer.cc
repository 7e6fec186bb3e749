#include <algorithm>
#include <unordered_set>

#include "platform/Assert.h"
#include "query/TLQueryAdditions.h"

namespace {

using Node = TLQueryAdditions::Node;
using Parts = TLQueryAdditions::Parts;
using enum TLQueryNodeMergeOp;

// One string sought in this many attributes is free text.
constexpr size_t kFewestAttributes = 5;

// A subtree with its hash, which is made once, from the hashes below.
struct Subtree {
  Node node;
  size_t hash = 0;
};

struct HashOf {
  size_t operator()(const Subtree& subtree) const { return subtree.hash; }
};
struct SameTree {
  bool operator()(const Subtree& a, const Subtree& b) const { return a.node->isEqual(*b.node); }
};

bool isConstant(const TLQueryNode& node) {
  return node.mergeOp() == LEAF && node.op() == TLQueryNodeOp::BOOL_CONSTANT;
}

bool isSoughtAnywhere(const TLQueryNode& leaf) {
  return std::any_of(leaf.keys(), leaf.keys() + leaf.keysCount(), [](int32_t number) {
    const auto key = static_cast<TLAttributeKey>(number);
    return key == TLAttributeKey::ANY || key == TLAttributeKey::ANY_METADATA;
  });
}

// Children that are no leaves do not count against it.
bool isOneStringInManyAttributes(const TLQueryNode& node) {
  if (node.mergeOp() != OR || node.childsCount() < kFewestAttributes) return false;
  const auto& wanted = node.childs().front()->stringValue();
  return wanted.has_value() &&
         std::all_of(node.childs().begin(), node.childs().end(), [&](const Node& child) {
           return child->mergeOp() != LEAF || child->stringValue() == wanted;
         });
}

void addPart(const std::optional<TLString>& text, Parts& parts) {
  if (text && !text->empty()) parts.push_back(*text);
}

size_t combined(size_t seed, size_t hash) {
  return seed * 31 + hash;
}

class Optimizer {
 public:
  explicit Optimizer(Parts& parts) : _parts(parts) {}

  // The subtree that takes the node's place; none where it disappears.
  Subtree optimize(const Node& node, size_t height) {
    TL_ASSERT(height <= TLQueryAdditions::kMaximumTreeHeight);
    switch (node->mergeOp()) {
      case LEAF:
        return leaf(node);
      case AND:
      case OR:
        return inner(node, height);
    }
    return {};
  }

 private:
  Subtree leaf(const Node& node) {
    if (node->hasStringValue()) {
      node->setStringValue(TLQueryAdditions::removeWildCard(*node->stringValue()));
    }
    if (!isSoughtAnywhere(*node)) return {node, node->hash()};
    addPart(node->stringValue(), _parts);
    return {};
  }

  Subtree inner(const Node& node, size_t height) {
    if (isOneStringInManyAttributes(*node)) {
      addPart(TLQueryAdditions::removeWildCard(*node->childs().front()->stringValue()), _parts);
      return {};
    }
    // The constant that decides: false an AND, true an OR.
    const bool deciding = node->mergeOp() == OR;
    std::vector<Node> kept;
    std::unordered_set<Subtree, HashOf, SameTree> known(node->childsCount());
    Subtree result{node, static_cast<size_t>(node->mergeOp())};
    for (const Node& child : node->childs()) {
      Subtree subtree = optimize(child, height + 1);
      if (subtree.node == nullptr) continue;
      if (isConstant(*subtree.node)) {
        if (subtree.node->boolValue() == deciding) return subtree;
        continue;
      }
      if (!known.insert(subtree).second) continue;
      result.hash = combined(result.hash, subtree.hash);
      kept.push_back(std::move(subtree.node));
    }
    if (kept.empty()) return {};
    if (kept.size() == 1) return *known.begin();
    node->setChilds(std::move(kept));
    return result;
  }

  Parts& _parts;
};

}  // namespace

TLString TLQueryAdditions::removeWildCard(const TLString& string) {
  if (string.size() < 2) return string;
  TLStringView text = string;
  if (text.starts_with(u'*')) text.remove_prefix(1);
  if (text.ends_with(u'*')) text.remove_suffix(1);
  return TLString(text);
}

TLQueryAdditions::Node TLQueryAdditions::optimizeQuery(const Node& node,
                                                       Parts& originalQueryParts) {
  return node == nullptr ? nullptr : Optimizer(originalQueryParts).optimize(node, 1).node;
}
