#include "salt/TopTokens.h"

#include <algorithm>
#include <bit>

#include "platform/Assert.h"

namespace saltsearch {

namespace {

constexpr size_t kMinCandidates = 100;  // keeps the summary meaningful for a small k

// Tokens with weights in a hash table with linear probing. A slot holds the upper half of the hash
// beside the index of its entry, so a look-up of an absent token mostly ends within the slots,
// which stay in the processor's cache.
class TokenWeights {
 public:
  struct Entry {
    std::string token;
    double weight;
    size_t hash;
  };

  explicit TokenWeights(size_t most) : _slots(std::bit_ceil(4 * most)) { _entries.reserve(most); }

  [[nodiscard]] size_t size() const { return _entries.size(); }
  [[nodiscard]] std::vector<Entry>& entries() { return _entries; }

  // Adds to the weight of a present token; false when it is absent.
  bool add(std::string_view token, double weight) {
    Slot* const slot = slotOf(token, hashOf(token));
    if (slot->place == 0) return false;
    _entries[slot->place - 1].weight += weight;
    return true;
  }

  void addOrInsert(std::string_view token, double weight) {
    const size_t hash = hashOf(token);
    Slot* const slot = slotOf(token, hash);
    if (slot->place == 0) {
      _entries.push_back({std::string(token), 0, hash});
      *slot = {upper(hash), static_cast<uint32_t>(_entries.size())};
    }
    _entries[slot->place - 1].weight += weight;
  }

  // Subtracts the weight of the token at rank `kept` from all, and drops what is then not above 0;
  // of those at 0, as many stay as it takes to keep `kept`.
  void cut(size_t kept) {
    _weights.clear();
    for (const Entry& entry : _entries) _weights.push_back(entry.weight);
    const auto last = _weights.begin() + static_cast<ptrdiff_t>(kept - 1);
    std::nth_element(_weights.begin(), last, _weights.end(), std::greater<>());
    const double least = *last;
    auto tied = std::count(_weights.begin(), last + 1, least);
    std::erase_if(_entries, [&](const Entry& entry) {
      return entry.weight < least || (entry.weight == least && tied-- <= 0);
    });
    TL_ASSERT(_entries.size() == kept);
    std::fill(_slots.begin(), _slots.end(), Slot());
    for (size_t i = 0; i < _entries.size(); ++i) {
      Entry& entry = _entries[i];
      entry.weight -= least;
      *slotOf(entry.token, entry.hash) = {upper(entry.hash), static_cast<uint32_t>(i + 1)};
    }
  }

 private:
  struct Slot {
    uint32_t tag = 0;
    uint32_t place = 0;  // index in _entries plus 1; 0 for a free slot
  };

  static size_t hashOf(std::string_view token) { return std::hash<std::string_view>()(token); }
  static uint32_t upper(size_t hash) { return static_cast<uint32_t>(hash >> 32); }

  // The slot that holds the token, or the free slot where it belongs.
  Slot* slotOf(std::string_view token, size_t hash) {
    const size_t mask = _slots.size() - 1;
    for (size_t at = hash & mask;; at = (at + 1) & mask) {
      Slot& slot = _slots[at];
      if (slot.place == 0) return &slot;
      if (slot.tag == upper(hash) && _entries[slot.place - 1].token == token) return &slot;
    }
  }

  std::vector<Slot> _slots;
  std::vector<Entry> _entries;
  std::vector<double> _weights;  // reused to avoid allocation
};

// One pass: calls `visit` with each token of each zone and its weight.
template <typename Visit>
void forEachToken(const salt::Index& index, const ZoneScore& zoneScore,
                  const TokenStarts& tokenizer, const std::function<bool()>& goOn,
                  const Visit& visit) {
  index.ForEachZone([&](uint32_t docID, uint16_t zone, std::string_view text) {
    if (goOn && !goOn()) return false;
    const double weight = zoneScore(docID, zone);
    std::vector<uint32_t> offsets = tokenizer(text);
    offsets.push_back(static_cast<uint32_t>(text.size()));
    for (size_t i = 0; i + 1 < offsets.size(); ++i) {
      const size_t size = offsets[i + 1] - offsets[i];
      if (size <= kMaxTokenBytes) visit(text.substr(offsets[i], size), weight);
    }
    return true;
  });
}

bool isLetter(char byte) {
  return (byte >= 'a' && byte <= 'z') || (byte >= 'A' && byte <= 'Z');
}

template <typename InToken>
std::vector<uint32_t> startsOf(std::string_view text, const InToken& inToken) {
  std::vector<uint32_t> starts;
  bool before = false;
  for (size_t i = 0; i < text.size(); ++i) {
    const bool now = inToken(text[i]);
    if (now && !before) starts.push_back(static_cast<uint32_t>(i));
    before = now;
  }
  return starts;
}

}  // namespace

std::vector<std::pair<std::string, double>> TopKTokens(const salt::Index& index, size_t k,
                                                       const ZoneScore& zoneScore,
                                                       const TokenStarts& tokenizer,
                                                       const std::function<bool()>& goOn) {
  const size_t minSize = std::max(k, kMinCandidates);
  const size_t maxSize = minSize + minSize / 2;
  TokenWeights tokenScores(maxSize + 1);
  forEachToken(index, zoneScore, tokenizer, goOn, [&](std::string_view token, double weight) {
    tokenScores.addOrInsert(token, weight);
    if (tokenScores.size() > maxSize) tokenScores.cut(minSize);
  });
  for (auto& entry : tokenScores.entries()) entry.weight = 0;
  forEachToken(index, zoneScore, tokenizer, goOn,
               [&](std::string_view token, double weight) { tokenScores.add(token, weight); });
  std::vector<std::pair<std::string, double>> result;
  result.reserve(tokenScores.size());
  for (auto& entry : tokenScores.entries()) {
    result.emplace_back(std::move(entry.token), entry.weight);
  }
  std::sort(result.begin(), result.end(), [](const auto& left, const auto& right) {
    return left.second > right.second || (left.second == right.second && left.first < right.first);
  });
  result.resize(std::min(result.size(), k));
  return result;
}

std::vector<uint32_t> TokenizeSpace(std::string_view text) {
  return startsOf(text, [](char byte) { return byte != ' '; });
}

std::vector<uint32_t> TokenizeAlphanum(std::string_view text) {
  return startsOf(text, isLetter);
}

}  // namespace saltsearch
