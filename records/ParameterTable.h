#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string_view>
#include <variant>

#include "records/TLParamKeyValue.h"

// Types of parameters, by number.
enum class TLParamType : int32_t { string = 0, integer = 1, floating = 2, boolean = 3 };

// One row of the table of defaults. The alternatives of the value are in the order of the types.
struct SearchParameterMetadata {
  std::string_view key;
  std::variant<const char*, int32_t, float, bool> value;

  [[nodiscard]] constexpr TLParamType type() const {
    return static_cast<TLParamType>(value.index());
  }
};

// The named parameters of a search with their defaults. Constant; any thread.
[[nodiscard]] std::span<const SearchParameterMetadata> searchParameters();

// Null for an unknown key.
[[nodiscard]] const SearchParameterMetadata* searchParameter(std::string_view key);

// A new record with the row's key and default.
[[nodiscard]] std::shared_ptr<TLParamKeyValue> defaultRecord(const SearchParameterMetadata& row);
