#include "rpc/Inlet.h"

#include <algorithm>
#include <utility>

namespace rpc {

RequestBudget& RequestBudget::shared() {
  static auto* instance = new RequestBudget;  // outlives every connection
  return *instance;
}

bool RequestBudget::take(size_t bytes, Resume resume) {
  platform::MutexLock lock(_mutex);
  const size_t most = bytes <= kSmallMessageBytes ? 2 * kMaxWaitingBytes : kMaxWaitingBytes;
  if (_taken != 0 && _taken + bytes > most) {
    _waiting.push_back(std::move(resume));
    return false;
  }
  _taken += bytes;
  return true;
}

void RequestBudget::give(size_t bytes) {
  if (bytes == 0) return;
  std::vector<Resume> waiting;
  {
    platform::MutexLock lock(_mutex);
    _taken -= bytes;
    waiting.swap(_waiting);
  }
  for (const Resume& resume : waiting) resume();
}

Framer::Piece Framer::next(std::string_view bytes) {
  if (_authenticating) return nextOfAuthentication(bytes);
  if (_headerSize < kHeaderBytes) {
    const size_t size = std::min(bytes.size(), kHeaderBytes - _headerSize);
    std::copy_n(bytes.data(), size, _header.data() + _headerSize);
    _headerSize += size;
    if (_headerSize < kHeaderBytes) return {Part::header, size};
    return {readHeader() ? Part::begins : Part::unacceptable, size};
  }
  const size_t size = std::min(bytes.size(), _left);
  _left -= size;
  if (_left != 0) return {Part::more, size};
  _headerSize = 0;
  return {Part::ends, size};
}

// The handshake is a NUL byte and lines that end in CR LF; messages follow after BEGIN.
Framer::Piece Framer::nextOfAuthentication(std::string_view bytes) {
  for (size_t i = 0; i < bytes.size(); ++i) {
    if (++_authenticationBytes > kMaxAuthenticationBytes) return {Part::unacceptable, i};
    if (bytes[i] != '\n') {
      _line += bytes[i];
    } else if (std::exchange(_line, "") == "BEGIN\r") {
      _authenticating = false;
      return {Part::ends, i + 1};
    }
  }
  return {Part::more, bytes.size()};
}

// The fixed part has byte order, type, flags, version, body length, serial and length of the
// fields; the fields are padded to eight bytes.
bool Framer::readHeader() {
  if (_header[0] != 'l' && _header[0] != 'B') return false;
  const auto number = [this](size_t at) {
    uint32_t value = 0;
    for (size_t i = 0; i < 4; ++i) {
      const size_t byte = _header[0] == 'l' ? 3 - i : i;
      value = value << 8 | static_cast<unsigned char>(_header[at + byte]);
    }
    return uint64_t{value};
  };
  const uint64_t fields = (number(12) + 7) / 8 * 8;
  const uint64_t size = kHeaderBytes + fields + number(4);
  if (size > kMaxMessageBytes) return false;
  _messageBytes = size;
  _left = size - kHeaderBytes;
  return _left != 0;  // every message has fields
}

}  // namespace rpc
