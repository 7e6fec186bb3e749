#pragma once

#include "records/RecordAccessors.h"
#include "records/TLAttributeKey.h"
#include "records/TLCodable.h"
#include "records/TLPerson.h"

// One keyed value of an item. Not a union: every value field that is set is written.
class TLAttribute final : public TLRecord<TLAttribute> {
 public:
  // On the wire.
  static constexpr uint32_t kKeyNumber = 1;
  static constexpr uint32_t kDoubleValueNumber = 6;

  TL_RECORD_ENUM(TLAttributeKey, key, Key, 8, TLAttributeKey::UNKNOWN)
  // The attribute's name when the key is CUSTOM.
  TL_RECORD_STRING(customKey, CustomKey)
  TL_RECORD_STRING(stringValue, StringValue)
  TL_RECORD_SCALAR(int64_t, intValue, IntValue, 2)
  TL_RECORD_SCALAR(float, floatValue, FloatValue, 4)
  // Dates are stored here.
  TL_RECORD_SCALAR(double, doubleValue, DoubleValue, 1)
  TL_RECORD_SCALAR(bool, boolValue, BoolValue, 16)
  TL_RECORD_RECORD(TLPerson, personValue, PersonValue)
  TL_RECORD_BYTES(bytesValue, BytesValue)
  TL_RECORD_STRINGS(stringValues, StringValues)
  TL_RECORD_RECORDS(TLPerson, personValues, PersonValues, personValues, PersonValues)

  [[nodiscard]] static std::string keyAsString(TLAttributeKey key) {
    return TLAttributeKeyAsString(key);
  }
  // UNKNOWN for a name that is not in the enumeration.
  [[nodiscard]] static TLAttributeKey StringAsKey(std::string_view name) {
    return TLStringAsAttributeKey(name);
  }

 private:
  friend struct TLRecordTable<TLAttribute>;
};

extern template class TLRecord<TLAttribute>;
