#include "modification/TALStemRewrite.h"

#include <utility>

#include "modification/Stemmer.h"
#include "modification/TermTokens.h"

namespace {

constexpr size_t kMinTokenBytes = 3;

}  // namespace

const platform::Log& TALStemRewrite::log() {
  static constexpr platform::Log handle(platform::kSubsystem, "TALStemRewrite");
  return handle;
}

bool TALStemRewrite::stemRewrite(const std::vector<saltsearch::Term>& terms,
                                 std::vector<saltsearch::Term>& stemmedTerms,
                                 const salt::Index& withTextStore) {
  _textStore = &withTextStore;
  stemmedTerms = terms;
  size_t changed = 0;
  for (saltsearch::Term& term : stemmedTerms) {
    if (_doNotStem(term)) continue;
    if (changed == MAX_TOKENS_TO_STEM) {
      log().standard(
          "Stem rewrite returns with {} query terms modified. MAX_TOKENS_TO_STEM exceeded.",
          changed);
      return true;
    }
    std::string stemToken = getStemToken(term, *_textStore);
    if (stemToken.empty()) {
      log().standard("Skipping stem rewrite as stemToken has no match in the lexicon");
      return false;
    }
    log().standard("Token <{}> is stemmed to <{}>.", term.tokens.front(), stemToken);
    modification::setFirstToken(term, std::move(stemToken));
    ++changed;
  }
  if (changed == 0) {
    log().standard("Stem rewrite returns with NO query term modified.");
    return false;
  }
  log().standard("Stem rewrite returns with {} query term(s) modified.", changed);
  return true;
}

std::string TALStemRewrite::getStemToken(saltsearch::Term term, const salt::Index& textStore) {
  std::string stemToken =
      TALStemWord(modification::withoutTrailingSpace(term.tokens.front()), kMaxStemmedBytes);
  modification::setFirstToken(term, stemToken);
  return modification::occurs(std::move(term), textStore) ? stemToken : std::string();
}

bool TALStemRewrite::_doNotStem(const saltsearch::Term& term) {
  return !modification::isSingleWord(term) || term.tokens.front().size() < kMinTokenBytes;
}
