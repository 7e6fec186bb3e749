#include "parameters/TLParamsManager.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>

namespace {

int32_t clampToInt32(int64_t value) {
  return static_cast<int32_t>(std::clamp<int64_t>(value, std::numeric_limits<int32_t>::min(),
                                                  std::numeric_limits<int32_t>::max()));
}

// A record with the stored value converted to the row's type.
std::shared_ptr<TLParamKeyValue> record(const SearchParameterMetadata& row,
                                        const platform::DefaultsValue& stored) {
  const TLString name = platform::fromUTF8(row.key);
  switch (row.type()) {
    case TLParamType::string: {
      const auto text = stored.stringValue();
      return TLParamsManager::tlParamKeyValueWithKeyStringValue(
          name, text ? std::optional(platform::fromUTF8(*text)) : std::nullopt);
    }
    case TLParamType::integer:
      return TLParamsManager::tlParamKeyValueWithKeyIntValue(name,
                                                             clampToInt32(stored.integerValue()));
    case TLParamType::floating:
      return TLParamsManager::tlParamKeyValueWithKeyFloatValue(name, stored.floatValue());
    case TLParamType::boolean:
      return TLParamsManager::tlParamKeyValueWithKeyBoolValue(name, stored.boolValue());
  }
  return nullptr;
}

// A new record with the key and the value set by `setter`; null for a null key.
template <typename Setter, typename Value>
std::shared_ptr<TLParamKeyValue> make(std::optional<TLString> key, Setter setter, Value&& value) {
  if (!key) {
    TLParamsManager::log().error("TLParamKeyValue can't be initialized with a nil key");
    return nullptr;
  }
  auto result = std::make_shared<TLParamKeyValue>();
  result->setKey(std::move(key));
  ((*result).*setter)(std::forward<Value>(value));
  return result;
}

// The longest leading decimal number, clamped to the range of an int32_t.
std::optional<int32_t> leadingInteger(std::string_view text) {
  if (text.starts_with('+') && !text.starts_with("+-")) text.remove_prefix(1);
  int32_t value = 0;
  const auto result = std::from_chars(text.data(), text.data() + text.size(), value);
  if (result.ec == std::errc::invalid_argument) return std::nullopt;
  if (result.ec == std::errc::result_out_of_range) {
    return text.starts_with('-') ? std::numeric_limits<int32_t>::min()
                                 : std::numeric_limits<int32_t>::max();
  }
  return value;
}

// For a decimal number outside the range of a double: whether it is too small rather than too
// large.
bool underflows(std::string_view number) {
  const size_t exponent = number.find_first_of("eE");
  if (exponent != std::string_view::npos) return number.substr(exponent + 1).starts_with('-');
  return number.substr(0, number.find('.')).find_first_not_of("-0") == std::string_view::npos;
}

// Rejects infinities, NaN and numbers too large for a float. A number too small for one is 0.
std::optional<float> leadingFloat(std::string_view text) {
  if (text.starts_with('+') && !text.starts_with("+-")) text.remove_prefix(1);
  const size_t first = text.find_first_of("0123456789");
  if (first == std::string_view::npos ||
      text.substr(0, first).find_first_not_of("-.") != std::string_view::npos) {
    return std::nullopt;
  }
  double value = 0;
  const auto result = std::from_chars(text.data(), text.data() + text.size(), value);
  if (result.ec == std::errc::result_out_of_range) {
    const auto length = static_cast<size_t>(result.ptr - text.data());
    return underflows(text.substr(0, length)) ? std::optional(0.0F) : std::nullopt;
  }
  if (result.ec != std::errc()) return std::nullopt;
  const auto narrow = static_cast<float>(value);
  return std::isfinite(narrow) ? std::optional(narrow) : std::nullopt;
}

// The record of one override; if its value cannot be converted to the row's type, the default.
std::shared_ptr<TLParamKeyValue> recordFromText(const SearchParameterMetadata& row,
                                                TLStringView pair, TLStringView value) {
  const TLString name = platform::fromUTF8(row.key);
  const std::string text = platform::toUTF8(value);
  const char* expected = nullptr;
  switch (row.type()) {
    case TLParamType::string:
      return TLParamsManager::tlParamKeyValueWithKeyStringValue(name, TLString(value));
    case TLParamType::integer:
      if (const auto number = leadingInteger(text)) {
        return TLParamsManager::tlParamKeyValueWithKeyIntValue(name, *number);
      }
      expected = "Integer";
      break;
    case TLParamType::floating:
      if (const auto number = leadingFloat(text)) {
        return TLParamsManager::tlParamKeyValueWithKeyFloatValue(name, *number);
      }
      expected = "Float";
      break;
    case TLParamType::boolean:
      if (text == "YES" || text == "NO") {
        return TLParamsManager::tlParamKeyValueWithKeyBoolValue(name, text == "YES");
      }
      expected = "BOOL";
      break;
  }
  TLParamsManager::log().error(
      "invalid type for override Param = {} ({} expected) [Using Default Value]",
      platform::toUTF8(pair), expected);
  return defaultRecord(row);
}

}  // namespace

const platform::Log& TLParamsManager::log() {
  static constexpr platform::Log handle(platform::kSubsystem, "TLParamsManager");
  return handle;
}

const std::unordered_map<std::string_view, SearchParameterMetadata>&
TLParamsManager::getDefaultParamDict() {
  static const auto dict = [] {
    std::unordered_map<std::string_view, SearchParameterMetadata> result;
    for (const auto& one : searchParameters()) result.emplace(one.key, one);
    return result;
  }();
  return dict;
}

bool TLParamsManager::isValidParamKey(std::string_view key) {
  return searchParameter(key) != nullptr;
}

bool TLParamsManager::isValidParamTypeWithKey(std::string_view key, TLParamType paramType) {
  const auto* row = searchParameter(key);
  return row != nullptr && row->type() == paramType;
}

std::unordered_set<std::string_view> TLParamsManager::defaultParamsSet() {
  std::unordered_set<std::string_view> result;
  for (const auto& one : searchParameters()) result.insert(one.key);
  return result;
}

std::shared_ptr<TLParameters> TLParamsManager::paramsFromFallback() {
  auto params = std::make_shared<TLParameters>();
  for (const auto& one : searchParameters()) params->addKeyvalue(defaultRecord(one));
  return params;
}

std::shared_ptr<TLParameters> TLParamsManager::getDefaultSearchParamsWithCaching(bool caching) {
  if (!caching) return loadSearchParamsFromUserDefaults();
  static const std::shared_ptr<TLParameters> cached = loadSearchParamsFromUserDefaults();
  return cached;
}

std::shared_ptr<TLParameters> TLParamsManager::loadSearchParamsFromUserDefaults(
    platform::DefaultsStore& store) {
  auto params = std::make_shared<TLParameters>();
  std::unordered_set<std::string_view> missing = defaultParamsSet();
  for (const std::string& key : store.keys()) {
    const auto* found = searchParameter(key);
    const auto stored = found != nullptr ? store.valueForKey(key) : std::nullopt;
    if (!stored) continue;
    missing.erase(found->key);
    params->addKeyvalue(record(*found, *stored));
  }
  for (const auto& one : searchParameters()) {
    if (!missing.contains(one.key)) continue;
    log().info("No override for param <{}> in UserDefaults. [Using Fallback]", one.key);
    params->addKeyvalue(defaultRecord(one));
  }
  return params;
}

void TLParamsManager::saveSearchParamsToUserDefaults(platform::DefaultsStore& store) {
  for (const auto& one : searchParameters()) {
    if (store.valueForKey(one.key)) continue;
    switch (one.type()) {
      case TLParamType::string:
        store.setString(one.key, std::get<const char*>(one.value));
        break;
      case TLParamType::integer:
        store.setInteger(one.key, std::get<int32_t>(one.value));
        break;
      case TLParamType::floating:
        store.setFloat(one.key, std::get<float>(one.value));
        break;
      case TLParamType::boolean:
        store.setBool(one.key, std::get<bool>(one.value));
        break;
    }
  }
}

std::shared_ptr<TLParameters> TLParamsManager::paramsFromString(TLStringView text) {
  auto params = std::make_shared<TLParameters>();
  for (const TLStringView pair : platform::split(text, u",")) {
    const auto pieces = platform::split(pair, u"=");
    if (pieces.size() != 2) {
      log().error("Key Value format for override param {} cannot be parsed",
                  platform::toUTF8(pair));
      return nullptr;
    }
    const std::string key = platform::toUTF8(pieces[0]);
    const auto* found = searchParameter(key);
    if (found == nullptr) {
      log().error("Override Param key: {} is not valid", key);
      continue;
    }
    params->addKeyvalue(recordFromText(*found, pair, pieces[1]));
  }
  return params;
}

std::unordered_set<TLString> TLParamsManager::paramKeySet(const TLParameters& params) {
  std::unordered_set<TLString> result;
  for (const auto& keyvalue : params.keyvalues()) {
    if (keyvalue->hasKey()) result.insert(*keyvalue->key());
  }
  return result;
}

std::shared_ptr<TLParamKeyValue> TLParamsManager::resolveParamWithDefaultKV(
    const TLParamKeyValue& defaultKV, const std::unordered_set<TLString>& overrideParamSet,
    const TLParameters& overrideParams) {
  if (defaultKV.hasKey() && overrideParamSet.contains(*defaultKV.key())) {
    for (const auto& keyvalue : overrideParams.keyvalues()) {
      if (keyvalue->key() == defaultKV.key()) return keyvalue->copyWithZone();
    }
  }
  return defaultKV.copyWithZone();
}

std::shared_ptr<TLParameters> TLParamsManager::resolveOverrides(const TLParameters& overrides,
                                                                bool withEnableParamCaching) {
  auto params = std::make_shared<TLParameters>();
  const auto overrideParamSet = paramKeySet(overrides);
  const auto defaults = getDefaultSearchParamsWithCaching(withEnableParamCaching);
  for (const auto& defaultKV : defaults->keyvalues()) {
    params->addKeyvalue(resolveParamWithDefaultKV(*defaultKV, overrideParamSet, overrides));
  }
  return params;
}

std::shared_ptr<TLParamKeyValue> TLParamsManager::tlParamKeyValueWithKeyStringValue(
    std::optional<TLString> key, std::optional<TLString> stringValue) {
  return make(std::move(key), &TLParamKeyValue::setStringValue, std::move(stringValue));
}

std::shared_ptr<TLParamKeyValue> TLParamsManager::tlParamKeyValueWithKeyIntValue(
    std::optional<TLString> key, int32_t intValue) {
  return make(std::move(key), &TLParamKeyValue::setIntValue, int64_t{intValue});
}

std::shared_ptr<TLParamKeyValue> TLParamsManager::tlParamKeyValueWithKeyFloatValue(
    std::optional<TLString> key, float floatValue) {
  return make(std::move(key), &TLParamKeyValue::setFloatValue, floatValue);
}

std::shared_ptr<TLParamKeyValue> TLParamsManager::tlParamKeyValueWithKeyBoolValue(
    std::optional<TLString> key, bool boolValue) {
  return make(std::move(key), &TLParamKeyValue::setBoolValue, boolValue);
}

std::shared_ptr<TLParameters> TLParamsManager::paramFromKeyValues(
    std::vector<std::shared_ptr<TLParamKeyValue>> keyValues) {
  auto params = std::make_shared<TLParameters>();
  params->setKeyvalues(std::move(keyValues));
  return params;
}
