#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <string>
#include <vector>

#include "modification/WeightedDistance.h"
#include "tests/support/Seed.h"

namespace {

constexpr float kUnbounded = 100;

// The full distance table of two words without their common ends, cell by cell.
class Model {
 public:
  Model(std::string a, std::string b) : _longerTyped(a.size() > b.size()) {
    _s = _longerTyped ? b : a;
    _l = _longerTyped ? a : b;
    while (!_s.empty() && _s.back() == _l.back()) {
      _s.pop_back();
      _l.pop_back();
      _atEnd = false;
    }
    const bool suffixIsAll = _s.empty();
    while (!_s.empty() && _s.front() == _l.front()) {
      _s.erase(0, 1);
      _l.erase(0, 1);
      _atStart = false;
    }
    if (_s.empty()) {
      const float each = suffixIsAll    ? (_longerTyped ? cDelStart : cInsStart)
                         : _atEnd       ? (_longerTyped ? cDelEnd : cInsEnd)
                         : _longerTyped ? cDelMid
                                        : cInsMid;
      distance = each * static_cast<float>(_l.size());
      gapAlone = true;
      return;
    }
    _cells.assign(_s.size() + 1, std::vector<float>(_l.size() + 1));
    for (size_t j = 1; j <= _l.size(); ++j) _cells[0][j] = border(0, j);
    for (size_t i = 1; i <= _s.size(); ++i) {
      _cells[i][0] = border(i, 0);
      for (size_t j = 1; j <= _l.size(); ++j) _cells[i][j] = cell(i, j);
    }
    distance = _cells.back().back();
  }

  float distance = 0;
  bool gapAlone = false;  // one word is the other with letters inserted at one position

 private:
  // Row 0 and column 0, which consist of insertions or deletions only.
  float border(size_t i, size_t j) const {
    const bool deletes = (i == 0) == _longerTyped;
    const float middle = deletes ? cDelMid : cInsMid;
    const float start = deletes ? cDelStart : cInsStart;
    const float end = deletes ? cDelEnd : cInsEnd;
    const size_t n = i + j;
    if (n == 1) return _atStart ? start : middle;
    const float before = i == 0 ? _cells[0][j - 1] : _cells[i - 1][0];
    return before + (i == 0 && _atEnd && j == _l.size() ? end : middle);
  }

  float cell(size_t i, size_t j) const {
    const char c = _s[i - 1];
    const char x = _l[j - 1];
    if (c == x) return _cells[i - 1][j - 1];
    const bool lastRow = i == _s.size();
    const bool start = _atStart && (_longerTyped ? j : i) == 1;
    const bool end = _atEnd && (_longerTyped ? j == _l.size() : lastRow);
    const bool matched = (i == 1 || lastRow) && _l.substr(0, j - 1).find(c) != std::string::npos;
    const float sub = start ? cSubStart : end ? cSubEnd : cSubMid;
    const bool startGap = start && !matched;
    const float del = startGap ? cDelStart : end ? cDelEnd : cDelMid;
    const float ins = startGap ? cInsStart : end ? cInsEnd : cInsMid;
    const float columnGap = _cells[i][j - 1] + (_longerTyped ? del : ins);
    const float rowGap = _cells[i - 1][j] + (_longerTyped ? ins : del);
    float best = std::min({_cells[i - 1][j - 1] + sub, columnGap, rowGap});
    if (i > 1 && j > 1 && c == _l[j - 2] && x == _s[i - 2]) {
      const float swap = _atStart && i == 2 && j == 2          ? cSwapStart
                         : _atEnd && lastRow && j == _l.size() ? cSwapEnd
                                                               : cSwapMid;
      best = std::min(best, _cells[i - 2][j - 2] + swap);
    }
    return best;
  }

  const bool _longerTyped;
  bool _atStart = true;
  bool _atEnd = true;
  std::string _s;
  std::string _l;
  std::vector<std::vector<float>> _cells;
};

}  // namespace

TEST(WeightedDistance, IsTheLimitForWordsTooFarApart) {
  EXPECT_EQ(weightedDistance("a", "abcdef", 4, 1.2F), 4);
  EXPECT_EQ(weightedDistance("abcdef", "uvwxyz", 4, 1.2F), 4);
  EXPECT_EQ(weightedDistance("abcdef", "uvwxyz", 7, 1.2F), 7);
  // The cost of letters missing at a single position is not limited.
  EXPECT_EQ(weightedDistance("", "abc", 4, 1.2F), 3 * cInsStart);
}

TEST(WeightedDistance, EqualsTheFullTableWithinTheBand) {
  std::mt19937 random(testsupport::firstSeed());
  const auto word = [&random](size_t longest) {
    std::string made;
    for (size_t n = random() % (longest + 1); n > 0; --n) made += "ab\xC3"[random() % 3];
    return made;
  };
  for (int round = 0; round < 40000; ++round) {
    const std::string a = word(9);
    const std::string b = word(9);
    ASSERT_EQ(weightedDistance(a, b, kUnbounded, kUnbounded), Model(a, b).distance)
        << a << ' ' << b;
  }
  for (int round = 0; round < 20000; ++round) {
    const std::string a = word(3);
    const std::string b = word(3);
    const Model all(a, b);
    const float expected = all.distance > 1.2F && !all.gapAlone ? 4 : all.distance;
    ASSERT_EQ(weightedDistance(a, b, 4, 1.2F), expected) << a << ' ' << b;
  }
  for (int round = 0; round < 80000; ++round) {
    const float limits[] = {0.0F, 1.0F, 2.5F, 4.0F};
    const std::string a = word(29);
    const std::string b = word(29);
    const float distance = weightedDistance(a, b, limits[round % 4], 1.2F);
    ASSERT_TRUE(distance >= 0 && distance <= 30) << a << ' ' << b << ' ' << distance;
  }
}
