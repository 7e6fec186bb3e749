#include "records/TLParameters.h"

#include <algorithm>

#include "records/ParameterTable.h"
#include "records/RecordFields.h"

template <>
struct TLRecordTable<TLParameters> {
  static constexpr const char* name = "TLParameters";
  static constexpr std::tuple fields{TLField{1, "keyvalue", &TLParameters::_keyvalues}};
};

template class TLRecord<TLParameters>;

namespace {

bool equalsASCII(TLStringView text, std::string_view ascii) {
  return text.size() == ascii.size() &&
         std::equal(ascii.begin(), ascii.end(), text.begin(), [](char a, char16_t b) {
           return static_cast<char16_t>(static_cast<unsigned char>(a)) == b;
         });
}

// Logs a read of a key with the wrong type, or of a key that is in no table.
bool badAccess(std::string_view key, TLParamType type, const char* typeName) {
  const auto* row = searchParameter(key);
  if (row != nullptr && row->type() == type) return false;
  TLParameters::log().error("Param: <{}> is not expected to be of {} type. Bad Access!", key,
                            typeName);
  return true;
}

}  // namespace

const platform::Log& TLParameters::log() {
  static constexpr platform::Log handle(platform::kSubsystem, "TLParameters");
  return handle;
}

std::shared_ptr<TLParamKeyValue> TLParameters::parameterKeyValueForKey(std::string_view key) const {
  for (const auto& keyvalue : _keyvalues) {
    if (keyvalue->hasKey() && equalsASCII(*keyvalue->key(), key)) return keyvalue;
  }
  return nullptr;
}

std::shared_ptr<TLParamKeyValue> TLParameters::fallbackKeyValueForKey(
    std::string_view key, const std::shared_ptr<TLParameters>&) {
  log().error("Using shared Fallback params to get value for Param: <{}>", key);
  const auto* row = searchParameter(key);
  return row != nullptr ? defaultRecord(*row) : nullptr;
}

std::shared_ptr<TLParamKeyValue> TLParameters::kvForKey(
    std::string_view key, const std::shared_ptr<TLParameters>& fallbackParameters) const {
  auto keyvalue = parameterKeyValueForKey(key);
  if (keyvalue) return keyvalue;
  log().error("Param: <{}> not found in param. Using Fallback", key);
  keyvalue = fallbackKeyValueForKey(key, fallbackParameters);
  if (!keyvalue) log().error("Param: <{}> not found in Fallback. Error!", key);
  return keyvalue;
}

std::optional<TLString> TLParameters::stringValueForKey(
    std::string_view key, const std::shared_ptr<TLParameters>& fallbackParameters) const {
  if (badAccess(key, TLParamType::string, "String")) return std::nullopt;
  const auto keyvalue = kvForKey(key, fallbackParameters);
  if (keyvalue && keyvalue->hasStringValue()) return keyvalue->stringValue();
  log().error("StringValue for param: {} is Nil!", key);
  return std::nullopt;
}

int64_t TLParameters::intValueForKey(
    std::string_view key, const std::shared_ptr<TLParameters>& fallbackParameters) const {
  if (badAccess(key, TLParamType::integer, "Integer")) return 0;
  const auto keyvalue = kvForKey(key, fallbackParameters);
  if (keyvalue && keyvalue->hasIntValue()) return keyvalue->intValue();
  log().error("IntValue for param: {} is Nil!!", key);
  return 0;
}

std::optional<float> TLParameters::floatValueForKey(
    std::string_view key, const std::shared_ptr<TLParameters>& fallbackParameters) const {
  if (badAccess(key, TLParamType::floating, "Float")) return std::nullopt;
  const auto keyvalue = kvForKey(key, fallbackParameters);
  if (keyvalue && keyvalue->hasFloatValue()) return keyvalue->floatValue();
  log().error("FloatValue for param: {} is Nil!", key);
  return std::nullopt;
}

bool TLParameters::boolValueForKey(std::string_view key,
                                   const std::shared_ptr<TLParameters>& fallbackParameters) const {
  if (badAccess(key, TLParamType::boolean, "Bool")) return false;
  const auto keyvalue = kvForKey(key, fallbackParameters);
  if (keyvalue && keyvalue->hasBoolValue()) return keyvalue->boolValue();
  log().error("BoolValue for param: {} is Nil!", key);
  return false;
}
