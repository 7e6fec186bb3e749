#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace salt {

// A set of document numbers: an open-addressing hash table with linear probing. 0 marks a free slot
// and cannot be a member. One writer, or any number of readers.
class DocSet {
 public:
  [[nodiscard]] size_t size() const { return _size; }

  [[nodiscard]] bool contains(uint32_t docID) const {
    return _size != 0 && _slots[slotOf(docID)] == docID;
  }

  // `docID` must not be 0 nor in the set.
  void insert(uint32_t docID) {
    if ((_size + 1) * 3 > _slots.size() * 2) grow();
    _slots[slotOf(docID)] = docID;
    ++_size;
  }

  template <typename Visit>
  void forEach(const Visit& visit) const {
    for (const uint32_t docID : _slots) {
      if (docID != 0) visit(docID);
    }
  }

 private:
  static constexpr unsigned kMinBits = 6;

  // The slot that holds docID, or the free slot where it belongs.
  [[nodiscard]] size_t slotOf(uint32_t docID) const {
    const size_t mask = _slots.size() - 1;
    size_t slot = (docID * UINT64_C(0x9E3779B97F4A7C15)) >> (64 - _bits);
    while (_slots[slot] != 0 && _slots[slot] != docID) slot = (slot + 1) & mask;
    return slot;
  }

  void grow() {
    std::vector<uint32_t> old;
    old.swap(_slots);
    _bits = old.empty() ? kMinBits : _bits + 1;
    _slots.resize(size_t{1} << _bits);
    for (const uint32_t docID : old) {
      if (docID != 0) _slots[slotOf(docID)] = docID;
    }
  }

  std::vector<uint32_t> _slots;
  size_t _size = 0;
  unsigned _bits = kMinBits;
};

}  // namespace salt
