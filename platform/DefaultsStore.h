#pragma once

#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Log.h"
#include "platform/Mutex.h"

namespace platform {

// A value of the store, read as whatever the reader needs. Numbers convert into each other, with
// integers cut towards zero and clamped; truth values are 1 and 0; a text gives its leading decimal
// number, and is true when it starts with Y, T or a digit other than 0, in either case. Anything
// else gives 0, false or no text.
class DefaultsValue {
 public:
  explicit DefaultsValue(nlohmann::json value) : _value(std::move(value)) {}

  [[nodiscard]] int64_t integerValue() const;
  [[nodiscard]] float floatValue() const;
  [[nodiscard]] bool boolValue() const;
  // Texts only.
  [[nodiscard]] std::optional<std::string> stringValue() const;

 private:
  nlohmann::json _value;
};

// The user's stored settings: one JSON file with one flat object, read at the first use and written
// as a whole, atomically, at each change. A missing file is an empty store. A file that cannot be
// read or is no JSON object is logged, reads as empty and is never overwritten. Any thread.
class DefaultsStore {
 public:
  explicit DefaultsStore(std::string path) : _path(std::move(path)) {}
  DefaultsStore(const DefaultsStore&) = delete;
  DefaultsStore& operator=(const DefaultsStore&) = delete;

  // The store of the process, at defaultsFilePath().
  static DefaultsStore& standard();

  // Sorted.
  [[nodiscard]] std::vector<std::string> keys();
  [[nodiscard]] std::optional<DefaultsValue> valueForKey(std::string_view key);

  // False, with an error in the log, when the file could not be written; the value is not kept
  // then.
  bool setString(std::string_view key, std::string_view value);
  bool setInteger(std::string_view key, int64_t value);
  bool setFloat(std::string_view key, float value);
  bool setBool(std::string_view key, bool value);

  static const Log& log();

 private:
  void load() TL_REQUIRES(_mutex);
  bool set(std::string_view key, nlohmann::json value);

  const std::string _path;
  Mutex _mutex;
  bool _loaded TL_GUARDED_BY(_mutex) = false;
  bool _readable TL_GUARDED_BY(_mutex) = true;
  nlohmann::json _values TL_GUARDED_BY(_mutex) = nlohmann::json::object();
};

}  // namespace platform
