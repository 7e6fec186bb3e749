#pragma once

#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Log.h"
#include "platform/Mutex.h"

namespace platform {

// A stored value with conversions. Numbers convert into each other; integers are truncated towards
// zero and clamped. Booleans are 1 and 0. A text converts to its leading decimal number, and to
// true if it starts with Y, T or a digit other than 0, ignoring case. Any other conversion gives 0,
// false or no text.
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

// The user's stored settings: a JSON file with one flat object, read at first use and rewritten as
// a whole, atomically, at each change. A missing file is an empty store. A file that cannot be read
// or does not hold a JSON object is logged, reads as empty and is never overwritten. Any thread.
class DefaultsStore {
 public:
  explicit DefaultsStore(std::string path) : _path(std::move(path)) {}
  DefaultsStore(const DefaultsStore&) = delete;
  DefaultsStore& operator=(const DefaultsStore&) = delete;

  // The process-wide store, at defaultsFilePath().
  static DefaultsStore& standard();

  // Sorted.
  [[nodiscard]] std::vector<std::string> keys();
  [[nodiscard]] std::optional<DefaultsValue> valueForKey(std::string_view key);

  // False, with a log line and the value not kept, when the file cannot be written.
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
