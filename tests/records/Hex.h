#pragma once

#include <fmt/format.h>

#include <string>
#include <string_view>

namespace testsupport {

// "08 0d" for two bytes.
inline std::string hex(std::string_view bytes) {
  std::string text;
  for (const char byte : bytes) {
    text += fmt::format("{}{:02x}", text.empty() ? "" : " ", static_cast<unsigned char>(byte));
  }
  return text;
}

inline std::string bytes(std::string_view hexText) {
  std::string result;
  for (size_t i = 0; i < hexText.size(); i += 3) {
    result += static_cast<char>(std::stoi(std::string(hexText.substr(i, 2)), nullptr, 16));
  }
  return result;
}

}  // namespace testsupport
