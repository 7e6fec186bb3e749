#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include "salt/Search.h"

namespace saltsearch {

// The documents that a search has found so far, and what the token at hand has seen of each. Made
// for very many look-ups in no order: one access to a table by document number tells both. The
// table takes its memory by the page, for documents that are asked for and their neighbours. One
// thread.
class Candidates {
 public:
  struct Slot {
    uint32_t seen = 0;   // zones in which the token has been seen, whether it is a candidate or not
    uint32_t place = 0;  // in the list of candidates, from 1; 0 for none
  };

  [[nodiscard]] Slot& operator[](uint32_t docID) {
    const size_t page = docID / kPageDocs;
    if (page >= _pages.size() || _pages[page] == nullptr) addPage(page);
    return _pages[page][docID % kPageDocs];
  }

  [[nodiscard]] DocResult& candidate(Slot slot) { return _docs[slot.place - 1]; }
  [[nodiscard]] const std::vector<DocResult>& all() const { return _docs; }

  // `slot` is that of the document, which is no candidate yet.
  void add(Slot* slot, const DocResult& doc) {
    _docs.push_back(doc);
    slot->place = static_cast<uint32_t>(_docs.size());
  }

  void forgetSeen() {
    for (const size_t page : _used) {
      for (uint32_t i = 0; i < kPageDocs; ++i) _pages[page][i].seen = 0;
    }
  }

  // Calls `keep`, which may change all but the docID, on each candidate and drops those it refuses.
  template <typename Keep>
  void retain(const Keep& keep) {
    size_t kept = 0;
    for (size_t i = 0; i < _docs.size(); ++i) {
      if (!keep(_docs[i])) {
        (*this)[_docs[i].docID].place = 0;
        continue;
      }
      if (kept != i) {
        _docs[kept] = _docs[i];
        (*this)[_docs[kept].docID].place = static_cast<uint32_t>(kept + 1);
      }
      ++kept;
    }
    _docs.resize(kept);
  }

 private:
  static constexpr uint32_t kPageDocs = 1024;

  void addPage(size_t page) {
    if (page >= _pages.size()) _pages.resize(page + 1);
    _pages[page] = std::make_unique<Slot[]>(kPageDocs);
    _used.push_back(page);
  }

  std::vector<std::unique_ptr<Slot[]>> _pages;
  std::vector<size_t> _used;
  std::vector<DocResult> _docs;
};

}  // namespace saltsearch
