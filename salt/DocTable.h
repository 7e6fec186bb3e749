#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace salt {

// Hash table in one array, linear probing, keyed by the member `docID` of its entries. DocID 0
// marks a free slot and cannot be stored. One thread writes, or any number read.
template <typename Entry>
class DocTable {
 public:
  [[nodiscard]] size_t size() const { return _size; }

  // The entry, or null.
  [[nodiscard]] Entry* find(uint32_t docID) {
    if (_size == 0) return nullptr;
    Entry& slot = _slots[slotOf(docID)];
    return slot.docID == docID ? &slot : nullptr;
  }
  [[nodiscard]] bool contains(uint32_t docID) const {
    return _size != 0 && _slots[slotOf(docID)].docID == docID;
  }

  // Adds an entry whose docID is not 0 and not in the table.
  void insert(const Entry& entry) {
    if ((_size + 1) * 3 > _slots.size() * 2) rebuild(_size + 1);
    _slots[slotOf(entry.docID)] = entry;
    ++_size;
  }

  template <typename Visit>
  void forEach(Visit visit) const {
    for (const Entry& slot : _slots) {
      if (slot.docID != 0) visit(slot);
    }
  }

  // Calls `keep`, which may change all but the docID, on each entry and drops those it refuses.
  template <typename Keep>
  void retain(Keep keep) {
    size_t kept = 0;
    for (Entry& slot : _slots) {
      if (slot.docID == 0) continue;
      if (keep(slot)) {
        ++kept;
      } else {
        slot.docID = 0;
      }
    }
    if (kept != _size) rebuild(kept);
  }

 private:
  static constexpr unsigned kMinBits = 6;

  // The slot that holds docID, or the free one where it would go.
  [[nodiscard]] size_t slotOf(uint32_t docID) const {
    const size_t mask = _slots.size() - 1;
    size_t slot = (docID * UINT64_C(0x9E3779B97F4A7C15)) >> (64 - _bits);
    while (_slots[slot].docID != 0 && _slots[slot].docID != docID) slot = (slot + 1) & mask;
    return slot;
  }

  // Moves what is there into slots for `entries` entries with room to grow.
  void rebuild(size_t entries) {
    std::vector<Entry> old;
    old.swap(_slots);
    for (_bits = kMinBits; (size_t{1} << _bits) < entries * 2;) ++_bits;
    _slots.resize(size_t{1} << _bits);
    _size = 0;
    for (const Entry& slot : old) {
      if (slot.docID == 0) continue;
      _slots[slotOf(slot.docID)] = slot;
      ++_size;
    }
  }

  std::vector<Entry> _slots;
  size_t _size = 0;
  unsigned _bits = kMinBits;
};

}  // namespace salt
