#include <algorithm>
#include <bit>
#include <cstdint>
#include <utility>

#include "platform/Assert.h"
#include "querylang/TLQueryAdditions.h"

namespace {

using Node = TLQueryAdditions::Node;
using Parts = TLQueryAdditions::Parts;
using enum TLQueryNodeMergeOp;

// A string searched for in this many attributes is free text.
constexpr size_t kMinAttributes = 5;

// A subtree with its hash, computed once from the hashes of its children.
struct Subtree {
  Node node;
  size_t hash = 0;
};

// Distinct subtrees in order of arrival, with a hash table of their indexes (linear probing). Uses
// two allocations whatever its size; with a node-based set, building a long chain of comparisons
// took nearly twice as long.
class DistinctSubtrees {
 public:
  explicit DistinctSubtrees(size_t most) : _places(std::bit_ceil(2 * most + 1)) {
    _subtrees.reserve(most);
  }

  [[nodiscard]] const std::vector<Subtree>& all() const { return _subtrees; }

  void add(Subtree subtree) {
    const size_t mask = _places.size() - 1;
    size_t at = spread(subtree.hash) & mask;
    for (; _places[at] != 0; at = (at + 1) & mask) {
      const Subtree& other = _subtrees[_places[at] - 1];
      if (other.hash == subtree.hash && other.node->isEqual(*subtree.node)) return;
    }
    _subtrees.push_back(std::move(subtree));
    _places[at] = static_cast<uint32_t>(_subtrees.size());
  }

 private:
  // Similar subtrees have hashes with similar lower bits.
  static size_t spread(size_t hash) { return (hash * 0x9E3779B97F4A7C15) >> 32; }

  std::vector<Subtree> _subtrees;
  std::vector<uint32_t> _places;  // index in _subtrees plus 1; 0 for a free slot
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

// Children that are not leaves are ignored.
bool isOneStringInManyAttributes(const TLQueryNode& node) {
  if (node.mergeOp() != OR || node.childsCount() < kMinAttributes) return false;
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

  // The subtree that replaces the node; empty if the node disappears.
  Subtree optimize(const Node& node, size_t height) {
    TL_ASSERT(height <= TLQueryAdditions::kMaxTreeHeight);
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
    // The constant that decides the result: false for AND, true for OR.
    const bool deciding = node->mergeOp() == OR;
    DistinctSubtrees kept(node->childsCount());
    for (const Node& child : node->childs()) {
      Subtree subtree = optimize(child, height + 1);
      if (subtree.node == nullptr) continue;
      if (isConstant(*subtree.node)) {
        if (subtree.node->boolValue() == deciding) return subtree;
        continue;
      }
      kept.add(std::move(subtree));
    }
    if (kept.all().empty()) return {};
    if (kept.all().size() == 1) return kept.all().front();
    Subtree result{node, static_cast<size_t>(node->mergeOp())};
    std::vector<Node> childs;
    childs.reserve(kept.all().size());
    for (const Subtree& subtree : kept.all()) {
      result.hash = combined(result.hash, subtree.hash);
      childs.push_back(subtree.node);
    }
    node->setChilds(std::move(childs));
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
