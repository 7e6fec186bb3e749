#include <algorithm>
#include <optional>
#include <utility>

#include "indexer/TALIndexer.h"
#include "modification/TermTokens.h"

using platform::MutexLock;

namespace {

// Modifiers change the first tokens of terms and keep the number of terms.
WordReplacements replacedWords(const std::vector<saltsearch::Term>& typed,
                               const std::vector<saltsearch::Term>& modified,
                               WordReplacement::Reason reason) {
  WordReplacements words;
  for (size_t i = 0; i < std::min(typed.size(), modified.size()); ++i) {
    if (words.size() == kMaxWordReplacements) break;
    if (!modification::isSingleWord(typed[i]) || modified[i].tokens.empty()) continue;
    const std::string& from = typed[i].tokens.front();
    const std::string& to = modified[i].tokens.front();
    if (from == to || std::max(from.size(), to.size()) > kMaxReplacedWordSize) continue;
    words.push_back({std::string(modification::withoutTrailingSpace(from)),
                     std::string(modification::withoutTrailingSpace(to)), reason});
  }
  return words;
}

}  // namespace

bool TALIndexer::_notSufficientRetrieval(size_t results, int64_t threshold) {
  return results <= static_cast<uint64_t>(threshold);
}

bool TALIndexer::_shouldRunQueryModification(size_t results, int64_t retrievalThreshold) {
  return _notSufficientRetrieval(results, retrievalThreshold);
}

TALIndexer::Found TALIndexer::searchModified(const TLQuery& query,
                                             const std::vector<saltsearch::Term>& saltQueryTerms,
                                             Found firstResults, size_t maxItems, TLErrorOut error,
                                             WordReplacements* replaced) {
  log().standard("Query modification started for query with {} terms", saltQueryTerms.size());
  std::vector<saltsearch::Term> modified;
  auto reason = WordReplacement::Reason::spelling;
  if (!_modifyQueryTerms(saltQueryTerms, modified, *query.searchParams(), reason) ||
      modified.empty()) {
    log().standard("Query modification didnt work out. Return original query results.");
    return firstResults;
  }
  std::optional<TLError> failure;
  Found found;
  {
    MutexLock lock(_indexMutex);
    found = searchOnce(query, modified, maxItems, &failure);
  }
  if (failure) {
    log().error("Failed to search modified query in SALT due to error: {}",
                platform::printable(failure));
    platform::setError(error, *failure);
    return {};
  }
  log().standard("Query modification finished. Results retrieved with modified query terms.");
  if (replaced != nullptr) *replaced = replacedWords(saltQueryTerms, modified, reason);
  return found;
}

// The modifiers read the text index concurrently with ingest.
bool TALIndexer::_modifyQueryTerms(const std::vector<saltsearch::Term>& queryTerms,
                                   std::vector<saltsearch::Term>& modifiedQueryTerms,
                                   const TLParameters& searchParams,
                                   WordReplacement::Reason& reason) {
  const auto text = _text.get();
  if (text == nullptr) return false;
  reason = WordReplacement::Reason::spelling;
  if (searchParams.boolValueForKey("queryModification.enableSpellModification") &&
      modifyWithSpelling(queryTerms, *text, modifiedQueryTerms)) {
    return true;
  }
  reason = WordReplacement::Reason::synonym;
  if (searchParams.boolValueForKey("queryModification.enableSynonymModification") &&
      modifyWithSynonyms(queryTerms, *text, modifiedQueryTerms)) {
    return true;
  }
  reason = WordReplacement::Reason::stem;
  return searchParams.boolValueForKey("queryModification.enableStemModification") &&
         modifyWithStems(queryTerms, *text, modifiedQueryTerms);
}

bool TALIndexer::modifyWithSpelling(const std::vector<saltsearch::Term>& queryTerms,
                                    const OpenText& text,
                                    std::vector<saltsearch::Term>& modifiedQueryTerms) {
  log().standard("Spelling correction started.");
  std::vector<saltsearch::Term> corrected;
  const float score = text.spelling->correctSpelling(queryTerms, corrected, *text.index);
  if (score > 0.0F && !corrected.empty()) {
    modifiedQueryTerms = std::move(corrected);
    log().standard(
        "Spelling correction finished with query modified. Skipping all other query modification.");
    return true;
  }
  log().standard(
      "Spelling correction finished without query modified. Continue with other query "
      "modification.");
  return false;
}

bool TALIndexer::modifyWithSynonyms(const std::vector<saltsearch::Term>& queryTerms,
                                    const OpenText& text,
                                    std::vector<saltsearch::Term>& modifiedQueryTerms) {
  log().standard("Synonyms modification started.");
  std::vector<saltsearch::Term> expanded;
  const float score = _synonymModel.synonymExpansion(queryTerms, expanded, *text.index);
  if (score > 0.0F && !expanded.empty()) {
    modifiedQueryTerms = std::move(expanded);
    log().standard(
        "Synonyms modification finished with query modified. Skipping all other query "
        "modification.");
    return true;
  }
  log().standard(
      "Synonyms modification finished without query modified. Continue with other query "
      "modification.");
  return false;
}

bool TALIndexer::modifyWithStems(const std::vector<saltsearch::Term>& queryTerms,
                                 const OpenText& text,
                                 std::vector<saltsearch::Term>& modifiedQueryTerms) {
  log().standard("Stem rewrite started.");
  std::vector<saltsearch::Term> stemmed;
  if (TALStemRewrite().stemRewrite(queryTerms, stemmed, *text.index)) {
    modifiedQueryTerms = std::move(stemmed);
    log().standard("Stem rewrite finished with query modified.");
    return true;
  }
  log().standard("Stem rewrite finished without query modified.");
  return false;
}
