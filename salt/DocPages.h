#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
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

 private:
  std::vector<std::unique_ptr<T[]>> _pages;
};

}  // namespace salt
