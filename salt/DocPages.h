#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <utility>
#include <vector>

namespace salt {

// Maps document numbers to values, initially T(). Built for very many random look-ups: memory is
// allocated in pages, only for documents accessed and their neighbours. One thread.
template <typename T>
class DocPages {
 public:
  static constexpr uint32_t kPageDocs = 512;

  [[nodiscard]] T& operator[](uint32_t docID) {
    const size_t page = docID / kPageDocs;
    if (page >= _pages.size()) _pages.resize(page + 1);
    if (_pages[page] == nullptr) _pages[page] = std::make_unique<T[]>(kPageDocs);
    return _pages[page][docID % kPageDocs];
  }

  // The value, without allocating.
  [[nodiscard]] T at(uint32_t docID) const {
    const size_t page = docID / kPageDocs;
    if (page >= _pages.size() || _pages[page] == nullptr) return T();
    return _pages[page][docID % kPageDocs];
  }

  // The number of pages up to the last one in use.
  [[nodiscard]] size_t pages() const { return _pages.size(); }
  // The values of the documents from page * kPageDocs on; null when none of them has one.
  [[nodiscard]] const T* page(size_t page) const {
    return page < _pages.size() ? _pages[page].get() : nullptr;
  }

  // Combines with the values of `other` by |=.
  void unite(DocPages&& other) {
    if (other._pages.size() > _pages.size()) _pages.resize(other._pages.size());
    for (size_t page = 0; page < other._pages.size(); ++page) {
      if (_pages[page] == nullptr) {
        _pages[page] = std::move(other._pages[page]);
      } else if (other._pages[page] != nullptr) {
        for (uint32_t i = 0; i < kPageDocs; ++i) _pages[page][i] |= other._pages[page][i];
      }
    }
  }

  [[nodiscard]] size_t bytes() const {
    const auto used = static_cast<size_t>(std::count_if(
        _pages.begin(), _pages.end(), [](const auto& page) { return page != nullptr; }));
    return used * kPageDocs * sizeof(T) + _pages.size() * sizeof(_pages[0]);
  }

  // Calls visit(docID, value) in DocID order for each document of an allocated page.
  template <typename Visit>
  void forEach(const Visit& visit) const {
    for (size_t page = 0; page < _pages.size(); ++page) {
      if (_pages[page] == nullptr) continue;
      for (uint32_t i = 0; i < kPageDocs; ++i) {
        visit(static_cast<uint32_t>(page * kPageDocs + i), _pages[page][i]);
      }
    }
  }

 private:
  std::vector<std::unique_ptr<T[]>> _pages;
};

}  // namespace salt
