#include "records/TLQueryNode.h"

#include <fmt/format.h>

#include <stdexcept>

#include "records/RecordFields.h"

template <>
struct TLRecordTable<TLQueryNode> {
  static constexpr const char* name = "TLQueryNode";
  static constexpr std::tuple fields{
      TLField{1, "key", &TLQueryNode::_keys},
      TLField{2, "stringValue", &TLQueryNode::_stringValue},
      TLField{3, "intValue", &TLQueryNode::_intValue, TLQueryNode::kIntValueBit},
      TLField{4, "floatValue", &TLQueryNode::_floatValue, TLQueryNode::kFloatValueBit},
      TLField{5, "doubleValue", &TLQueryNode::_doubleValue, TLQueryNode::kDoubleValueBit},
      TLField{6, "boolValue", &TLQueryNode::_boolValue, TLQueryNode::kBoolValueBit},
      TLField{7, "op", &TLQueryNode::_op, TLQueryNode::kOpBit},
      TLField{8, "mergeOp", &TLQueryNode::_mergeOp, TLQueryNode::kMergeOpBit},
      TLField{9, "child", &TLQueryNode::_childs},
  };
};

template class TLRecord<TLQueryNode>;

// Children without another owner give up their own children first, so that no destructor runs
// inside another's.
TLQueryNode::~TLQueryNode() {
  std::vector<std::shared_ptr<TLQueryNode>> open = std::move(_childs);
  while (!open.empty()) {
    const std::shared_ptr<TLQueryNode> node = std::move(open.back());
    open.pop_back();
    if (node.use_count() != 1) continue;
    for (auto& child : node->_childs) open.push_back(std::move(child));
    node->_childs.clear();
  }
}

int32_t TLQueryNode::keyAtIndex(size_t index) const {
  if (index >= _keys.size()) {
    throw std::out_of_range(fmt::format("idx ({}) is out of range ({})", index, _keys.size()));
  }
  return _keys[index];
}
