#include "modification/WeightedDistance.h"

#include <algorithm>
#include <cstddef>
#include <vector>

namespace {

size_t commonPrefix(std::string_view a, std::string_view b) {
  return static_cast<size_t>(std::mismatch(a.begin(), a.end(), b.begin(), b.end()).first -
                             a.begin());
}

size_t commonSuffix(std::string_view a, std::string_view b) {
  return static_cast<size_t>(std::mismatch(a.rbegin(), a.rend(), b.rbegin(), b.rend()).first -
                             a.rbegin());
}

// The distance table between two words without their common prefix and suffix, filled row by row.
// Rows are letters of the shorter word, columns of the longer.
class BandedTable {
 public:
  // `typedIsLonger` tells which of the two is the typed word; `atStart` and `atEnd` whether nothing
  // was stripped there. Both words have letters left. `band` is at least the difference of the
  // lengths.
  BandedTable(std::string_view shorter, std::string_view longer, bool typedIsLonger, bool atStart,
              bool atEnd, size_t band)
      : _shorter(shorter),
        _longer(longer),
        _typedIsLonger(typedIsLonger),
        _wordStart(atStart),
        _wordEnd(atEnd),
        _slack(band - (longer.size() - shorter.size())),
        _end(band),
        _row(longer.size()),
        _rowBeforeLast(longer.size()) {
    const float start = typedIsLonger ? cDelStart : cInsStart;
    const float middle = typedIsLonger ? cDelMid : cInsMid;
    const float end = typedIsLonger ? cDelEnd : cInsEnd;
    _row[0] = atStart ? start : middle;
    for (size_t j = 1; j < _row.size(); ++j) {
      _row[j] = _row[j - 1] + (atEnd && j + 1 == _row.size() ? end : middle);
    }
  }

  float distance() {
    float value = 0;
    for (size_t i = 0; i < _shorter.size(); ++i) value = fillRow(i);
    return value;
  }

 private:
  // The value at the end of row i.
  float fillRow(size_t i) {
    const bool last = i + 1 == _shorter.size();
    const float border = i == 0 ? firstBorder() : _border + (_typedIsLonger ? cInsMid : cDelMid);
    float diag = i == 0 ? 0 : _border;
    _border = border;
    if (i > _slack) ++_start;
    if (_end < _longer.size()) ++_end;
    const char c = _shorter[i];
    float value = border;
    float left = border;
    float beforeLast = 0;
    char previous = _longer[0];
    bool matched = false;
    for (size_t j = _start; j < _end; ++j) {
      const float swapped = beforeLast;
      beforeLast = _rowBeforeLast[j];
      _rowBeforeLast[j] = diag;
      const float up = _row[j];
      const char x = _longer[j];
      if (c == x) {
        if (i == 0 || last) matched = true;
        value = diag;
      } else {
        const bool atStart = _wordStart && (_typedIsLonger ? j == _start : i == 0);
        const bool atEnd = _wordEnd && (_typedIsLonger ? j + 1 == _end : last);
        value = cheapest(diag, left, up, atStart, atEnd, matched);
        if (i > 0 && j > 0 && c == previous && x == _shorter[i - 1]) {
          value = std::min(swapped + swapCost(i, j, last), value);
        }
      }
      _row[j] = left = value;
      previous = x;
      diag = up;
    }
    return value;
  }

  [[nodiscard]] float firstBorder() const {
    if (!_wordStart) return _typedIsLonger ? cInsMid : cDelMid;
    return _typedIsLonger ? cInsStart : cDelStart;
  }

  // The cheapest of a replacement, an extra letter and a missing letter.
  [[nodiscard]] float cheapest(float diag, float left, float up, bool atStart, bool atEnd,
                               bool matched) const {
    const float sub = atStart ? cSubStart : atEnd ? cSubEnd : cSubMid;
    float del = cDelMid;
    float ins = cInsMid;
    if (atStart && !matched) {
      del = cDelStart;
      ins = cInsStart;
    } else if (atEnd) {
      del = cDelEnd;
      ins = cInsEnd;
    }
    const float tooMany = (_typedIsLonger ? left : up) + del;
    const float tooFew = (_typedIsLonger ? up : left) + ins;
    return std::min({diag + sub, tooMany, tooFew});
  }

  [[nodiscard]] float swapCost(size_t i, size_t j, bool lastRow) const {
    if (_wordStart && i == 1 && j == 1) return cSwapStart;
    if (_wordEnd && lastRow && j + 1 == _end) return cSwapEnd;
    return cSwapMid;
  }

  const std::string_view _shorter;
  const std::string_view _longer;
  const bool _typedIsLonger;
  const bool _wordStart;
  const bool _wordEnd;
  const size_t _slack;  // rows before the band leaves the first column
  size_t _start = 0;    // start of the band in the row
  size_t _end;
  float _border = 0;                  // value left of the row's first cell
  std::vector<float> _row;            // the previous row, overwritten by the current one
  std::vector<float> _rowBeforeLast;  // shifted right by one cell
};

}  // namespace

float weightedDistance(std::string_view strA, std::string_view strB, float maxDistance,
                       float maxWeightedDistance) {
  const bool typedIsLonger = strA.size() > strB.size();
  std::string_view shorter = typedIsLonger ? strB : strA;
  std::string_view longer = typedIsLonger ? strA : strB;
  const size_t difference = longer.size() - shorter.size();
  if (static_cast<float>(difference) > maxDistance) return maxDistance;

  const size_t suffix = commonSuffix(shorter, longer);
  shorter.remove_suffix(suffix);
  longer.remove_suffix(suffix);
  if (shorter.empty()) {
    return static_cast<float>(difference) * (typedIsLonger ? cDelStart : cInsStart);
  }
  const size_t prefix = commonPrefix(shorter, longer);
  shorter.remove_prefix(prefix);
  longer.remove_prefix(prefix);
  if (shorter.empty()) {
    const float each =
        typedIsLonger ? (suffix > 0 ? cDelMid : cDelEnd) : (suffix > 0 ? cInsMid : cInsEnd);
    return static_cast<float>(longer.size()) * each;
  }
  const bool wholeRow = static_cast<float>(longer.size()) < maxDistance;
  const size_t band = wholeRow ? longer.size() : static_cast<size_t>(maxDistance);
  BandedTable table(shorter, longer, typedIsLonger, prefix == 0, suffix == 0, band);
  const float distance = table.distance();
  return distance > maxWeightedDistance ? maxDistance : distance;
}
