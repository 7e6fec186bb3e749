#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <vector>

namespace salt {

// A set of document numbers, a bit for each. Documents are numbered one after another, so pages of
// bits are small and a look-up takes no hashing; a page without members takes 24 bytes. One writer,
// or any number of readers.
class DocSet {
 public:
  [[nodiscard]] size_t size() const { return _size; }

  [[nodiscard]] bool contains(uint32_t docID) const {
    const size_t page = docID / kPageDocs;
    if (page >= _pages.size() || _pages[page].empty()) return false;
    return (_pages[page][docID % kPageDocs / kWordDocs] >> (docID % kWordDocs) & 1) != 0;
  }

  // `docID` must not be in the set.
  void insert(uint32_t docID) {
    const size_t page = docID / kPageDocs;
    if (page >= _pages.size()) _pages.resize(page + 1);
    if (_pages[page].empty()) _pages[page].resize(kPageDocs / kWordDocs);
    _pages[page][docID % kPageDocs / kWordDocs] |= uint64_t{1} << (docID % kWordDocs);
    ++_size;
  }

  // Calls visit(docID) for each member, ascending.
  template <typename Visit>
  void forEach(const Visit& visit) const {
    for (size_t page = 0; page < _pages.size(); ++page) {
      for (size_t i = 0; i < _pages[page].size(); ++i) {
        const size_t first = page * kPageDocs + i * kWordDocs;
        for (uint64_t word = _pages[page][i]; word != 0; word &= word - 1) {
          visit(static_cast<uint32_t>(first + static_cast<size_t>(std::countr_zero(word))));
        }
      }
    }
  }

 private:
  static constexpr uint32_t kPageDocs = 4096;
  static constexpr uint32_t kWordDocs = 64;

  std::vector<std::vector<uint64_t>> _pages;  // by number; empty ones have no members
  size_t _size = 0;
};

}  // namespace salt
