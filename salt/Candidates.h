#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "salt/DocPages.h"
#include "salt/Search.h"

namespace saltsearch {

// The documents that a search has found so far. One thread.
class Candidates {
 public:
  [[nodiscard]] const std::vector<DocResult>& all() const { return _docs; }

  // Null when the document is none.
  [[nodiscard]] DocResult* find(uint32_t docID) {
    const uint32_t place = _places[docID];
    return place == 0 ? nullptr : &_docs[place - 1];
  }

  // The document is no candidate yet.
  void add(const DocResult& doc) {
    _docs.push_back(doc);
    _places[doc.docID] = static_cast<uint32_t>(_docs.size());
  }

  // Calls `keep`, which may change all but the docID, on each candidate and drops those it refuses.
  template <typename Keep>
  void retain(const Keep& keep) {
    size_t kept = 0;
    for (size_t i = 0; i < _docs.size(); ++i) {
      if (!keep(_docs[i])) {
        _places[_docs[i].docID] = 0;
        continue;
      }
      if (kept != i) {
        _docs[kept] = _docs[i];
        _places[_docs[kept].docID] = static_cast<uint32_t>(kept + 1);
      }
      ++kept;
    }
    _docs.resize(kept);
  }

 private:
  std::vector<DocResult> _docs;
  salt::DocPages<uint32_t> _places;  // in _docs, from 1; 0 for none
};

}  // namespace saltsearch
