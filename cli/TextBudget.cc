#include "cli/TextBudget.h"

#include <unicode/normalizer2.h>
#include <unicode/unistr.h>
#include <unicode/utf16.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <memory>

#include "platform/Assert.h"

namespace cli {

namespace {

constexpr size_t kCharacters = 0x110000;

// The terminator of one text and the separator before the next.
constexpr size_t kTextOverhead = 2;

size_t computeCost(char32_t character) {
  UErrorCode status = U_ZERO_ERROR;
  const icu::Normalizer2* folding = icu::Normalizer2::getNFKCCasefoldInstance(status);
  TL_ASSERT(U_SUCCESS(status));
  const auto original = static_cast<UChar32>(character);
  const icu::UnicodeString folded = folding->normalize(icu::UnicodeString(original), status);
  size_t cost = 0;
  UChar32 last = 0;
  for (int32_t i = 0; i < folded.length(); i += U16_LENGTH(last)) {
    last = folded.char32At(i);
    cost += static_cast<size_t>(U8_LENGTH(last)) + (last < 0x80 ? 0 : 1);
  }
  // A character that folds to ASCII can still end a word.
  if (last < 0x80) ++cost;
  return std::max(cost, static_cast<size_t>(U8_LENGTH(original)) + 1);
}

}  // namespace

size_t zoneCostOf(char32_t character) {
  // Filled on demand. One per thread, so no lock is needed.
  thread_local const std::unique_ptr<uint8_t[]> known = std::make_unique<uint8_t[]>(kCharacters);
  if (character < 0x80) return 1;
  if (character >= kCharacters) return 4;
  uint8_t& cost = known[character];
  if (cost == 0) cost = static_cast<uint8_t>(std::min<size_t>(computeCost(character), 255));
  return cost;
}

TLStringView TextBudget::take(TLStringView text) {
  if (text.empty()) return text;
  size_t left = _left < kTextOverhead ? 0 : _left - kTextOverhead;
  bool afterASCII = false;
  size_t i = 0;
  while (i < text.size()) {
    if (const size_t run = std::min(platform::asciiPrefixLength(text.substr(i)), left); run > 0) {
      left -= run;  // each character costs 1
      i += run;
      afterASCII = true;
      continue;
    }
    size_t next = i;
    char32_t c;
    U16_NEXT(text.data(), next, text.size(), c);
    const bool ascii = c < 0x80;
    const size_t cost = zoneCostOf(c) + (!ascii && afterASCII ? 1 : 0);
    if (cost > left) break;
    left -= cost;
    afterASCII = ascii;
    i = next;
  }
  _left = left;
  if (i < text.size()) _exhausted = true;
  return text.substr(0, i);
}

TLStringView TextBudget::takeMarkup(TLStringView text) {
  const TLStringView taken = take(text);
  if (taken.size() == text.size()) return taken;
  const size_t open = taken.rfind(u'<');
  if (open == TLStringView::npos || taken.find(u'>', open) != TLStringView::npos) return taken;
  return taken.substr(0, open);
}

}  // namespace cli
