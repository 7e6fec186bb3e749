#include "platform/DefaultsStore.h"

#include <cerrno>
#include <charconv>
#include <cmath>
#include <limits>
#include <type_traits>

#include "platform/Files.h"
#include "platform/Paths.h"

namespace platform {

namespace {

// A hand-edited settings file is far smaller; a larger one is treated as unreadable.
constexpr size_t kMaxFileBytes = size_t{1} << 20;

// The leading decimal number of a text, after any white space; 0 if there is none.
template <typename Number>
Number leadingNumber(std::string_view text) {
  const size_t start = text.find_first_not_of(" \t\n\r");
  text.remove_prefix(start == std::string_view::npos ? text.size() : start);
  if (text.starts_with('+')) text.remove_prefix(1);
  Number value = 0;
  const auto result = std::from_chars(text.data(), text.data() + text.size(), value);
  if constexpr (std::is_integral_v<Number>) {
    if (result.ec == std::errc::result_out_of_range) {
      return text.starts_with('-') ? std::numeric_limits<Number>::min()
                                   : std::numeric_limits<Number>::max();
    }
  } else if (!std::isfinite(value)) {
    return 0;
  }
  return result.ec == std::errc() ? value : 0;
}

bool textIsTrue(std::string_view text) {
  const size_t start = text.find_first_not_of(" \t\n\r+-0");
  return start != std::string_view::npos &&
         std::string_view("YyTt123456789").find(text[start]) != std::string_view::npos;
}

int64_t clampToInteger(double value) {
  if (std::isnan(value)) return 0;
  if (value >= 0x1p63) return std::numeric_limits<int64_t>::max();
  if (value < -0x1p63) return std::numeric_limits<int64_t>::min();
  return static_cast<int64_t>(value);
}

}  // namespace

int64_t DefaultsValue::integerValue() const {
  if (_value.is_boolean()) return _value.get<bool>() ? 1 : 0;
  if (_value.is_number_unsigned()) {
    const auto value = _value.get<uint64_t>();
    constexpr auto maximum = std::numeric_limits<int64_t>::max();
    return value > static_cast<uint64_t>(maximum) ? maximum : static_cast<int64_t>(value);
  }
  if (_value.is_number_integer()) return _value.get<int64_t>();
  if (_value.is_number_float()) return clampToInteger(_value.get<double>());
  if (_value.is_string()) return leadingNumber<int64_t>(_value.get_ref<const std::string&>());
  return 0;
}

float DefaultsValue::floatValue() const {
  if (_value.is_boolean()) return _value.get<bool>() ? 1.0F : 0.0F;
  if (_value.is_number()) return _value.get<float>();
  if (_value.is_string()) return leadingNumber<float>(_value.get_ref<const std::string&>());
  return 0;
}

bool DefaultsValue::boolValue() const {
  if (_value.is_boolean()) return _value.get<bool>();
  if (_value.is_number()) return _value.get<double>() != 0;
  if (_value.is_string()) return textIsTrue(_value.get_ref<const std::string&>());
  return false;
}

std::optional<std::string> DefaultsValue::stringValue() const {
  if (!_value.is_string()) return std::nullopt;
  return _value.get<std::string>();
}

const Log& DefaultsStore::log() {
  static constexpr Log handle(kSubsystem, "DefaultsStore");
  return handle;
}

DefaultsStore& DefaultsStore::standard() {
  static DefaultsStore store(defaultsFilePath());
  return store;
}

void DefaultsStore::load() {
  if (_loaded) return;
  _loaded = true;
  if (!fileExists(_path)) return;
  std::optional<TLError> error;
  const auto bytes = readFile(_path, kMaxFileBytes, &error);
  auto values = bytes ? nlohmann::json::parse(*bytes, nullptr, false) : nlohmann::json();
  _readable = bytes.has_value() && values.is_object();
  if (_readable) {
    _values = std::move(values);
  } else if (!bytes) {
    log().error("Cannot read the defaults file {}: {}. Using no defaults.", _path,
                printable(error));
  } else {
    log().error("The defaults file {} is not a JSON object. Using no defaults.", _path);
  }
}

std::vector<std::string> DefaultsStore::keys() {
  const MutexLock lock(_mutex);
  load();
  std::vector<std::string> result;
  result.reserve(_values.size());
  for (const auto& item : _values.items()) result.push_back(item.key());
  return result;
}

std::optional<DefaultsValue> DefaultsStore::valueForKey(std::string_view key) {
  const MutexLock lock(_mutex);
  load();
  const auto found = _values.find(key);
  if (found == _values.end()) return std::nullopt;
  return DefaultsValue(*found);
}

bool DefaultsStore::set(std::string_view key, nlohmann::json value) {
  const MutexLock lock(_mutex);
  load();
  if (!_readable) {
    log().error("Not writing {}: the defaults file {} is unreadable and stays as it is.", key,
                _path);
    return false;
  }
  nlohmann::json changed = _values;
  changed[std::string(key)] = std::move(value);
  std::optional<TLError> error;
  const auto text = changed.dump(2, ' ', false, nlohmann::json::error_handler_t::replace) + '\n';
  if (!writeFileAtomically(_path, text, &error)) {
    log().error("Cannot write the defaults file {}: {}", _path, printable(error));
    return false;
  }
  _values = std::move(changed);
  return true;
}

bool DefaultsStore::setString(std::string_view key, std::string_view value) {
  return set(key, value);
}

bool DefaultsStore::setInteger(std::string_view key, int64_t value) {
  return set(key, value);
}

bool DefaultsStore::setFloat(std::string_view key, float value) {
  return set(key, value);
}

bool DefaultsStore::setBool(std::string_view key, bool value) {
  return set(key, value);
}

}  // namespace platform
