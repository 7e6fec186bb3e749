#include "records/TLReader.h"

namespace {

constexpr uint64_t raw(TLWireType type) {
  return static_cast<uint64_t>(type);
}

}  // namespace

bool TLReader::skipValue(uint64_t wireType) {
  switch (wireType) {
    case raw(TLWireType::varint):
      readVarint();
      return !_error;
    case raw(TLWireType::fixed64):
      return skipBytes(8);
    case raw(TLWireType::lengthDelimited):
      return skipBytes(readVarint());
    case raw(TLWireType::startGroup):
      return skipGroup();
    case raw(TLWireType::fixed32):
      return skipBytes(4);
    default:
      _error = true;
      return false;
  }
}

// Counts nested groups instead of recursing into them.
bool TLReader::skipGroup() {
  for (uint64_t open = 1; open > 0;) {
    const uint64_t wireType = readVarint() & 7;
    if (_error) return false;
    if (wireType == raw(TLWireType::startGroup)) {
      ++open;
    } else if (wireType == raw(TLWireType::endGroup)) {
      --open;
    } else if (!skipValue(wireType)) {
      return false;
    }
  }
  return true;
}
