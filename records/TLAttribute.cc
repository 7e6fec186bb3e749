#include "records/TLAttribute.h"

#include "records/RecordFields.h"

template <>
struct TLRecordTable<TLAttribute> {
  static constexpr const char* name = "TLAttribute";
  static constexpr std::tuple fields{
      TLField{TLAttribute::kKeyNumber, "key", &TLAttribute::_key, TLAttribute::kKeyBit},
      TLField{2, "customKey", &TLAttribute::_customKey},
      TLField{3, "stringValue", &TLAttribute::_stringValue},
      TLField{4, "intValue", &TLAttribute::_intValue, TLAttribute::kIntValueBit},
      TLField{5, "floatValue", &TLAttribute::_floatValue, TLAttribute::kFloatValueBit},
      TLField{TLAttribute::kDoubleValueNumber, "doubleValue", &TLAttribute::_doubleValue,
              TLAttribute::kDoubleValueBit},
      TLField{7, "boolValue", &TLAttribute::_boolValue, TLAttribute::kBoolValueBit},
      TLField{8, "personValue", &TLAttribute::_personValue},
      TLField{9, "bytesValue", &TLAttribute::_bytesValue},
      TLField{10, "stringValues", &TLAttribute::_stringValues},
      TLField{11, "personValues", &TLAttribute::_personValues},
  };
};

template class TLRecord<TLAttribute>;
