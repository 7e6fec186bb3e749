#pragma once

#include <cmath>
#include <cstdint>
#include <limits>
#include <optional>

#include "salt/DocPages.h"

// A cache of document dates. Besides the text score, the order of results depends on dates, so most
// of what a search finds can be ranked without reading it from the store.
//
// Every store or deletion of a document must be reported here, so a cached date is always correct.
// Eight bytes a document, in pages. Guarded by the owner's lock.
class DocDates {
 public:
  // Seconds since 1970; nullopt when unknown.
  [[nodiscard]] std::optional<double> find(uint32_t docID) const {
    const double date = _dates.at(docID).seconds;
    if (std::isnan(date)) return std::nullopt;
    return date;
  }

  // A date that is not a number stays unknown.
  void set(uint32_t docID, double date) { _dates[docID].seconds = date; }
  void forget(uint32_t docID) {
    if (find(docID)) _dates[docID] = {};
  }
  void forgetAll() { _dates = {}; }

 private:
  struct Date {
    double seconds = std::numeric_limits<double>::quiet_NaN();
  };

  salt::DocPages<Date> _dates;
};
