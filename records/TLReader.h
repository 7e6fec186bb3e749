#pragma once

#include <bit>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Text.h"

// Maximum nesting of sub-records. Reading a deeper record fails, and every recursive operation
// (write, compare, hash, copy, describe) asserts the same bound, so neither input nor a tree built
// by hand can exhaust the stack.
inline constexpr int kMaxRecordDepth = 256;

// Maximum number of sub-records and list texts in one read. Two bytes on the wire can request a
// record of about 300 bytes; above this limit, far beyond any real item, the read fails instead of
// exhausting the memory of the device.
inline constexpr uint32_t kMaxRecordElements = uint32_t{1} << 18;

// Wire types: the low three bits of a tag.
enum class TLWireType : uint8_t {
  varint = 0,
  fixed64 = 1,
  lengthDelimited = 2,
  startGroup = 3,
  endGroup = 4,
  fixed32 = 5,
};

// Reads the Protocol Buffers wire format in place; the bytes must outlive the reader. Every failure
// sets the error flag permanently; what cannot be read is 0 or null. One thread.
class TLReader {
 public:
  // With `keepsWire`, lists that support it stay in wire form (see TLRecordList).
  explicit TLReader(std::string_view bytes, bool keepsWire = false)
      : _position(bytes.data()), _limit(bytes.data() + bytes.size()), _keepsWire(keepsWire) {}

  [[nodiscard]] bool hasError() const { return _error; }
  // True while bytes remain before the limit and nothing has failed.
  [[nodiscard]] bool hasMore() const { return _position < _limit && !_error; }
  [[nodiscard]] size_t remaining() const { return static_cast<size_t>(_limit - _position); }
  [[nodiscard]] const char* position() const { return _position; }
  [[nodiscard]] bool keepsWire() const { return _keepsWire; }
  void fail() { _error = true; }

  // At most ten bytes, low group first. Ten bytes that all have their top bit set yield 0 without
  // an error, and the next read starts after them.
  uint64_t readVarint() {
    if (_position < _limit && static_cast<uint8_t>(*_position) < 0x80) {
      return static_cast<uint8_t>(*_position++);
    }
    uint64_t value = 0;
    for (unsigned shift = 0; shift < 70; shift += 7) {
      if (_position == _limit) {
        _error = true;
        return 0;
      }
      const auto byte = static_cast<uint8_t>(*_position++);
      value |= static_cast<uint64_t>(byte & 0x7F) << shift;
      if (byte < 0x80) return value;
    }
    return 0;
  }

  float readFloat() { return readFixed<float>(); }
  double readDouble() { return readFixed<double>(); }

  // A length-delimited value; the view is valid as long as the input. Nullopt if it is cut off.
  std::optional<std::string_view> readView() {
    const uint64_t length = readVarint();
    if (_error || length > remaining()) {
      _error = true;
      return std::nullopt;
    }
    const std::string_view view(_position, static_cast<size_t>(length));
    _position += length;
    return view;
  }

  // Invalid UTF-8 becomes U+FFFD.
  std::optional<TLString> readString() {
    const auto view = readView();
    return view ? std::optional(platform::fromUTF8(*view)) : std::nullopt;
  }

  std::optional<std::string> readBytes() {
    const auto view = readView();
    return view ? std::optional(std::string(*view)) : std::nullopt;
  }

  // Skips the value after a tag of this wire type; a group is skipped up to its end tag. False for
  // an unknown wire type or a value that is cut off.
  [[nodiscard]] bool skipValue(uint64_t wireType);

  // Reads a length, runs `body` with the limit set to it, then restores the limit and leaves the
  // position where `body` stopped. False if the length does not fit or `body` returns false.
  template <typename Body>
  [[nodiscard]] bool withLengthLimit(Body&& body) {
    const uint64_t length = readVarint();
    if (_error || length > remaining()) {
      _error = true;
      return false;
    }
    const char* const outer = _limit;
    _limit = _position + length;
    const bool result = body();
    _limit = outer;
    return result;
  }

  // Counts one element; false, with the error flag set, if the limit is exceeded.
  [[nodiscard]] bool takeElement() {
    if (_elements == kMaxRecordElements) _error = true;
    ++_elements;
    return !_error;
  }

  // Runs `body` on a sub-record, within the limits of length, nesting and number.
  template <typename Body>
  [[nodiscard]] bool withRecord(Body&& body) {
    if (_depth == kMaxRecordDepth) _error = true;
    if (!takeElement()) return false;
    ++_depth;
    const bool result = withLengthLimit(body);
    --_depth;
    return result;
  }

  // Reads a sub-record in place.
  template <typename Record>
  [[nodiscard]] bool readRecord(Record& record) {
    return withRecord([&] { return record.readFrom(*this); });
  }

 private:
  static_assert(std::endian::native == std::endian::little, "fixed fields are read in place");

  template <typename T>
  T readFixed() {
    T value = 0;
    if (remaining() < sizeof value) {
      _error = true;
      return value;
    }
    std::memcpy(&value, _position, sizeof value);
    _position += sizeof value;
    return value;
  }

  bool skipBytes(uint64_t count) {
    if (_error || count > remaining()) {
      _error = true;
      return false;
    }
    _position += count;
    return true;
  }
  bool skipGroup();

  const char* _position;
  const char* _limit;
  const bool _keepsWire;
  bool _error = false;
  int _depth = 0;
  uint32_t _elements = 0;
};
