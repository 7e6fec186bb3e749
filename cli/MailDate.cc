#include "cli/MailDate.h"

#include <cmath>

namespace cli {

std::optional<double> dateOf(const TLIndexableItem& item) {
  for (const auto key :
       {TLAttributeKey::MAIL_DATE_RECEIVED, TLAttributeKey::CONTENT_CREATION_DATE}) {
    const auto& attribute = item.attributeForKey(key);
    if (attribute != nullptr && attribute->hasDoubleValue()) return attribute->doubleValue();
  }
  return std::nullopt;
}

std::optional<int64_t> wholeSeconds(const std::optional<double>& seconds) {
  constexpr double kYear9999 = 253402300799;
  if (!seconds || !(std::fabs(*seconds) <= kYear9999)) return std::nullopt;
  return static_cast<int64_t>(*seconds);
}

}  // namespace cli
