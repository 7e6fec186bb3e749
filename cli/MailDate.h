#pragma once

#include <cstdint>
#include <optional>

#include "records/TLIndexableItem.h"

namespace cli {

// The displayed date of an item, in seconds since 1970: the date of receipt, otherwise of sending.
[[nodiscard]] std::optional<double> dateOf(const TLIndexableItem& item);

// Nullopt also for what is no time of a calendar.
[[nodiscard]] std::optional<int64_t> wholeSeconds(const std::optional<double>& seconds);

}  // namespace cli
