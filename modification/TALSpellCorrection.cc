#include "modification/TALSpellCorrection.h"

#include <algorithm>
#include <utility>

#include "modification/TermTokens.h"
#include "modification/WeightedDistance.h"
#include "platform/Redaction.h"
#include "salt/Alternatives.h"

namespace {

// Bounds in bytes of tokens to correct, including a trailing space.
constexpr size_t kMinTokenBytes = 2;
constexpr size_t kMaxTokenBytes = 21;
// Minimum number of letters of a word for the deletion of one.
constexpr size_t kMinLettersForDeletion = 4;

// A candidate counts as absent if none of its first suffixes, this many, is in a zone of the term.
constexpr size_t kProbeSuffixes = 5;
constexpr saltsearch::Options kScoring{1, 1000000, 0.02};

// Bounds in bytes of vocabulary words to compare.
constexpr size_t kMinEntryBytes = 3;
constexpr size_t kMaxEntryBytes = 20;
constexpr float kMaxDistance = 4.0F;
constexpr float kMaxWeightedDistance = 1.2F;
constexpr float kMinScore = 0.9F;

// Scores of an edit at the first, a middle and the last position.
struct EditScores {
  float first;
  float middle;
  float last;

  [[nodiscard]] float at(size_t position, size_t lastPosition) const {
    if (position == 0) return first;
    return position == lastPosition ? last : middle;
  }
};
constexpr EditScores kSwap{0.61F, 0.7F, 0.62F};
constexpr EditScores kDelete{0.6F, 0.72F, 0.79F};
constexpr EditScores kReplace{0.73F, 0.8F, 0.81F};
constexpr EditScores kInsert{0.55F, 0.82F, 0.82F};  // before a position, so never at the end
constexpr float kAppend = 0.75F;

std::string redacted(std::string_view token) {
  return platform::redacted(platform::fromUTF8(token));
}

bool isPrintableASCII(std::string_view word) {
  return std::all_of(word.begin(), word.end(), [](char c) { return c >= 0x20 && c <= 0x7E; });
}

// 1 minus the distance divided by the longer word's length; nullopt for words too far apart.
std::optional<float> closeness(std::string_view word, std::string_view entry) {
  const float d = weightedDistance(word, entry, kMaxDistance, kMaxWeightedDistance);
  const auto longer = static_cast<float>(std::max(word.size(), entry.size()));
  if (d >= std::max(longer, kMaxDistance) || d < 0 || longer == 0) return std::nullopt;
  const float score = 1 - d / longer;
  return score > kMinScore ? std::optional(score) : std::nullopt;
}

}  // namespace

const platform::Log& TALSpellCorrection::log() {
  static const platform::Log handle(platform::kSubsystem, "TALSpellCorrection");
  return handle;
}

TALSpellCorrection::TALSpellCorrection(std::shared_ptr<const TALTopKVocab> topKVocab,
                                       int64_t candidateBudget, int64_t inLexiconCandidateBudget)
    : _candidateBudget(candidateBudget),
      _inLexiconCandidateBudget(inLexiconCandidateBudget),
      _topKVocab(std::move(topKVocab)) {}

const std::array<std::string, 26>& TALSpellCorrection::kLettersEn() {
  static const std::array<std::string, 26> letters = [] {
    std::array<std::string, 26> made;
    for (size_t i = 0; i < made.size(); ++i) made[i] = static_cast<char>('a' + i);
    return made;
  }();
  return letters;
}

bool TALSpellCorrection::_doNotCorrect(const saltsearch::Term& term) {
  if (!term.isUnigram || term.found || term.tokens.empty() || term.tokenScores.empty()) return true;
  const size_t size = term.tokens[0].size();
  return size < kMinTokenBytes || size > kMaxTokenBytes;
}

float TALSpellCorrection::correctSpelling(const std::vector<saltsearch::Term>& terms,
                                          std::vector<saltsearch::Term>& correctedTerms,
                                          const salt::Index& withTextStore) const {
  const auto mayCorrect = [](const saltsearch::Term& term) { return !_doNotCorrect(term); };
  const auto found = std::find_if(terms.begin(), terms.end(), mayCorrect);
  if (found == terms.end()) {
    log().standard("Skipping spelling correction as criteria not met.");
    return -1;
  }
  if (std::any_of(found + 1, terms.end(), mayCorrect)) {
    log().standard("Skipping spelling correction as more than 1 term has no-matched document.");
    return -1;
  }
  const auto target = static_cast<size_t>(found - terms.begin());
  const std::string& word = found->tokens[0];
  log().standard("No match token <{}> is considered for spelling correction.", redacted(word));
  std::vector<TALCorrectionCandidate> candidates = _getCandidates(word, *found, withTextStore);
  if (candidates.empty()) {
    log().standard("No candidates found in lexicon.");
    return -1;
  }
  log().standard("Found {} candidates in lexicon.", candidates.size());

  score(terms, target, withTextStore, &candidates);
  // The first generated wins a tie.
  const auto best = std::max_element(
      candidates.begin(), candidates.end(),
      [](const auto& a, const auto& b) { return a._scoreOverall < b._scoreOverall; });
  if (best->_scoreTopicality <= 0) {
    log().standard("Best spelling candidate <{}> has sub-zero textScore.", redacted(best->_token));
    log().standard("Spelling correction returns score -1.");
    return -1;
  }
  log().standard(
      "Spelling returns best candidate with overall score: {:f}, error score: {:f}, text score: "
      "{:f}. Term <{}> modified with candidate <{}>.",
      best->_scoreOverall, best->_scoreError, best->_scoreTopicality, redacted(word),
      redacted(best->_token));
  std::vector<saltsearch::Term> corrected = terms;
  corrected[target].tokens[0] = best->_token;
  corrected[target].tokenScores[0] = 1.0;
  correctedTerms = std::move(corrected);
  return best->_scoreOverall;
}

// Scores each candidate by a search with the whole query.
void TALSpellCorrection::score(const std::vector<saltsearch::Term>& terms, size_t target,
                               const salt::Index& textStore,
                               std::vector<TALCorrectionCandidate>* candidates) {
  std::vector<std::string> tokens;
  tokens.reserve(candidates->size());
  for (const auto& candidate : *candidates) tokens.push_back(candidate._token);
  const auto best = saltsearch::BestScores(textStore, terms, target, tokens, kScoring);
  for (size_t i = 0; i < candidates->size(); ++i) {
    TALCorrectionCandidate& candidate = (*candidates)[i];
    if (best[i]) {
      candidate._scoreTopicality =
          std::max(candidate._scoreTopicality, static_cast<float>(*best[i]));
    }
    candidate._scoreOverall = candidate._scoreError + candidate._scoreTopicality;
  }
}

std::vector<TALCorrectionCandidate> TALSpellCorrection::_getCandidates(
    std::string_view word, saltsearch::Term term, const salt::Index& textStore) const {
  const bool wholeWord = word.ends_with(' ');
  word = modification::withoutTrailingSpace(word);
  if (!isPrintableASCII(word)) {
    log().debug("Token has unsupported char.");
  } else {
    term.tokenScores[0] = 1.0;
    auto candidates = _foundInIndex(editOneCandidates(word), wholeWord, term, textStore);
    if (!candidates.empty()) return candidates;
  }
  log().standard(
      "Spelling did not find any candidate from edit distance 1. Continue with topK method.");
  return _getCandidatesFromTopKVocab(word, !wholeWord);
}

std::vector<TALCorrectionCandidate> TALSpellCorrection::_foundInIndex(
    std::vector<TALCorrectionCandidate> candidates, bool wholeWord, const saltsearch::Term& term,
    const salt::Index& textStore) const {
  std::vector<std::string> tokens;
  tokens.reserve(candidates.size());
  for (auto& candidate : candidates) {
    if (wholeWord) candidate._token += ' ';
    tokens.push_back(candidate._token);
  }
  const auto found = saltsearch::AnyDocument(textStore, term, tokens, kProbeSuffixes);
  std::vector<TALCorrectionCandidate> kept;
  for (size_t i = 0; i < candidates.size(); ++i) {
    if (static_cast<int64_t>(kept.size()) >= _inLexiconCandidateBudget) break;
    if (found[i]) kept.push_back(std::move(candidates[i]));
  }
  return kept;
}

std::vector<TALCorrectionCandidate> TALSpellCorrection::editOneCandidates(
    std::string_view word) const {
  std::vector<TALCorrectionCandidate> candidates;
  const size_t n = word.size();
  if (n < 2) return candidates;
  // False once the budget is used up.
  const auto add = [&](std::string token, float scoreError) {
    if (static_cast<int64_t>(candidates.size()) >= _candidateBudget) return false;
    candidates.push_back({scoreError, 0, 0, std::move(token)});
    return true;
  };
  const auto with = [word](size_t at, size_t removed, std::string_view letters) {
    return std::string(word).replace(at, removed, letters);
  };
  bool more = true;
  for (size_t i = 0; more && i < n; ++i) {
    if (i + 1 < n && word[i] != word[i + 1]) {
      const char swapped[] = {word[i + 1], word[i]};
      more = add(with(i, 2, {swapped, 2}), kSwap.at(i, n - 2));
    }
    if (more && n >= kMinLettersForDeletion) more = add(with(i, 1, ""), kDelete.at(i, n - 1));
    for (const std::string& letter : kLettersEn()) {
      if (more && letter[0] != word[i]) more = add(with(i, 1, letter), kReplace.at(i, n - 1));
    }
    for (const std::string& letter : kLettersEn()) {
      if (more) more = add(with(i, 0, letter), kInsert.at(i, n));
    }
  }
  for (const std::string& letter : kLettersEn()) {
    if (more) more = add(with(n, 0, letter), kAppend);
  }
  return candidates;
}

// The array is immutable, so a rebuild that ends meanwhile does no harm.
std::vector<TALCorrectionCandidate> TALSpellCorrection::_getCandidatesFromTopKVocab(
    std::string_view word, bool) const {
  std::vector<TALCorrectionCandidate> candidates;
  const auto vocab = _topKVocab == nullptr ? nullptr : _topKVocab->vocab();
  log().standard("topKVocab has {} entries.", vocab == nullptr ? 0 : vocab->size());
  if (vocab == nullptr) return candidates;
  for (const std::string& entry : *vocab) {
    if (entry.size() < kMinEntryBytes || entry.size() > kMaxEntryBytes) continue;
    const auto score = closeness(word, modification::withoutTrailingSpace(entry));
    if (!score) continue;
    if (static_cast<int64_t>(candidates.size()) >= _candidateBudget) break;
    candidates.push_back({*score, 0, 0, entry});
  }
  return candidates;
}
