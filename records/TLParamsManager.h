#pragma once

#include <bit>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <variant>
#include <vector>

#include "platform/DefaultsStore.h"
#include "platform/Log.h"
#include "platform/Text.h"
#include "records/TLParameters.h"

// Types of parameters, by number.
enum class TLParamType : int32_t { string = 0, integer = 1, floating = 2, boolean = 3 };

// One row of the table of defaults. The alternatives of the value stand in the order of the types.
struct SearchParameterMetadata {
  std::string_view key;
  std::variant<const char*, int32_t, float, bool> value;

  [[nodiscard]] constexpr TLParamType type() const {
    return static_cast<TLParamType>(value.index());
  }
};

// The named parameters of a search and where their values come from: the table of defaults, over it
// the user defaults store, over both the overrides of a query. No instances. Any thread.
class TLParamsManager {
 public:
  TLParamsManager() = delete;

  // The rows of the table of defaults by key.
  [[nodiscard]] static const std::unordered_map<std::string_view, SearchParameterMetadata>&
  getDefaultParamDict();

  [[nodiscard]] static bool isValidParamKey(std::string_view key);
  [[nodiscard]] static bool isValidParamTypeWithKey(std::string_view key, TLParamType paramType);
  [[nodiscard]] static std::unordered_set<std::string_view> defaultParamsSet();

  // A new set with the table's defaults, in the order of the table.
  [[nodiscard]] static std::shared_ptr<TLParameters> paramsFromFallback();

  // The defaults as resolved against the user defaults store. With caching the set is made once for
  // the process and never refreshed; it is shared between all callers and must not be changed.
  [[nodiscard]] static std::shared_ptr<TLParameters> getDefaultSearchParamsWithCaching(
      bool caching);

  // A new set with exactly one record per row of the table.
  [[nodiscard]] static std::shared_ptr<TLParameters> loadSearchParamsFromUserDefaults(
      platform::DefaultsStore& store = platform::DefaultsStore::standard());

  // Writes the table's default under each key that the store lacks. A failed write is logged by the
  // store.
  static void saveSearchParamsToUserDefaults(
      platform::DefaultsStore& store = platform::DefaultsStore::standard());

  // Override text: "key=value" pairs separated by ",", no blanks trimmed, no quoting. Null when a
  // part is no such pair; a pair with an unknown key is dropped; a value that does not read as the
  // parameter's type gives the table's default.
  [[nodiscard]] static std::shared_ptr<TLParameters> paramsFromString(TLStringView text);

  [[nodiscard]] static std::unordered_set<TLString> paramKeySet(const TLParameters& params);

  // A copy of the first override with the key of the default, else a copy of the default.
  [[nodiscard]] static std::shared_ptr<TLParamKeyValue> resolveParamWithDefaultKV(
      const TLParamKeyValue& defaultKV, const std::unordered_set<TLString>& overrideParamSet,
      const TLParameters& overrideParams);

  // A new complete set: the defaults with the overrides in their place. Overrides with keys outside
  // the table are dropped.
  [[nodiscard]] static std::shared_ptr<TLParameters> resolveOverrides(const TLParameters& overrides,
                                                                      bool withEnableParamCaching);

  // One record each; null, with an error in the log, for a null key.
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
