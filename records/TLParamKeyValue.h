#pragma once

#include "records/RecordAccessors.h"
#include "records/TLCodable.h"

// One named parameter. Normally only one of the values is set, but all may be, as in an attribute.
class TLParamKeyValue final : public TLRecord<TLParamKeyValue> {
 public:
  // Required when writing, not when reading.
  TL_RECORD_STRING(key, Key)
  TL_RECORD_STRING(stringValue, StringValue)
  TL_RECORD_SCALAR(int64_t, intValue, IntValue, 2)
  TL_RECORD_SCALAR(float, floatValue, FloatValue, 4)
  // Part of the format; no parameter uses it.
  TL_RECORD_SCALAR(double, doubleValue, DoubleValue, 1)
  TL_RECORD_SCALAR(bool, boolValue, BoolValue, 8)

  // A null key is a programming error and ends the process.
  void writeTo(TLWriter& writer) const override;

 private:
  friend struct TLRecordTable<TLParamKeyValue>;
};

extern template class TLRecord<TLParamKeyValue>;
