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

// Removes case and accents: compatibility decomposition, case folding, marks dropped.
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

// Calls body(text, isWord) for each run of word characters and each run of other characters.
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

namespace {

std::vector<icu::UnicodeString> foldedWords(const std::vector<std::string>& words) {
  std::vector<icu::UnicodeString> all;
  for (const std::string& word : words) all.push_back(fold(platform::fromUTF8(word)));
  return all;
}

// The index of the first word that is a prefix of the run; the number of words if there is none. In
// scripts without spaces between words, a match may be anywhere in the run.
size_t matchOf(TLStringView run, const std::vector<icu::UnicodeString>& words) {
  const icu::UnicodeString bare = fold(run);
  const auto found = std::find_if(words.begin(), words.end(), [&](const auto& wanted) {
    if (wanted.isEmpty()) return false;
    return bare.startsWith(wanted) || (wanted.char32At(0) >= 0x2E80 && bare.indexOf(wanted) >= 0);
  });
  return static_cast<size_t>(found - words.begin());
}

// The place of a match in a text, and the index of its word.
struct Place {
  size_t at;
  size_t word;
};

// The first place after which the given number of characters contains the most different words. A
// sliding window with a count for each word.
size_t bestPlace(const std::vector<Place>& places, size_t words, size_t characters) {
  std::vector<size_t> counts(words);
  size_t best = 0;
  size_t most = 0;
  size_t different = 0;
  for (size_t first = 0, end = 0; first < places.size(); ++first) {
    for (; end < places.size() && places[end].at < places[first].at + characters; ++end) {
      if (counts[places[end].word]++ == 0) ++different;
    }
    if (different > most) best = first;
    most = std::max(most, different);
    if (--counts[places[first].word] == 0) --different;
  }
  return places[best].at;
}

bool isSpace(char16_t c) {
  return u_isUWhiteSpace(c) != 0;
}

// Replaces each run of white space by one space.
std::string oneLine(TLStringView text) {
  TLString line;
  for (const char16_t c : text) {
    if (!isSpace(c)) line.push_back(c);
    if (isSpace(c) && !line.empty() && line.back() != u' ') line.push_back(u' ');
  }
  while (line.ends_with(u' ')) line.pop_back();
  return platform::toUTF8(line);
}

}  // namespace

bool holdsWord(std::string_view text, const std::vector<std::string>& words) {
  const auto wanted = foldedWords(words);
  bool found = false;
  forEachRun(platform::fromUTF8(text), [&](TLStringView run, bool word) {
    found = found || (word && matchOf(run, wanted) < wanted.size());
  });
  return found;
}

std::string passageOf(std::string_view text, const std::vector<std::string>& words,
                      size_t characters) {
  const auto wanted = foldedWords(words);
  const TLString units = platform::fromUTF8(text);
  std::vector<Place> places;
  size_t at = 0;
  forEachRun(units, [&](TLStringView run, bool word) {
    const size_t match = word ? matchOf(run, wanted) : wanted.size();
    if (match < wanted.size()) places.push_back({at, match});
    at += run.size();
  });
  if (places.empty()) return {};
  const size_t hit = bestPlace(places, wanted.size(), characters / 2);
  // A quarter of the passage precedes the match; words at both ends stay complete.
  size_t begin = hit - std::min(hit, characters / 4);
  size_t end = std::min(units.size(), begin + characters);
  while (begin > 0 && begin < hit && !isSpace(units[begin - 1])) ++begin;
  while (end < units.size() && end > hit + 1 && !isSpace(units[end])) --end;
  if (end == hit + 1) end = std::min(units.size(), hit + characters / 2);
  return (begin > 0 ? "… " : "") + oneLine(TLStringView(units).substr(begin, end - begin)) +
         (end < units.size() ? " …" : "");
}

std::string highlight(std::string_view text, const std::vector<std::string>& words,
                      std::string_view begin, std::string_view end) {
  if (begin.empty() || words.empty()) return std::string(text);
  const auto wanted = foldedWords(words);
  std::string out;
  forEachRun(platform::fromUTF8(text), [&](TLStringView run, bool word) {
    const bool match = word && matchOf(run, wanted) < wanted.size();
    if (match) out += begin;
    platform::appendUTF8(run, out);
    if (match) out += end;
  });
  return out;
}

}  // namespace cli
