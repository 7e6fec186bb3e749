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

// D-Bus closes a connection over a longer array.
inline constexpr size_t kMaxArrayBytes = size_t{64} << 20;

// An item in wire form, with its name in messages.
struct EncodedItem {
  std::string identifier;
  std::string bytes;
};

[[nodiscard]] EncodedItem encode(const TLIndexableItem& item);

// Splits a list into pieces, in order, whose D-Bus arrays stay within `limit`, each as full as
// possible. An empty list gives no piece. Nullopt, with an error that names it, if a single item or
// text exceeds the limit.
[[nodiscard]] std::optional<std::vector<std::span<const EncodedItem>>> splitItems(
    std::span<const EncodedItem> items, TLErrorOut error, size_t limit = kMaxArrayBytes);
[[nodiscard]] std::optional<std::vector<std::span<const std::string>>> splitTexts(
    std::span<const std::string> texts, TLErrorOut error, size_t limit = kMaxArrayBytes);

// The query in wire form. Nullopt, with an error that says why, if it exceeds a limit of the
// daemon: kMaxRecordDepth levels of nodes, kMaxRecordElements records in all, or `limit`
// bytes.
[[nodiscard]] std::optional<std::string> encode(const TLQuery& query, TLErrorOut error,
                                                size_t limit = kMaxArrayBytes);

}  // namespace client
