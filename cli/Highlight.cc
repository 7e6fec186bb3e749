#include "cli/Highlight.h"

#include <unicode/normalizer2.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>
#include <unicode/utf16.h>

#include <algorithm>

#include "platform/Text.h"

namespace cli {

namespace {

bool isWordCharacter(UChar32 c) {
  return u_isalnum(c) || (U_GET_GC_MASK(c) & U_GC_M_MASK) != 0;
}

// Case and accents off: compatibility decomposition, folded, without marks.
icu::UnicodeString fold(TLStringView word) {
  UErrorCode status = U_ZERO_ERROR;
  const icu::Normalizer2* folding = icu::Normalizer2::getNFKCCasefoldInstance(status);
  const icu::Normalizer2* decomposing = icu::Normalizer2::getNFDInstance(status);
  if (U_FAILURE(status)) return {};
  const icu::UnicodeString whole(word.data(), static_cast<int32_t>(word.size()));
  const icu::UnicodeString parts =
      decomposing->normalize(folding->normalize(whole, status), status);
  icu::UnicodeString bare;
  for (int32_t i = 0; i < parts.length(); i = parts.moveIndex32(i, 1)) {
    const UChar32 c = parts.char32At(i);
    if (u_charType(c) != U_NON_SPACING_MARK) bare.append(c);
  }
  return bare;
}

// Calls body(text, isWord) for each run of word characters and each run of others.
template <typename Body>
void forEachRun(TLStringView text, const Body& body) {
  size_t begin = 0;
  bool inWord = false;
  for (size_t i = 0; i < text.size();) {
    const size_t at = i;
    UChar32 c;
    U16_NEXT(text.data(), i, text.size(), c);
    const bool word = isWordCharacter(c);
    if (word != inWord && at > begin) {
      body(text.substr(begin, at - begin), inWord);
      begin = at;
    }
    inWord = word;
  }
  if (begin < text.size()) body(text.substr(begin), inWord);
}

}  // namespace

std::vector<std::string> queryWords(std::string_view query) {
  std::vector<std::string> words;
  forEachRun(platform::fromUTF8(query), [&](TLStringView run, bool word) {
    if (word) words.push_back(platform::toUTF8(run));
  });
  return words;
}

std::string highlight(std::string_view text, const std::vector<std::string>& words,
                      std::string_view begin, std::string_view end) {
  if (begin.empty() || words.empty()) return std::string(text);
  std::vector<icu::UnicodeString> folded;
  for (const std::string& word : words) folded.push_back(fold(platform::fromUTF8(word)));
  std::string out;
  forEachRun(platform::fromUTF8(text), [&](TLStringView run, bool word) {
    const icu::UnicodeString bare = word ? fold(run) : icu::UnicodeString();
    // Scripts without blanks between words match anywhere in a run.
    const bool match = word && std::any_of(folded.begin(), folded.end(), [&](const auto& wanted) {
                         if (wanted.isEmpty()) return false;
                         return bare.startsWith(wanted) ||
                                (wanted.char32At(0) >= 0x2E80 && bare.indexOf(wanted) >= 0);
                       });
    if (match) out += begin;
    platform::appendUTF8(run, out);
    if (match) out += end;
  });
  return out;
}

}  // namespace cli
