#include "rpc/Marshal.h"

#include <type_traits>
#include <utility>
#include <variant>

#include "platform/Assert.h"
#include "platform/Text.h"

namespace rpc {

namespace {

// Reads the values of a call one after another. Hostile input may end any read early.
class ArgumentReader {
 public:
  explicit ArgumentReader(sd_bus_message* message) : _message(message) {}

  [[nodiscard]] std::optional<std::vector<Arguments::Value>> read(std::string_view signature) {
    std::vector<Arguments::Value> values;
    while (!signature.empty()) {
      const std::string_view type = firstType(signature);
      signature.remove_prefix(type.size());
      auto value = readValue(type);
      if (!value) return std::nullopt;
      values.push_back(std::move(*value));
    }
    return values;
  }

 private:
  using Value = Arguments::Value;

  // The first complete type of a signature, among those that interfaces use.
  static std::string_view firstType(std::string_view signature) {
    return signature.substr(0, signature.find_first_not_of('a') + 1);
  }

  std::optional<Value> readValue(std::string_view type) {
    if (type == "s") return text();
    if (type == "b") {
      int value = 0;
      return basic('b', &value) ? std::optional<Value>(value != 0) : std::nullopt;
    }
    if (type == "x") return number<int64_t>('x');
    if (type == "t") return number<uint64_t>('t');
    if (type == "ay") return bytes();
    if (type == "as") return array("s", [this] { return text(); });
    TL_ASSERT(type == "aay");
    return array("ay", [this] { return bytes(); });
  }

  bool basic(char type, void* value) {
    return sd_bus_message_read_basic(_message, type, value) > 0;
  }
  template <typename T>
  std::optional<Value> number(char type) {
    T value = 0;
    return basic(type, &value) ? std::optional<Value>(value) : std::nullopt;
  }
  std::optional<std::string_view> text() {
    const char* value = nullptr;
    if (!basic('s', &value)) return std::nullopt;
    return value;
  }
  std::optional<std::string_view> bytes() {
    const void* data = nullptr;
    size_t size = 0;
    if (sd_bus_message_read_array(_message, 'y', &data, &size) < 0) return std::nullopt;
    return size == 0 ? std::string_view() : std::string_view(static_cast<const char*>(data), size);
  }
  template <typename Read>
  std::optional<Value> array(const char* contents, const Read& readElement) {
    std::vector<std::string_view> values;
    if (sd_bus_message_enter_container(_message, 'a', contents) < 0) return std::nullopt;
    for (;;) {
      const int atEnd = sd_bus_message_at_end(_message, 0);
      if (atEnd < 0 || values.size() > kMaxArrayElements) return std::nullopt;
      if (atEnd > 0) break;
      const auto value = readElement();
      if (!value) return std::nullopt;
      values.push_back(*value);
    }
    if (sd_bus_message_exit_container(_message) < 0) return std::nullopt;
    return values;
  }

  sd_bus_message* _message;
};

// D-Bus strings contain no NUL and only valid UTF-8.
std::string carriedText(const std::string& text) {
  std::string carried = platform::toUTF8(platform::fromUTF8(text));
  for (size_t at = 0; (at = carried.find('\0', at)) != std::string::npos;) {
    carried.replace(at, 1, "\uFFFD");
  }
  return carried;
}

// Appends one value; the result is negative if D-Bus cannot carry it.
struct Append {
  sd_bus_message* message;

  int operator()(const std::string& text) const {
    return sd_bus_message_append_basic(message, 's', carriedText(text).c_str());
  }
  int operator()(bool value) const {
    const int number = value ? 1 : 0;
    return sd_bus_message_append_basic(message, 'b', &number);
  }
  int operator()(const Bytes& value) const { return appendBytes(value.bytes); }
  int operator()(const BytesArray& values) const {
    int result = sd_bus_message_open_container(message, 'a', "ay");
    for (size_t i = 0; i < values.size() && result >= 0; ++i) result = appendBytes(values[i]);
    return result < 0 ? result : sd_bus_message_close_container(message);
  }
  int operator()(const Dictionary& values) const {
    int result = sd_bus_message_open_container(message, 'a', "{sv}");
    for (size_t i = 0; i < values.size() && result >= 0; ++i) result = appendEntry(values[i]);
    return result < 0 ? result : sd_bus_message_close_container(message);
  }
  int operator()(const TextRows& rows) const {
    int result = sd_bus_message_open_container(message, 'a', "(sss)");
    for (size_t i = 0; i < rows.size() && result >= 0; ++i) {
      const auto& row = rows[i];
      result = sd_bus_message_append(message, "(sss)", carriedText(row[0]).c_str(),
                                     carriedText(row[1]).c_str(), carriedText(row[2]).c_str());
    }
    return result < 0 ? result : sd_bus_message_close_container(message);
  }

 private:
  int appendBytes(const std::string& bytes) const {
    return sd_bus_message_append_array(message, 'y', bytes.data(), bytes.size());
  }
  int appendEntry(const Dictionary::value_type& entry) const {
    return std::visit(
        [&](auto number) {
          using T = decltype(number);
          const char* type = std::is_same_v<T, double>    ? "d"
                             : std::is_same_v<T, int64_t> ? "x"
                                                          : "t";
          return sd_bus_message_append(message, "{sv}", carriedText(entry.first).c_str(), type,
                                       number);
        },
        entry.second);
  }
};

}  // namespace

std::optional<std::vector<Arguments::Value>> readArguments(sd_bus_message* message,
                                                           std::string_view signature) {
  return ArgumentReader(message).read(signature);
}

size_t sizeOf(const Values& values) {
  size_t bytes = 0;
  for (const Value& value : values) {
    if (const auto* array = std::get_if<BytesArray>(&value)) {
      for (const std::string& element : *array) bytes += element.size();
    } else if (const auto* text = std::get_if<std::string>(&value)) {
      bytes += text->size();
    } else if (const auto* single = std::get_if<Bytes>(&value)) {
      bytes += single->bytes.size();
    } else if (const auto* rows = std::get_if<TextRows>(&value)) {
      for (const auto& row : *rows) bytes += row[0].size() + row[1].size() + row[2].size();
    }
  }
  return bytes;
}

int buildReturn(sd_bus_message* call, const Values& values, sd_bus_message** reply) {
  int result = sd_bus_message_new_method_return(call, reply);
  for (size_t i = 0; i < values.size() && result >= 0; ++i) {
    result = std::visit(Append{*reply}, values[i]);
  }
  return result;
}

int buildFailure(sd_bus_message* call, const char* name, const std::string& message,
                 sd_bus_message** reply) {
  const std::string text = carriedText(message);
  const sd_bus_error failure{name, text.c_str(), 0};
  return sd_bus_message_new_method_error(call, reply, &failure);
}

int buildError(sd_bus_message* call, const TLError& error, sd_bus_message** reply) {
  const int result = buildFailure(call, kErrorName, error.message, reply);
  return result < 0
             ? result
             : sd_bus_message_append(*reply, "si", carriedText(error.domain).c_str(), error.code);
}

sd_bus_message* standInFor(sd_bus* bus, sd_bus_message* call) {
  uint64_t cookie = 0;
  sd_bus_message* made = nullptr;
  const bool good =
      sd_bus_message_get_cookie(call, &cookie) >= 0 &&
      sd_bus_message_new_method_call(bus, &made, nullptr, "/", nullptr, "Call") >= 0 &&
      sd_bus_message_set_expect_reply(made, sd_bus_message_get_expect_reply(call)) >= 0 &&
      sd_bus_message_seal(made, cookie, 0) >= 0;
  return good ? made : sd_bus_message_unref(made);
}

}  // namespace rpc
