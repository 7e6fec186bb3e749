#pragma once

#include <cstddef>
#include <optional>
#include <string>

namespace mcp {

// The longest message of a client. A longer one is skipped and answered with an error.
inline constexpr size_t kMaxLineBytes = size_t{1} << 20;

// Reads the lines of a descriptor, without their line feeds. One thread.
class LineInput {
 public:
  explicit LineInput(int descriptor) : _descriptor(descriptor) {}

  struct Line {
    std::string text;  // empty if it is too long
    bool tooLong = false;
  };

  // Waits for the next line; also gives a last one without a line feed. Nullopt at the end of the
  // input.
  [[nodiscard]] std::optional<Line> next();

 private:
  [[nodiscard]] bool fill();
  void takeUntil(size_t end, Line& line);

  const int _descriptor;
  std::string _buffered;
};

}  // namespace mcp
