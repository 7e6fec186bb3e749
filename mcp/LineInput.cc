#include "mcp/LineInput.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>

namespace mcp {

namespace {

constexpr size_t kReadBytes = size_t{64} << 10;

}  // namespace

// False at the end of the input, or if it cannot be read.
bool LineInput::fill() {
  std::array<char, kReadBytes> bytes;
  ssize_t count = -1;
  do {
    count = read(_descriptor, bytes.data(), bytes.size());
  } while (count < 0 && errno == EINTR);
  if (count > 0) _buffered.append(bytes.data(), static_cast<size_t>(count));
  return count > 0;
}

// Moves the first bytes of the buffer to the line, as long as it stays within the limit.
void LineInput::takeUntil(size_t end, Line& line) {
  line.tooLong = line.tooLong || line.text.size() + end > kMaxLineBytes;
  if (line.tooLong) {
    line.text.clear();
  } else {
    line.text.append(_buffered, 0, end);
  }
}

std::optional<LineInput::Line> LineInput::next() {
  Line line;
  bool begun = false;
  while (!_buffered.empty() || fill()) {
    begun = true;
    const size_t end = _buffered.find('\n');
    takeUntil(std::min(end, _buffered.size()), line);
    if (end != std::string::npos) {
      _buffered.erase(0, end + 1);
      return line;
    }
    _buffered.clear();
  }
  return begun ? std::optional(std::move(line)) : std::nullopt;
}

}  // namespace mcp
