#pragma once

#include <memory>
#include <string>

#include "platform/URL.h"
#include "records/TLIndexableItem.h"

// Documents for the tests of the store.
namespace testsupport {

inline TLURL url(const std::string& name) {
  return *TLURL::parse("tlw://b/" + name);
}
inline TLURL url(size_t number) {
  return url(std::to_string(number));
}

inline std::shared_ptr<TLIndexableItem> item(const TLString& subject) {
  auto result = std::make_shared<TLIndexableItem>();
  result->setIdentifier(u"id " + subject);
  result->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, subject);
  return result;
}

inline const std::optional<TLString>& subjectOf(const std::shared_ptr<TLIndexableItem>& document) {
  return document->stringValueForKey(TLAttributeKey::SUBJECT);
}

}  // namespace testsupport
