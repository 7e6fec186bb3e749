#include "tokenizer/TLFallbackTokenizer.h"

#include <unicode/ustring.h>

#include <algorithm>

#include "tokenizer/Tokenizer.h"

namespace {

// Lower case may be longer; ICU returns the required length at the first attempt.
TLString lowered(TLStringView text) {
  const auto length = static_cast<int32_t>(text.size());
  TLString out(text.size(), u'\0');
  for (;;) {
    UErrorCode status = U_ZERO_ERROR;
    const int32_t needed = u_strToLower(out.data(), static_cast<int32_t>(out.size()), text.data(),
                                        length, "", &status);
    const bool fits = status != U_BUFFER_OVERFLOW_ERROR;
    out.resize(U_SUCCESS(status) || !fits ? static_cast<size_t>(needed) : 0);
    if (fits) return out;
  }
}

enum class Kind { digits, other };

Kind kindOf(char16_t unit) {
  return unit >= u'0' && unit <= u'9' ? Kind::digits : Kind::other;
}

}  // namespace

const TLFallbackTokenizer& TLFallbackTokenizer::getObject() {
  static const TLFallbackTokenizer object(true);
  return object;
}

TLString TLFallbackTokenizer::CleanText(TLStringView text) const {
  const TLString lower = lowered(text.substr(0, kMaxTextUnits));
  return _splitNums ? _CleanTextSplitNums(lower) : _CleanText(lower);
}

std::vector<TLString> TLFallbackTokenizer::CleanTokens(TLStringView text) const {
  const TLString clean = CleanText(text);
  if (clean.size() < 2) return {};
  const auto words = platform::split(TLStringView(clean).substr(0, clean.size() - 1), u" ");
  return {words.begin(), words.end()};
}

TLString TLFallbackTokenizer::_CleanText(TLStringView text) {
  TLString out;
  out.reserve(text.size() + 1);
  bool inWord = false;
  for (const char16_t unit : text) {
    const bool special = isSpecialUnit(unit);
    if (!special) out.push_back(unit);
    if (special && inWord) out.push_back(u' ');
    inWord = !special;
  }
  if (inWord) out.push_back(u' ');
  return out;
}

TLString TLFallbackTokenizer::_CleanTextSplitNums(TLStringView text) {
  TLString out;
  out.reserve(text.size() + text.size() / 8 + 1);
  const auto end = text.end();
  for (auto at = std::find_if_not(text.begin(), end, isSpecialUnit); at != end;
       at = std::find_if_not(at, end, isSpecialUnit)) {
    const auto wordEnd = std::find_if(at, end, isSpecialUnit);
    const Kind first = kindOf(*at);
    const auto isFirstKind = [first](char16_t unit) { return kindOf(unit) == first; };
    const auto change = std::find_if_not(at, wordEnd, isFirstKind);
    out.append(at, change);
    if (change != wordEnd && std::none_of(change, wordEnd, isFirstKind)) out.push_back(u' ');
    out.append(change, wordEnd);
    out.push_back(u' ');
    at = wordEnd;
  }
  return out;
}
