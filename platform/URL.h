#pragma once

#include <functional>
#include <optional>
#include <string>

// A URL that has passed a strict parse by RFC 3986, kept as its absolute string. Immutable.
class TLURL {
 public:
  // None for a text that is no valid URI with a scheme; nothing is escaped or mended.
  [[nodiscard]] static std::optional<TLURL> parse(std::string text);

  [[nodiscard]] const std::string& absoluteString() const { return _text; }

  bool operator==(const TLURL&) const = default;

 private:
  explicit TLURL(std::string text) : _text(std::move(text)) {}

  std::string _text;
};

template <>
struct std::hash<TLURL> {
  size_t operator()(const TLURL& url) const noexcept {
    return std::hash<std::string>()(url.absoluteString());
  }
};
