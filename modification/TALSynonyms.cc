#include "modification/TALSynonyms.h"

#include <unicode/locid.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>

#include <algorithm>
#include <optional>
#include <unordered_set>

#include "modification/TermTokens.h"
#include "platform/Files.h"
#include "platform/Redaction.h"
#include "platform/Text.h"
#include "platform/TextFile.h"

namespace {

// A word with any of these characters is skipped.
constexpr TLStringView kUnacceptableCharSet = u"!~`@#$%^&*-+();:=_{}[],.<>?\\/|\"'0123456789";
static_assert(kUnacceptableCharSet.size() == 42);

// Characters that end a line.
constexpr TLStringView kNewlines = u"\n\v\f\r\u0085\u2028\u2029";

// For the search that scores a synonym.
constexpr saltsearch::Options kScoring{.maxResults = 5, .maxSuffixes = 1000000, .threshold = 0.02};

TLStringView trimmed(TLStringView text) {
  while (!text.empty() && u_isblank(text.front())) text.remove_prefix(1);
  while (!text.empty() && u_isblank(text.back())) text.remove_suffix(1);
  return text;
}

// Lowercases and trims; empty for a rejected word.
std::string _cleanWord(TLStringView word, TLStringView unacceptableCharSet) {
  if (word.find_first_of(unacceptableCharSet) != TLStringView::npos) return {};
  word = trimmed(word);
  icu::UnicodeString lower(word.data(), static_cast<int32_t>(word.size()));
  lower.toLower(icu::Locale::getRoot());
  return platform::toUTF8({lower.getBuffer(), static_cast<size_t>(lower.length())});
}

// Splits `text` at the characters of `separators` and calls `take` with each piece until it returns
// false.
template <typename Take>
void forEachPiece(TLStringView text, TLStringView separators, const Take& take) {
  for (;;) {
    const size_t end = text.find_first_of(separators);
    if (!take(text.substr(0, end)) || end == TLStringView::npos) return;
    text.remove_prefix(end + 1);
  }
}

void addLine(TLStringView line, TALSynonyms::Vocab& vocab) {
  std::string headword;
  std::vector<std::string> synonyms;
  std::unordered_set<std::string> known;
  bool first = true;
  forEachPiece(line, u",", [&](TLStringView field) {
    std::string word = _cleanWord(field, kUnacceptableCharSet);
    if (first) {
      first = false;
      headword = word;
      known.insert(std::move(word));
      return !headword.empty() && !vocab.contains(headword);
    }
    if (!word.empty() && known.insert(word).second) synonyms.push_back(std::move(word));
    return true;
  });
  if (synonyms.empty()) return;
  synonyms.shrink_to_fit();
  vocab.emplace(std::move(headword), std::move(synonyms));
}

std::string redacted(std::string_view text) {
  return platform::redacted(platform::fromUTF8(text));
}

}  // namespace

const platform::Log& TALSynonyms::log() {
  static constexpr platform::Log handle(platform::kSubsystem, "TALSynonyms");
  return handle;
}

const std::vector<std::string>* TALSynonyms::synonyms(std::string_view word) const {
  const auto entry = _vocab.find(std::string(word));
  return entry == _vocab.end() ? nullptr : &entry->second;
}

std::vector<std::pair<std::string, float>> TALSynonyms::getSynonymsScores(
    std::string_view word) const {
  std::vector<std::pair<std::string, float>> scores;
  if (const auto* found = synonyms(word)) {
    for (const std::string& synonym : *found) scores.emplace_back(synonym, kSynonymScore);
  }
  return scores;
}

bool TALSynonyms::loadSynonymsFromFile(const std::string& path, TLErrorOut error) {
  log().standard("Loading synonym from file: {}", path);
  if (!platform::fileExists(path)) {
    log().error("Failed to load synonym file: {}", path);
    platform::setError(error, {"TALSynonyms", static_cast<int>(TALSynonymsError::noFile),
                               "Synonym file: " + path + " does not exist"});
    return false;
  }
  std::optional<TLError> failure;
  const auto text = platform::readTextFile(path, kMaxFileBytes, &failure);
  if (!text) {
    log().error("Failed to read synonym file: {} with error: {}", path,
                platform::printable(failure));
    platform::setError(error, *failure);
    return false;
  }
  if (text->empty()) {
    log().error("Empty synonym file: {}", path);
    return false;
  }
  Vocab vocab;
  forEachPiece(*text, kNewlines, [&vocab](TLStringView line) {
    addLine(line, vocab);
    return true;
  });
  setSynonymVocab(std::move(vocab));
  log().standard("Loaded {} synonyms from file: {}", _vocab.size(), path);
  return true;
}

float TALSynonyms::synonymExpansion(const std::vector<saltsearch::Term>& terms,
                                    std::vector<saltsearch::Term>& expandedTerms,
                                    const salt::Index& withTextStore) const {
  constexpr float kNoExpansion = -1.0F;
  const size_t target = targetOf(terms);
  if (target == terms.size()) return kNoExpansion;
  const std::string& token = terms[target].tokens.front();
  const std::string word(modification::withoutTrailingSpace(token));
  if (word.size() == token.size()) {
    log().standard("Skipping synonym expansion for <{}> as it doesn't have a trailing space",
                   redacted(word));
    return kNoExpansion;
  }
  // Not redacted, because the word occurs in no document.
  log().standard("No match token <{}> is considered for synonym expansion.", word);
  const auto* known = synonyms(word);
  if (known == nullptr) {
    log().standard("Skipping synonym expansion for <{}> as it has no synonym in the vocab.",
                   redacted(word));
    return kNoExpansion;
  }
  const auto present = presentSynonyms(terms[target], *known, withTextStore);
  if (present.empty()) {
    log().standard(
        "Skipping synonym expansion for <{}> as none of its {} synonyms are present in index.",
        redacted(word), known->size());
    return kNoExpansion;
  }
  log().standard("Found {} out of {} synonyms in index", present.size(), known->size());
  expandedTerms = terms;
  const Best best = bestSynonym(present, target, expandedTerms, withTextStore);
  if (best.score <= 0) {
    log().standard(
        "Synonym expansion returns score -1, as best candidate synonym <{}> has sub-zero "
        "textScore.",
        redacted(best.synonym));
    return kNoExpansion;
  }
  log().standard("Synonym expansion returns score {:f}. Term <{}> modified with best synonym <{}>.",
                 best.score, redacted(word), redacted(best.synonym));
  modification::setFirstToken(expandedTerms[target], best.synonym);
  return best.score;
}

bool TALSynonyms::_doNotExpand(const saltsearch::Term& term) {
  return !modification::isSingleWord(term) || term.found || term.tokens.front().empty();
}

size_t TALSynonyms::targetOf(const std::vector<saltsearch::Term>& terms) {
  size_t target = terms.size();
  for (size_t i = 0; i < terms.size(); ++i) {
    if (_doNotExpand(terms[i])) continue;
    if (target != terms.size()) {
      log().standard("Skipping synonym expansion as more than 1 term has no-matched document");
      return terms.size();
    }
    target = i;
  }
  if (target == terms.size())
    log().standard("Skipping synonym expansion as all terms matched a document");
  return target;
}

std::vector<std::string> TALSynonyms::presentSynonyms(const saltsearch::Term& target,
                                                      const std::vector<std::string>& synonyms,
                                                      const salt::Index& textStore) {
  std::vector<std::string> present;
  for (const std::string& synonym : synonyms) {
    saltsearch::Term probe = target;
    std::string token = synonym + ' ';
    modification::setFirstToken(probe, token);
    if (modification::occurs(std::move(probe), textStore)) present.push_back(std::move(token));
  }
  return present;
}

TALSynonyms::Best TALSynonyms::bestSynonym(const std::vector<std::string>& present, size_t target,
                                           std::vector<saltsearch::Term>& terms,
                                           const salt::Index& textStore) {
  Best best{"", -1.0F};
  for (const std::string& synonym : present) {
    modification::setFirstToken(terms[target], synonym);
    double highest = -1.0;
    for (const auto& result : saltsearch::Search(textStore, terms, kScoring)) {
      highest = std::max(highest, result.score);
    }
    if (static_cast<float>(highest) > best.score) best = {synonym, static_cast<float>(highest)};
  }
  return best;
}
