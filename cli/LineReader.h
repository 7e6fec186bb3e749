#pragma once

#include <memory>
#include <optional>
#include <string_view>
#include <vector>

#include "cli/ByteSource.h"

namespace cli {

// Reads a byte source line by line through a fixed buffer. One thread.
class LineReader {
 public:
  static constexpr size_t kBufferBytes = size_t{256} << 10;

  explicit LineReader(std::unique_ptr<ByteSource> source);

  // A line with its line feed, or a piece of a line that is longer than the buffer.
  struct Piece {
    std::string_view bytes;
    uint64_t offset;  // of the first byte
    bool startsLine;
  };

  // Valid until the next call. Nullopt at the end and after a failure; see `error`.
  [[nodiscard]] std::optional<Piece> next();

  // The next bytes, up to the size of the buffer, without consuming them.
  [[nodiscard]] std::string_view peek();

  [[nodiscard]] const std::optional<TLError>& error() const { return _error; }
  [[nodiscard]] const ByteSource& source() const { return *_source; }

 private:
  void fill();
  [[nodiscard]] std::string_view buffered() const {
    return {_buffer.data() + _begin, _end - _begin};
  }

  const std::unique_ptr<ByteSource> _source;
  std::vector<char> _buffer;
  size_t _begin = 0;
  size_t _end = 0;
  uint64_t _offset = 0;
  bool _atLineStart = true;
  bool _ended = false;
  std::optional<TLError> _error;
};

}  // namespace cli
