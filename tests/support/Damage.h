#pragma once

#include <random>
#include <string>

namespace testsupport {

// The text with at least one and at most `most` changes: bytes that are other ones, are missing, or
// stand twice.
inline std::string damaged(std::string text, size_t most, std::mt19937& random) {
  for (size_t changes = 1 + random() % most; changes > 0 && !text.empty(); --changes) {
    const size_t at = random() % text.size();
    const auto kind = random() % 3;
    if (kind == 0) text[at] = static_cast<char>(random());
    if (kind == 1) text.erase(at, random() % 9);
    if (kind == 2) text.insert(at, text.substr(random() % text.size(), random() % 40));
  }
  return text;
}

}  // namespace testsupport
