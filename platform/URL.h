#pragma once

#include <functional>
#include <optional>
#include <string>

// An absolute URL that has passed strict parsing by RFC 3986. Immutable.
class TLURL {
 public:
  // Nullopt if the text is not a valid URI with a scheme; nothing is escaped or repaired.
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
