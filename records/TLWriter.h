#pragma once

#include <bit>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <utility>

#include "platform/Text.h"
#include "records/TLReader.h"

// Appends the Protocol Buffers wire format to its own buffer. Cannot fail. One thread.
class TLWriter {
 public:
  [[nodiscard]] const std::string& bytes() const { return _bytes; }
  [[nodiscard]] std::string take() { return std::move(_bytes); }

  void writeVarint(uint64_t value) {
    for (; value >= 0x80; value >>= 7) _bytes.push_back(static_cast<char>(value | 0x80));
    _bytes.push_back(static_cast<char>(value));
  }

  void writeVarintField(uint32_t number, uint64_t value) {
    writeTag(number, TLWireType::varint);
    writeVarint(value);
  }
  void writeFloatField(uint32_t number, float value) {
    writeTag(number, TLWireType::fixed32);
    writeFixed(value);
  }
  void writeDoubleField(uint32_t number, double value) {
    writeTag(number, TLWireType::fixed64);
    writeFixed(value);
  }
  void writeBytesField(uint32_t number, std::string_view value) {
    writeTag(number, TLWireType::lengthDelimited);
    writeVarint(value.size());
    _bytes.append(value);
  }
  // Lone surrogates are written as U+FFFD.
  void writeStringField(uint32_t number, TLStringView value) {
    writeDelimited(number, [&] { platform::appendUTF8(value, _bytes); });
  }
  // A sub-record already in wire form, length first.
  void writeDelimitedField(uint32_t number, std::string_view delimited) {
    writeTag(number, TLWireType::lengthDelimited);
    _bytes.append(delimited);
  }
  template <typename Record>
  void writeRecordField(uint32_t number, const Record& record) {
    writeDelimited(number, [&] { record.writeTo(*this); });
  }

 private:
  void writeTag(uint32_t number, TLWireType type) {
    writeVarint(uint64_t{number} << 3 | static_cast<uint64_t>(type));
  }

  template <typename T>
  void writeFixed(T value) {
    char raw[sizeof value];
    std::memcpy(raw, &value, sizeof value);
    _bytes.append(raw, sizeof raw);
  }

  // `body` appends the value after one byte reserved for its length; only a value of 128 bytes or
  // more must be moved to make room for a longer length.
  template <typename Body>
  void writeDelimited(uint32_t number, Body&& body) {
    writeTag(number, TLWireType::lengthDelimited);
    const size_t start = _bytes.size();
    _bytes.push_back('\0');
    body();
    const size_t length = _bytes.size() - start - 1;
    if (length < 0x80) {
      _bytes[start] = static_cast<char>(length);
    } else {
      TLWriter prefix;
      prefix.writeVarint(length);
      _bytes.replace(start, 1, prefix.bytes());
    }
  }

  std::string _bytes;
};
