#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

namespace salt {

// 32 bits for each document, all 0 at first. Made for very many look-ups in no order: memory is
// taken by the page, for documents that are asked for and their neighbours. One thread.
class DocMasks {
 public:
  [[nodiscard]] uint32_t& operator[](uint32_t docID) {
    const size_t page = docID / kPageDocs;
    if (page >= _pages.size() || _pages[page] == nullptr) addPage(page);
    return _pages[page][docID % kPageDocs];
  }

  // All bits to 0. Keeps the memory.
  void clear() {
    for (const size_t page : _used) std::fill_n(_pages[page].get(), kPageDocs, 0);
  }

 private:
  static constexpr uint32_t kPageDocs = 1024;

  void addPage(size_t page) {
    if (page >= _pages.size()) _pages.resize(page + 1);
    _pages[page] = std::make_unique<uint32_t[]>(kPageDocs);
    _used.push_back(page);
  }

  std::vector<std::unique_ptr<uint32_t[]>> _pages;
  std::vector<size_t> _used;
};

}  // namespace salt
