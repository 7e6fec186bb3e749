#pragma once

#include "records/RecordAccessors.h"
#include "records/TLAttributeKey.h"
#include "records/TLCodable.h"

// One node of a query's condition tree. A leaf has keys, an op and the value to compare with; an
// AND or OR node has only children.
//
// A tree has at most kMaxRecordDepth levels of children, one less inside a query. A deeper one
// can be built and destroyed, but writing, comparing, hashing, copying or describing it is a
// programming error.
class TLQueryNode final : public TLRecord<TLQueryNode> {
 public:
  TLQueryNode() = default;
  // Destroys the tree in a loop, whatever its depth.
  ~TLQueryNode() override;

  // The keys as numbers of TLAttributeKey, which may be outside its named values. The pointer is
  // valid until the next change.
  [[nodiscard]] const int32_t* keys() const { return _keys.data(); }
  [[nodiscard]] size_t keysCount() const { return _keys.size(); }
  void clearKeys() { _keys.clear(); }
  void addKey(int32_t key) { _keys.push_back(key); }
  void addKey(TLAttributeKey key) { addKey(static_cast<int32_t>(key)); }
  // Throws std::out_of_range past the end.
  [[nodiscard]] int32_t keyAtIndex(size_t index) const;
  void setKeys(const int32_t* keys, size_t count) {
    _keys = std::vector<int32_t>(keys, keys + count);
  }

  TL_RECORD_STRING(stringValue, StringValue)
  TL_RECORD_SCALAR(int64_t, intValue, IntValue, 2)
  TL_RECORD_SCALAR(float, floatValue, FloatValue, 4)
  // For a leaf that compares a time: seconds since 2001-01-01 00:00:00 UTC.
  TL_RECORD_SCALAR(double, doubleValue, DoubleValue, 1)
  TL_RECORD_SCALAR(bool, boolValue, BoolValue, 32)
  TL_RECORD_ENUM(TLQueryNodeOp, op, Op, 16, TLQueryNodeOp::STRING_EQUAL)
  TL_RECORD_ENUM(TLQueryNodeMergeOp, mergeOp, MergeOp, 8, TLQueryNodeMergeOp::LEAF)
  TL_RECORD_RECORDS(TLQueryNode, childs, Childs, child, Child)

  [[nodiscard]] static std::string keysAsString(int32_t key) {
    return TLAttributeKeyAsString(static_cast<TLAttributeKey>(key));
  }
  [[nodiscard]] static int32_t StringAsKeys(std::string_view name) {
    return static_cast<int32_t>(TLStringAsAttributeKey(name));
  }
  [[nodiscard]] static std::string opAsString(TLQueryNodeOp op) {
    return TLQueryNodeOpAsString(op);
  }
  [[nodiscard]] static TLQueryNodeOp StringAsOp(std::string_view name) {
    return TLStringAsQueryNodeOp(name);
  }
  [[nodiscard]] static std::string mergeOpAsString(TLQueryNodeMergeOp mergeOp) {
    return TLQueryNodeMergeOpAsString(mergeOp);
  }
  [[nodiscard]] static TLQueryNodeMergeOp StringAsMergeOp(std::string_view name) {
    return TLStringAsQueryNodeMergeOp(name);
  }

 private:
  friend struct TLRecordTable<TLQueryNode>;

  std::vector<int32_t> _keys;
};

extern template class TLRecord<TLQueryNode>;
