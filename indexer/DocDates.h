#pragma once

#include <cstdint>
#include <optional>
#include <unordered_map>

// A cache of document dates. Besides the text score, the order of results depends on dates, so most
// of what a search finds can be ranked without reading it from the store.
//
// Every store or deletion of a document must be reported here, so a cached date is always correct.
// About 40 bytes a document. Guarded by the owner's lock.
class DocDates {
 public:
  // Seconds since 1970; nullopt when unknown.
  [[nodiscard]] std::optional<double> find(uint32_t docID) const {
    const auto found = _dates.find(docID);
    if (found == _dates.end()) return std::nullopt;
    return found->second;
  }

  void set(uint32_t docID, double date) { _dates.insert_or_assign(docID, date); }
  void forget(uint32_t docID) { _dates.erase(docID); }
  void forgetAll() { _dates.clear(); }

 private:
  std::unordered_map<uint32_t, double> _dates;
};
