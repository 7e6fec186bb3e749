#include "salt/TopTokens.h"

#include <algorithm>
#include <unordered_map>

#include "platform/Assert.h"

namespace saltsearch {

namespace {

constexpr size_t kLeastCandidates = 100;  // keeps the summary meaningful for a small k

// Lets a map of strings be asked for a view.
struct ViewHash {
  using is_transparent = void;
  size_t operator()(std::string_view bytes) const { return std::hash<std::string_view>()(bytes); }
};
using TokenScores = std::unordered_map<std::string, double, ViewHash, std::equal_to<>>;

// Takes the weight of the token at place `kept` from all, and drops what is not above it; of those
// equal to it, as many stay as it takes to keep `kept`.
void cut(TokenScores* tokenScores, size_t kept, std::vector<double>* weights) {
  weights->clear();
  for (const auto& [token, weight] : *tokenScores) weights->push_back(weight);
  const auto last = weights->begin() + static_cast<ptrdiff_t>(kept - 1);
  std::nth_element(weights->begin(), last, weights->end(), std::greater<>());
  const double least = *last;
  auto tied = std::count(weights->begin(), last + 1, least);
  for (auto entry = tokenScores->begin(); entry != tokenScores->end();) {
    const bool stays = entry->second > least || (entry->second == least && tied-- > 0);
    entry->second -= least;
    entry = stays ? std::next(entry) : tokenScores->erase(entry);
  }
  TL_ASSERT(tokenScores->size() == kept);
}

// One pass: hands each token of each zone to `visit` together with its weight.
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
      if (size <= kMostTokenBytes) visit(text.substr(offsets[i], size), weight);
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
  const size_t minSize = std::max(k, kLeastCandidates);
  const size_t maxSize = minSize + minSize / 2;
  TokenScores tokenScores;
  tokenScores.reserve(maxSize + 1);
  std::vector<double> weights;
  forEachToken(index, zoneScore, tokenizer, goOn, [&](std::string_view token, double weight) {
    if (const auto known = tokenScores.find(token); known != tokenScores.end()) {
      known->second += weight;
      return;
    }
    tokenScores.emplace(token, weight);
    if (tokenScores.size() > maxSize) cut(&tokenScores, minSize, &weights);
  });
  for (auto& [token, weight] : tokenScores) weight = 0;
  forEachToken(index, zoneScore, tokenizer, goOn, [&](std::string_view token, double weight) {
    if (const auto known = tokenScores.find(token); known != tokenScores.end()) {
      known->second += weight;
    }
  });
  std::vector<std::pair<std::string, double>> result(tokenScores.begin(), tokenScores.end());
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
