#include "cli/LineReader.h"

#include <cstring>

namespace cli {

LineReader::LineReader(std::unique_ptr<ByteSource> source)
    : _source(std::move(source)), _buffer(kBufferBytes) {}

// Moves the remaining bytes to the front and fills the buffer, unless the source has ended.
void LineReader::fill() {
  std::memmove(_buffer.data(), _buffer.data() + _begin, _end - _begin);
  _end -= _begin;
  _begin = 0;
  while (!_ended && _end < _buffer.size()) {
    const auto count = _source->read(_buffer.data() + _end, _buffer.size() - _end, &_error);
    _ended = count.value_or(0) == 0;
    _end += count.value_or(0);
  }
}

std::string_view LineReader::peek() {
  if (_begin != 0 || _end == 0) fill();
  return buffered();
}

std::optional<LineReader::Piece> LineReader::next() {
  size_t feed = buffered().find('\n');
  if (feed == std::string_view::npos && !_ended) {
    fill();
    feed = buffered().find('\n');
  }
  if (_begin == _end) return std::nullopt;
  const bool endsLine = feed != std::string_view::npos;
  const Piece piece{buffered().substr(0, endsLine ? feed + 1 : feed), _offset, _atLineStart};
  _begin += piece.bytes.size();
  _offset += piece.bytes.size();
  _atLineStart = endsLine;
  return piece;
}

}  // namespace cli
