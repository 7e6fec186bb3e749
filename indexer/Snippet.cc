#include "indexer/Snippet.h"

#include <unicode/brkiter.h>
#include <unicode/locid.h>
#include <unicode/utext.h>

#include <algorithm>
#include <memory>

namespace {

constexpr size_t kSnippetUnits = 300;  // reading stops once the output has this many
constexpr char16_t kLineBreakSign = u'\u2008';
// How far around the cut to look for a character of many units.
constexpr size_t kMaxCharacterUnits = 64;

bool isLineBreak(char16_t unit) {
  return unit == u'\n' || unit == u'\r';
}
bool isSpaceOrTab(char16_t unit) {
  return unit == u'\t' || unit == u' ' || unit == u'\u00A0';
}
bool isSkippedAtStart(char16_t unit) {
  return isLineBreak(unit) || isSpaceOrTab(unit) || unit == u'\uFFFC';
}

// The start of the composed character that contains body[at], and its length in units.
struct Character {
  size_t start;
  size_t length;
};

Character characterAround(TLStringView body, size_t at) {
  const size_t from = at > kMaxCharacterUnits ? at - kMaxCharacterUnits : 0;
  const TLStringView window = body.substr(from, 2 * kMaxCharacterUnits);
  UErrorCode status = U_ZERO_ERROR;
  thread_local const std::unique_ptr<icu::BreakIterator> iterator(
      icu::BreakIterator::createCharacterInstance(icu::Locale::getRoot(), status));
  if (iterator == nullptr) return {at, 1};
  UText text = UTEXT_INITIALIZER;
  status = U_ZERO_ERROR;
  utext_openUChars(&text, window.data(), static_cast<int64_t>(window.size()), &status);
  iterator->setText(&text, status);
  const auto position = static_cast<int32_t>(at - from);
  const int32_t end = iterator->following(position);
  const int32_t start = iterator->previous();
  utext_close(&text);
  if (U_FAILURE(status) || start < 0 || end < start) return {at, 1};
  return {from + static_cast<size_t>(start), static_cast<size_t>(end - start)};
}

}  // namespace

std::optional<TLString> snippetOfBody(const std::optional<TLString>& body) {
  if (!body || body->empty()) return std::nullopt;
  const auto first = std::find_if_not(body->begin(), body->end(), isSkippedAtStart);
  if (first == body->end()) return body;

  TLString out;
  out.reserve(kSnippetUnits + 2);
  size_t pendingLineBreaks = 0;
  bool blank = false;
  auto at = static_cast<size_t>(first - body->begin());
  for (; at < body->size() && out.size() < kSnippetUnits; ++at) {
    const char16_t unit = (*body)[at];
    if (isLineBreak(unit)) {
      ++pendingLineBreaks;
      blank = false;
    } else if (isSpaceOrTab(unit)) {
      if (!blank) out += u' ';
      blank = true;
    } else {
      out.append(std::min<size_t>(pendingLineBreaks, 2), kLineBreakSign);
      pendingLineBreaks = 0;
      blank = false;
      out += unit;
    }
  }
  if (at < body->size()) {
    const Character last = characterAround(*body, at - 1);
    if (last.length > 1) out.resize(out.size() - std::min(out.size(), at - last.start));
  }
  if (out.empty()) return std::nullopt;
  return out;
}
