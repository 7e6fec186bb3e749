#pragma once

#include <optional>
#include <string_view>

#include "platform/Log.h"
#include "records/RecordAccessors.h"
#include "records/TLCodable.h"
#include "records/TLParamKeyValue.h"

// A list of parameters: a query's overrides, or the complete set that a search reads. A complete
// set may be shared between searches; it is not changed then, and reads from several threads are
// safe.
class TLParameters final : public TLRecord<TLParameters> {
 public:
  TL_RECORD_RECORDS(TLParamKeyValue, keyvalues, Keyvalues, keyvalue, Keyvalue)

  // Keys of parameters are ASCII and given as such; they are compared with the records' keys
  // without conversion.

  // The first record with the key, in list order, or null.
  [[nodiscard]] std::shared_ptr<TLParamKeyValue> parameterKeyValueForKey(
      std::string_view key) const;

  // The built-in default of the key, or null. The given parameters play no part.
  [[nodiscard]] static std::shared_ptr<TLParamKeyValue> fallbackKeyValueForKey(
      std::string_view key, const std::shared_ptr<TLParameters>& fallbackParameters);

  // The own record, else the default, else null.
  [[nodiscard]] std::shared_ptr<TLParamKeyValue> kvForKey(
      std::string_view key, const std::shared_ptr<TLParameters>& fallbackParameters) const;

  // Typed reads. The key must be in the table of defaults with the type that is read, and the
  // record must have the value of that type; otherwise an error is logged and the result is null, 0
  // or false. A record of the wrong kind hides the default.
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
