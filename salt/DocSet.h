#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <vector>

namespace salt {

// A set of document numbers, a bit for each. Documents are numbered one after another, so pages of
// bits are small and a look-up takes no hashing. One writer, or any number of readers.
class DocSet {
 public:
  [[nodiscard]] size_t size() const { return _size; }

  [[nodiscard]] bool contains(uint32_t docID) const {
    const size_t page = docID / kPageDocs;
    if (page >= _pages.size() || _pages[page] == kNone) return false;
    return (_words[wordOf(docID)] >> (docID % kWordDocs) & 1) != 0;
  }

  // `docID` must not be in the set.
  void insert(uint32_t docID) {
    const size_t page = docID / kPageDocs;
    if (page >= _pages.size()) _pages.resize(page + 1, kNone);
    if (_pages[page] == kNone) {
      _pages[page] = static_cast<uint32_t>(_words.size() / kPageWords);
      _words.resize(_words.size() + kPageWords);
    }
    _words[wordOf(docID)] |= uint64_t{1} << (docID % kWordDocs);
    ++_size;
  }

  // Calls visit(docID) for each member, ascending.
  template <typename Visit>
  void forEach(const Visit& visit) const {
    for (size_t page = 0; page < _pages.size(); ++page) {
      if (_pages[page] == kNone) continue;
      for (size_t first = page * kPageDocs; first < (page + 1) * kPageDocs; first += kWordDocs) {
        for (uint64_t word = _words[wordOf(first)]; word != 0; word &= word - 1) {
          visit(static_cast<uint32_t>(first + static_cast<size_t>(std::countr_zero(word))));
        }
      }
    }
  }

 private:
  static constexpr size_t kPageDocs = 512;  // a cache line
  static constexpr size_t kWordDocs = 64;
  static constexpr size_t kPageWords = kPageDocs / kWordDocs;
  static constexpr uint32_t kNone = UINT32_MAX;

  // The index in _words of the word with the bit of a document, whose page is not kNone.
  [[nodiscard]] size_t wordOf(size_t docID) const {
    return _pages[docID / kPageDocs] * kPageWords + docID % kPageDocs / kWordDocs;
  }

  std::vector<uint32_t> _pages;  // numbers of pages in _words; kNone for one without members
  std::vector<uint64_t> _words;
  size_t _size = 0;
};

}  // namespace salt
