#include "records/TLAttributeKey.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>

namespace {

template <typename Enum>
std::string nameOf(Enum value) {
  const auto& table = TLEnumNames<Enum>::table;
  const auto* row =
      std::lower_bound(std::begin(table), std::end(table), value,
                       [](const TLEnumName<Enum>& one, Enum wanted) { return one.value < wanted; });
  if (row != std::end(table) && row->value == value) return std::string(row->name);
  return fmt::format("(unknown: {})", static_cast<int32_t>(value));
}

template <typename Enum>
Enum valueOf(std::string_view name, Enum fallback) {
  for (const auto& row : TLEnumNames<Enum>::table) {
    if (row.name == name) return row.value;
  }
  return fallback;
}

}  // namespace

std::string TLAttributeKeyAsString(TLAttributeKey key) {
  return nameOf(key);
}

std::string TLQueryNodeOpAsString(TLQueryNodeOp op) {
  return nameOf(op);
}

std::string TLQueryNodeMergeOpAsString(TLQueryNodeMergeOp mergeOp) {
  return nameOf(mergeOp);
}

TLAttributeKey TLStringAsAttributeKey(std::string_view name) {
  return valueOf(name, TLAttributeKey::UNKNOWN);
}

TLQueryNodeOp TLStringAsQueryNodeOp(std::string_view name) {
  return valueOf(name, TLQueryNodeOp::STRING_EQUAL);
}

TLQueryNodeMergeOp TLStringAsQueryNodeMergeOp(std::string_view name) {
  return valueOf(name, TLQueryNodeMergeOp::LEAF);
}

std::optional<TLAttributeKey> TLAttributeKeyForQueryName(std::string_view name) {
  const auto* row = std::find_if(kTLAttributeNames.begin(), kTLAttributeNames.end(),
                                 [&](const TLAttributeName& one) { return one.name == name; });
  if (row == kTLAttributeNames.end()) return std::nullopt;
  return row->key;
}
