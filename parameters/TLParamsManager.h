#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "platform/DefaultsStore.h"
#include "platform/Log.h"
#include "platform/Text.h"
#include "records/ParameterTable.h"
#include "records/TLParameters.h"

// Resolves the named parameters of a search from three sources: the table of defaults, overridden
// by the user defaults store, overridden by the query. No instances. Any thread.
class TLParamsManager {
 public:
  TLParamsManager() = delete;

  // The table of defaults, by key.
  [[nodiscard]] static const std::unordered_map<std::string_view, SearchParameterMetadata>&
  getDefaultParamDict();

  [[nodiscard]] static bool isValidParamKey(std::string_view key);
  [[nodiscard]] static bool isValidParamTypeWithKey(std::string_view key, TLParamType paramType);
  [[nodiscard]] static std::unordered_set<std::string_view> defaultParamsSet();

  // A new set with the defaults, in the order of the table.
  [[nodiscard]] static std::shared_ptr<TLParameters> paramsFromFallback();

  // The defaults as overridden by the user defaults store. With caching the set is created once per
  // process and never refreshed; all callers share it and must not change it.
  [[nodiscard]] static std::shared_ptr<TLParameters> getDefaultSearchParamsWithCaching(
      bool caching);

  // A new set with exactly one record per row of the table.
  [[nodiscard]] static std::shared_ptr<TLParameters> loadSearchParamsFromUserDefaults(
      platform::DefaultsStore& store = platform::DefaultsStore::standard());

  // Writes the default of each key that the store lacks. The store logs failed writes.
  static void saveSearchParamsToUserDefaults(
      platform::DefaultsStore& store = platform::DefaultsStore::standard());

  // Parses override text: "key=value" pairs separated by ",", without trimming or quoting. Null if
  // a part is not a pair. A pair with an unknown key is dropped; a value that cannot be converted
  // to the parameter's type is replaced by the default.
  [[nodiscard]] static std::shared_ptr<TLParameters> paramsFromString(TLStringView text);

  [[nodiscard]] static std::unordered_set<TLString> paramKeySet(const TLParameters& params);

  // A copy of the first override with the key of the default, or else of the default.
  [[nodiscard]] static std::shared_ptr<TLParamKeyValue> resolveParamWithDefaultKV(
      const TLParamKeyValue& defaultKV, const std::unordered_set<TLString>& overrideParamSet,
      const TLParameters& overrideParams);

  // A new complete set: the defaults, replaced by the overrides. Overrides with unknown keys are
  // dropped.
  [[nodiscard]] static std::shared_ptr<TLParameters> resolveOverrides(const TLParameters& overrides,
                                                                      bool withEnableParamCaching);

  // A single record; null, with an error in the log, for a null key.
  [[nodiscard]] static std::shared_ptr<TLParamKeyValue> tlParamKeyValueWithKeyStringValue(
      std::optional<TLString> key, std::optional<TLString> stringValue);
  [[nodiscard]] static std::shared_ptr<TLParamKeyValue> tlParamKeyValueWithKeyIntValue(
      std::optional<TLString> key, int32_t intValue);
  [[nodiscard]] static std::shared_ptr<TLParamKeyValue> tlParamKeyValueWithKeyFloatValue(
      std::optional<TLString> key, float floatValue);
  [[nodiscard]] static std::shared_ptr<TLParamKeyValue> tlParamKeyValueWithKeyBoolValue(
      std::optional<TLString> key, bool boolValue);

  [[nodiscard]] static std::shared_ptr<TLParameters> paramFromKeyValues(
      std::vector<std::shared_ptr<TLParamKeyValue>> keyValues);

  static const platform::Log& log();
};
