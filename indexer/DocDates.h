#pragma once

#include <cstdint>
#include <optional>
#include <unordered_map>

// The dates of documents, as far as they are known: what the order of results depends on beside the
// text's score. With them most of what a search finds is ranked without being read.
//
// Whoever stores or deletes a document says so here; what is known is always true. Some 40 bytes a
// document. The owner's lock guards it.
class DocDates {
 public:
  // Seconds since 1970; none when it is not known.
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
