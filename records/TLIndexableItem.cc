#include "records/TLIndexableItem.h"

#include "records/RecordFields.h"

template <>
struct TLRecordTable<TLIndexableItem> {
  static constexpr const char* name = "TLIndexableItem";
  static constexpr std::tuple fields{
      TLField{1, "attributes", &TLIndexableItem::_attributes},
      TLField{2, "identifier", &TLIndexableItem::_identifier},
      TLField{3, "domainIdentifier", &TLIndexableItem::_domainIdentifier},
      TLField{4, "expirationDate", &TLIndexableItem::_expirationDate,
              TLIndexableItem::kExpirationDateBit},
      TLField{5, "card", &TLIndexableItem::_card},
  };
};

template class TLRecord<TLIndexableItem>;

namespace {

// Appends a new attribute with the key, its value set by `setter`.
template <typename Setter, typename Value>
void append(TLIndexableItem& item, TLAttributeKey key, Setter setter, Value&& value) {
  auto attribute = std::make_shared<TLAttribute>();
  attribute->setKey(key);
  ((*attribute).*setter)(std::forward<Value>(value));
  item.addAttributes(std::move(attribute));
}

}  // namespace

bool TLIndexableItem::initWithWrittenData(std::string_view bytes) {
  TLReader reader(bytes, true);
  return readFrom(reader);
}

void TLIndexableItem::setAttributes(std::vector<std::shared_ptr<TLAttribute>> values) {
  for (const auto& value : values) TL_ASSERT(value != nullptr);
  _attributes = std::move(values);
}

void TLIndexableItem::addAttributes(std::shared_ptr<TLAttribute> value) {
  TL_ASSERT(value != nullptr);
  _attributes.records().push_back(std::move(value));
}

void TLIndexableItem::addAttributeWithKeyBoolValue(TLAttributeKey key, bool boolValue) {
  append(*this, key, &TLAttribute::setBoolValue, boolValue);
}

void TLIndexableItem::addAttributeWithKeyFloatValue(TLAttributeKey key, float floatValue) {
  append(*this, key, &TLAttribute::setFloatValue, floatValue);
}

void TLIndexableItem::addAttributeWithKeyDoubleValue(TLAttributeKey key, double doubleValue) {
  append(*this, key, &TLAttribute::setDoubleValue, doubleValue);
}

void TLIndexableItem::addAttributeWithKeyIntValue(TLAttributeKey key, int64_t intValue) {
  append(*this, key, &TLAttribute::setIntValue, intValue);
}

void TLIndexableItem::addAttributeWithKeyBytesValue(TLAttributeKey key,
                                                    std::optional<std::string> bytesValue) {
  if (bytesValue) append(*this, key, &TLAttribute::setBytesValue, std::move(bytesValue));
}

void TLIndexableItem::addAttributeWithKeyPersonValue(TLAttributeKey key,
                                                     std::shared_ptr<TLPerson> personValue) {
  if (personValue) append(*this, key, &TLAttribute::setPersonValue, std::move(personValue));
}

void TLIndexableItem::addAttributeWithKeyStringValue(TLAttributeKey key,
                                                     std::optional<TLString> stringValue) {
  if (stringValue) append(*this, key, &TLAttribute::setStringValue, std::move(stringValue));
}

void TLIndexableItem::addAttributeWithKeyStringValues(
    TLAttributeKey key, std::optional<std::vector<TLString>> stringValues) {
  if (stringValues) append(*this, key, &TLAttribute::setStringValues, std::move(*stringValues));
}

void TLIndexableItem::addAttributeWithKeyPersonValues(
    TLAttributeKey key, std::optional<std::vector<std::shared_ptr<TLPerson>>> personValues) {
  if (personValues) append(*this, key, &TLAttribute::setPersonValues, std::move(*personValues));
}

void TLIndexableItem::addPersonsWithKey(TLAttributeKey key, const std::vector<TLString>& emails) {
  std::vector<std::shared_ptr<TLPerson>> persons;
  persons.reserve(emails.size());
  for (const TLString& email : emails) {
    persons.push_back(std::make_shared<TLPerson>());
    persons.back()->setEmailAddress(email);
  }
  addAttributeWithKeyPersonValues(key, std::move(persons));
}

const std::shared_ptr<TLAttribute>& TLIndexableItem::attributeForKey(TLAttributeKey key) const {
  static const std::shared_ptr<TLAttribute> none;
  for (const auto& attribute : attributes()) {
    if (attribute->key() == key) return attribute;
  }
  return none;
}

std::vector<std::shared_ptr<TLAttribute>> TLIndexableItem::attributesForKey(
    TLAttributeKey key) const {
  std::vector<std::shared_ptr<TLAttribute>> result;
  for (const auto& attribute : attributes()) {
    if (attribute->key() == key) result.push_back(attribute);
  }
  return result;
}

namespace {

// Returned for a missing key: an attribute with nothing set.
const TLAttribute& attributeOrEmpty(const TLIndexableItem& item, TLAttributeKey key) {
  static const TLAttribute empty;
  const auto& attribute = item.attributeForKey(key);
  return attribute ? *attribute : empty;
}

// The key and the double value of an attribute in wire form, without decoding the rest.
std::pair<TLAttributeKey, double> keyAndDouble(std::string_view bytes) {
  auto key = TLAttributeKey::UNKNOWN;
  double value = 0;
  for (TLReader reader(bytes); reader.hasMore();) {
    const uint64_t tag = reader.readVarint();
    if (tag >> 3 == TLAttribute::kKeyNumber) {
      key = static_cast<TLAttributeKey>(static_cast<int32_t>(reader.readVarint()));
    } else if (tag >> 3 == TLAttribute::kDoubleValueNumber) {
      value = reader.readDouble();
    } else if (!reader.skipValue(tag & 7)) {
      break;
    }
  }
  return {key, value};
}

// An attribute with no other value counts as an empty list.
template <typename Element>
const std::vector<Element>* listOf(const TLAttribute* attribute,
                                   const std::vector<Element>& (TLAttribute::*list)() const) {
  if (attribute == nullptr) return nullptr;
  const std::vector<Element>& found = (attribute->*list)();
  const bool otherValue = attribute->hasStringValue() || attribute->hasIntValue() ||
                          attribute->hasFloatValue() || attribute->hasDoubleValue() ||
                          attribute->hasBoolValue() || attribute->hasPersonValue() ||
                          attribute->hasBytesValue() || attribute->stringValuesCount() != 0 ||
                          attribute->personValuesCount() != 0;
  return found.empty() && otherValue ? nullptr : &found;
}

}  // namespace

bool TLIndexableItem::boolValueForKey(TLAttributeKey key) const {
  return attributeOrEmpty(*this, key).boolValue();
}

float TLIndexableItem::floatValueForKey(TLAttributeKey key) const {
  return attributeOrEmpty(*this, key).floatValue();
}

// Optimised because searches read the dates of many items, and nothing else.
double TLIndexableItem::doubleValueForKey(TLAttributeKey key) const {
  if (!_attributes.isWire()) return attributeOrEmpty(*this, key).doubleValue();
  double found = 0;
  _attributes.forEachWire([&](std::string_view bytes, std::string_view) {
    const auto [itsKey, value] = keyAndDouble(bytes);
    if (itsKey == key) found = value;
    return itsKey != key;
  });
  return found;
}

int64_t TLIndexableItem::intValueForKey(TLAttributeKey key) const {
  return attributeOrEmpty(*this, key).intValue();
}

const std::optional<std::string>& TLIndexableItem::bytesValueForKey(TLAttributeKey key) const {
  return attributeOrEmpty(*this, key).bytesValue();
}

const std::shared_ptr<TLPerson>& TLIndexableItem::personValueForKey(TLAttributeKey key) const {
  return attributeOrEmpty(*this, key).personValue();
}

const std::optional<TLString>& TLIndexableItem::stringValueForKey(TLAttributeKey key) const {
  return attributeOrEmpty(*this, key).stringValue();
}

const std::vector<std::shared_ptr<TLPerson>>* TLIndexableItem::personValuesForKey(
    TLAttributeKey key) const {
  return listOf(attributeForKey(key).get(), &TLAttribute::personValues);
}

const std::vector<TLString>* TLIndexableItem::stringValuesForKey(TLAttributeKey key) const {
  return listOf(attributeForKey(key).get(), &TLAttribute::stringValues);
}
