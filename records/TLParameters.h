#pragma once

#include <optional>
#include <string_view>

#include "platform/Log.h"
#include "records/RecordAccessors.h"
#include "records/TLCodable.h"
#include "records/TLParamKeyValue.h"

// A list of parameters: the overrides of a query, or the complete set that a search reads. A
// complete set may be shared between searches; it is then not changed and may be read on several
// threads.
class TLParameters final : public TLRecord<TLParameters> {
 public:
  TL_RECORD_RECORDS(TLParamKeyValue, keyvalues, Keyvalues, keyvalue, Keyvalue)

  // Parameter keys are ASCII, so they are compared with the keys of records without conversion.

  // The first record with the key, in list order, or null.
  [[nodiscard]] std::shared_ptr<TLParamKeyValue> parameterKeyValueForKey(
      std::string_view key) const;

  // The built-in default of the key, or null. Ignores the given parameters.
  [[nodiscard]] static std::shared_ptr<TLParamKeyValue> fallbackKeyValueForKey(
      std::string_view key, const std::shared_ptr<TLParameters>& fallbackParameters);

  // The own record, or else the default, or else null.
  [[nodiscard]] std::shared_ptr<TLParamKeyValue> kvForKey(
      std::string_view key, const std::shared_ptr<TLParameters>& fallbackParameters) const;

  // Typed reads. The key must be in the table of defaults with this type, and the record must have
  // a value of this type; otherwise an error is logged and the result is null, 0 or false. A record
  // of the wrong type hides the default.
  [[nodiscard]] std::optional<TLString> stringValueForKey(
      std::string_view key,
      const std::shared_ptr<TLParameters>& fallbackParameters = nullptr) const;
  [[nodiscard]] int64_t intValueForKey(
      std::string_view key,
      const std::shared_ptr<TLParameters>& fallbackParameters = nullptr) const;
  [[nodiscard]] std::optional<float> floatValueForKey(
      std::string_view key,
      const std::shared_ptr<TLParameters>& fallbackParameters = nullptr) const;
  [[nodiscard]] bool boolValueForKey(
      std::string_view key,
      const std::shared_ptr<TLParameters>& fallbackParameters = nullptr) const;

  static const platform::Log& log();

 private:
  friend struct TLRecordTable<TLParameters>;
};

extern template class TLRecord<TLParameters>;
