#pragma once

#include <algorithm>
#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <vector>

namespace salt {

// The bits of 512 documents with consecutive numbers, a cache line.
class DocPage {
 public:
  static constexpr size_t kDocs = 512;

  [[nodiscard]] bool contains(size_t doc) const {
    return (_words[doc / kWordDocs] >> (doc % kWordDocs) & 1) != 0;
  }
  void insert(size_t doc) { _words[doc / kWordDocs] |= uint64_t{1} << (doc % kWordDocs); }
  // Inserts `count` documents from `first` on.
  void insert(size_t first, size_t count) {
    while (count > 0) {
      const size_t taken = std::min(count, kWordDocs - first % kWordDocs);
      _words[first / kWordDocs] |= UINT64_MAX >> (kWordDocs - taken) << (first % kWordDocs);
      first += taken;
      count -= taken;
    }
  }
  void erase(const DocPage& other) {
    for (size_t i = 0; i < _words.size(); ++i) _words[i] &= ~other._words[i];
  }

  [[nodiscard]] bool empty() const {
    uint64_t any = 0;
    for (const uint64_t word : _words) any |= word;
    return any == 0;
  }
  [[nodiscard]] size_t size() const {
    size_t count = 0;
    for (const uint64_t word : _words) count += static_cast<size_t>(std::popcount(word));
    return count;
  }

  DocPage& operator|=(const DocPage& other) {
    for (size_t i = 0; i < _words.size(); ++i) _words[i] |= other._words[i];
    return *this;
  }
  DocPage& operator&=(const DocPage& other) {
    for (size_t i = 0; i < _words.size(); ++i) _words[i] &= other._words[i];
    return *this;
  }
  friend DocPage operator&(DocPage left, const DocPage& right) { return left &= right; }

  bool operator==(const DocPage&) const = default;

  // Calls visit(number in the page) for each member, ascending.
  template <typename Visit>
  void forEach(const Visit& visit) const {
    for (size_t i = 0; i < _words.size(); ++i) {
      for (uint64_t word = _words[i]; word != 0; word &= word - 1) {
        visit(i * kWordDocs + static_cast<size_t>(std::countr_zero(word)));
      }
    }
  }

 private:
  static constexpr size_t kWordDocs = 64;

  std::array<uint64_t, kDocs / kWordDocs> _words{};
};

// A set of document numbers, a bit for each. Documents are numbered one after another, so pages of
// bits are small and a look-up takes no hashing. One writer, or any number of readers.
class DocSet {
 public:
  [[nodiscard]] bool contains(uint32_t docID) const {
    const DocPage* const bits = page(docID / DocPage::kDocs);
    return bits != nullptr && bits->contains(docID % DocPage::kDocs);
  }

  void insert(uint32_t docID) { writable(docID / DocPage::kDocs).insert(docID % DocPage::kDocs); }
  // Inserts `count` documents from `first` on.
  void insert(uint32_t first, uint32_t count) {
    while (count > 0) {
      const uint32_t inPage = first % DocPage::kDocs;
      const uint32_t taken = std::min<uint32_t>(count, DocPage::kDocs - inPage);
      writable(first / DocPage::kDocs).insert(inPage, taken);
      first += taken;
      count -= taken;
    }
  }
  void insert(size_t page, const DocPage& docs) { writable(page) |= docs; }
  void insert(const DocSet& other) {
    for (size_t page = 0; page < other.pages(); ++page) {
      if (const DocPage* const bits = other.page(page); bits != nullptr) writable(page) |= *bits;
    }
  }
  // Removes the documents of a page.
  void erasePage(size_t page) {
    if (page < _pages.size() && _pages[page] != kNone) _bits[_pages[page]] = {};
  }
  void erase(const DocSet& other) {
    for (size_t page = 0; page < std::min(pages(), other.pages()); ++page) {
      if (_pages[page] == kNone || other._pages[page] == kNone) continue;
      _bits[_pages[page]].erase(other._bits[other._pages[page]]);
    }
  }

  [[nodiscard]] bool empty() const {
    return std::all_of(_bits.begin(), _bits.end(),
                       [](const DocPage& bits) { return bits.empty(); });
  }

  [[nodiscard]] size_t size() const {
    size_t count = 0;
    for (const DocPage& bits : _bits) count += bits.size();
    return count;
  }

  // The number of pages up to the last one in use.
  [[nodiscard]] size_t pages() const { return _pages.size(); }
  // The documents from page * DocPage::kDocs on; null when none of them has ever been a member.
  [[nodiscard]] const DocPage* page(size_t page) const {
    return page < _pages.size() && _pages[page] != kNone ? &_bits[_pages[page]] : nullptr;
  }

  // The number of a document from its page and its number there.
  [[nodiscard]] static uint32_t docID(size_t page, size_t doc) {
    return static_cast<uint32_t>(page * DocPage::kDocs + doc);
  }

  // Calls visit(docID) for each member, ascending.
  template <typename Visit>
  void forEach(const Visit& visit) const {
    for (size_t page = 0; page < _pages.size(); ++page) {
      if (_pages[page] == kNone) continue;
      _bits[_pages[page]].forEach([&](size_t doc) { visit(docID(page, doc)); });
    }
  }

  [[nodiscard]] size_t bytes() const {
    return _pages.capacity() * sizeof(_pages[0]) + _bits.capacity() * sizeof(_bits[0]);
  }

 private:
  static constexpr uint32_t kNone = UINT32_MAX;

  DocPage& writable(size_t page) {
    if (page >= _pages.size()) _pages.resize(page + 1, kNone);
    if (_pages[page] == kNone) {
      _pages[page] = static_cast<uint32_t>(_bits.size());
      _bits.emplace_back();
    }
    return _bits[_pages[page]];
  }

  std::vector<uint32_t> _pages;  // numbers of pages in _bits; kNone for one that never had a member
  std::vector<DocPage> _bits;
};

// Calls visit(first, count) for each run of consecutive members of a DocPage or DocSet, ascending.
template <typename Set, typename Visit>
void forEachRun(const Set& set, const Visit& visit) {
  uint32_t first = 0;
  uint32_t count = 0;
  set.forEach([&](size_t doc) {
    if (count > 0 && doc != first + count) {
      visit(first, count);
      count = 0;
    }
    if (count == 0) first = static_cast<uint32_t>(doc);
    ++count;
  });
  if (count > 0) visit(first, count);
}

}  // namespace salt
