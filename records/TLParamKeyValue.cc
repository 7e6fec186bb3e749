#include "records/TLParamKeyValue.h"

#include "records/RecordFields.h"

template <>
struct TLRecordTable<TLParamKeyValue> {
  static constexpr const char* name = "TLParamKeyValue";
  static constexpr std::tuple fields{
      TLField{1, "key", &TLParamKeyValue::_key},
      TLField{2, "stringValue", &TLParamKeyValue::_stringValue},
      TLField{3, "intValue", &TLParamKeyValue::_intValue, TLParamKeyValue::kIntValueBit},
      TLField{4, "floatValue", &TLParamKeyValue::_floatValue, TLParamKeyValue::kFloatValueBit},
      TLField{5, "doubleValue", &TLParamKeyValue::_doubleValue, TLParamKeyValue::kDoubleValueBit},
      TLField{6, "boolValue", &TLParamKeyValue::_boolValue, TLParamKeyValue::kBoolValueBit},
  };
};

template class TLRecord<TLParamKeyValue>;

void TLParamKeyValue::writeTo(TLWriter& writer) const {
  if (!hasKey()) {
    platform::assertionFailed("nil != self->_key", "-[TLParamKeyValue writeTo:]", __LINE__);
  }
  TLRecord::writeTo(writer);
}
