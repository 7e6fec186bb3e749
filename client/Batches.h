#pragma once

#include <cstddef>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "platform/TLError.h"
#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"

namespace client {

// D-Bus ends a connection over an array that is longer than this.
inline constexpr size_t kMaximumArrayBytes = size_t{64} << 20;

// An item in wire form, beside what names it in messages.
struct EncodedItem {
  std::string identifier;
  std::string bytes;
};

[[nodiscard]] EncodedItem encode(const TLIndexableItem& item);

// Cuts a list into pieces, in order, whose D-Bus arrays stay within `limit`, as full as that
// allows. An empty list gives no piece. None, with an error that names it, when one item or text
// alone does not fit.
[[nodiscard]] std::optional<std::vector<std::span<const EncodedItem>>> splitItems(
    std::span<const EncodedItem> items, TLErrorOut error, size_t limit = kMaximumArrayBytes);
[[nodiscard]] std::optional<std::vector<std::span<const std::string>>> splitTexts(
    std::span<const std::string> texts, TLErrorOut error, size_t limit = kMaximumArrayBytes);

// The query in wire form. None, with an error that says by what, when it goes beyond what the
// daemon takes: kMaximumRecordDepth nodes above each other, kMaximumRecordElements records in all,
// or `limit` bytes.
[[nodiscard]] std::optional<std::string> encode(const TLQuery& query, TLErrorOut error,
                                                size_t limit = kMaximumArrayBytes);

}  // namespace client
