#pragma once

#include "records/RecordAccessors.h"
#include "records/TLAttribute.h"
#include "records/TLCard.h"
#include "records/TLCodable.h"
#include "records/TLRecordList.h"

// What a client submits for indexing, what the document store keeps, and what a search returns.
class TLIndexableItem final : public TLRecord<TLIndexableItem> {
 public:
  // A new item has an empty identifier, which counts as present and is written.
  TLIndexableItem() { setIdentifier(TLString()); }

  // Reads bytes written by data() of an item, and leaves the attributes in wire form until they are
  // first used. False if the bytes are anything else; the contents of the item are then
  // unspecified.
  [[nodiscard]] bool initWithWrittenData(std::string_view bytes);

  // In insertion order; keys may repeat. None is null.
  [[nodiscard]] const std::vector<std::shared_ptr<TLAttribute>>& attributes() const {
    return _attributes.records();
  }
  void setAttributes(std::vector<std::shared_ptr<TLAttribute>> values);
  void clearAttributes() { _attributes = {}; }
  void addAttributes(std::shared_ptr<TLAttribute> value);
  [[nodiscard]] size_t attributesCount() const { return attributes().size(); }
  // Throws std::out_of_range past the end.
  [[nodiscard]] const std::shared_ptr<TLAttribute>& attributesAtIndex(size_t index) const {
    return attributes().at(index);
  }
  [[nodiscard]] static const std::type_info& attributesType() { return typeid(TLAttribute); }

  TL_RECORD_STRING(identifier, Identifier)
  TL_RECORD_STRING(domainIdentifier, DomainIdentifier)
  TL_RECORD_SCALAR(int64_t, expirationDate, ExpirationDate, 1)
  // Absent until a search scores the item.
  TL_RECORD_RECORD(TLCard, card, Card)

  // Each appends one new attribute with this key and value; a null value appends nothing.
  void addAttributeWithKeyBoolValue(TLAttributeKey key, bool boolValue);
  void addAttributeWithKeyFloatValue(TLAttributeKey key, float floatValue);
  void addAttributeWithKeyDoubleValue(TLAttributeKey key, double doubleValue);
  void addAttributeWithKeyIntValue(TLAttributeKey key, int64_t intValue);
  void addAttributeWithKeyBytesValue(TLAttributeKey key, std::optional<std::string> bytesValue);
  void addAttributeWithKeyPersonValue(TLAttributeKey key, std::shared_ptr<TLPerson> personValue);
  void addAttributeWithKeyStringValue(TLAttributeKey key, std::optional<TLString> stringValue);
  void addAttributeWithKeyStringValues(TLAttributeKey key,
                                       std::optional<std::vector<TLString>> stringValues);
  void addAttributeWithKeyPersonValues(
      TLAttributeKey key, std::optional<std::vector<std::shared_ptr<TLPerson>>> personValues);

  // One person per address in a single attribute, which is appended even without addresses.
  void addPersonsWithKey(TLAttributeKey key, const std::vector<TLString>& emails);

  // The first attribute with the key, by linear search, or null. The reference is valid until the
  // list changes.
  [[nodiscard]] const std::shared_ptr<TLAttribute>& attributeForKey(TLAttributeKey key) const;
  [[nodiscard]] std::vector<std::shared_ptr<TLAttribute>> attributesForKey(
      TLAttributeKey key) const;

  // Values of the first attribute with the key, regardless of its presence bits; later attributes
  // with the key are ignored. Without one: false, 0 or null. References and pointers are valid
  // until the item changes.
  [[nodiscard]] bool boolValueForKey(TLAttributeKey key) const;
  [[nodiscard]] float floatValueForKey(TLAttributeKey key) const;
  [[nodiscard]] double doubleValueForKey(TLAttributeKey key) const;
  [[nodiscard]] int64_t intValueForKey(TLAttributeKey key) const;
  [[nodiscard]] const std::optional<std::string>& bytesValueForKey(TLAttributeKey key) const;
  [[nodiscard]] const std::shared_ptr<TLPerson>& personValueForKey(TLAttributeKey key) const;
  [[nodiscard]] const std::optional<TLString>& stringValueForKey(TLAttributeKey key) const;
  // Also null if the attribute has another value and no list.
  [[nodiscard]] const std::vector<std::shared_ptr<TLPerson>>* personValuesForKey(
      TLAttributeKey key) const;
  [[nodiscard]] const std::vector<TLString>* stringValuesForKey(TLAttributeKey key) const;

 private:
  friend struct TLRecordTable<TLIndexableItem>;

  TLRecordList<TLAttribute> _attributes;
};

extern template class TLRecord<TLIndexableItem>;
