#include "tokenizer/lexemon/WordScanner.h"

#include <unicode/uchar.h>
#include <unicode/unorm2.h>
#include <unicode/uscript.h>
#include <unicode/utf16.h>

#include <algorithm>
#include <array>

#include "platform/Assert.h"

namespace lexemon {

namespace {

// A stretch of mixed text includes shorter runs of ASCII, because the iterator takes time to set
// up, and ends at the first white space after the bound.
constexpr size_t kShortASCII = 32;
constexpr size_t kLongStretch = 4096;

enum Kind : uint8_t { kOther, kLetter, kDigit, kMark, kJoiner, kApostrophe };

struct ASCIITable {
  std::array<Kind, 128> kind{};
  std::array<char16_t, 128> lower{};
};

constexpr ASCIITable makeASCIITable() {
  ASCIITable table;
  for (size_t c = 0; c < 128; ++c) {
    const bool upper = c >= 'A' && c <= 'Z';
    table.lower[c] = static_cast<char16_t>(upper ? c + 32 : c);
    if (upper || (c >= 'a' && c <= 'z')) table.kind[c] = kLetter;
    if (c >= '0' && c <= '9') table.kind[c] = kDigit;
  }
  for (const char c : {'.', ',', ';', ':', '_'}) table.kind[static_cast<size_t>(c)] = kJoiner;
  table.kind['\''] = kApostrophe;
  return table;
}

constexpr ASCIITable kASCII = makeASCIITable();

bool isWordKind(Kind kind) {
  return kind == kLetter || kind == kDigit;
}

bool isASCIIWhiteSpace(char16_t c) {
  return c == u' ' || (c >= u'\t' && c <= u'\r');
}

// Removes a possessive s: `joint` is the length of the word where its last apostrophe was dropped.
void dropPossessive(TLString& word, size_t joint) {
  if (joint > 0 && word.size() == joint + 1 && word.back() == u's') word.pop_back();
}

Kind kindOf(UChar32 c) {
  if (c < 128) return kASCII.kind[static_cast<size_t>(c)];
  switch (c) {
    case 0x2018:
    case 0x2019:
    case 0x201B:
    case 0x02BC:
      return kApostrophe;
    default:
      break;
  }
  const uint32_t category = U_GET_GC_MASK(c);
  if ((category & U_GC_ND_MASK) != 0) return kDigit;
  if ((category & (U_GC_L_MASK | U_GC_N_MASK)) != 0) return kLetter;
  if ((category & U_GC_M_MASK) != 0) return kMark;
  return (category & (U_GC_P_MASK | U_GC_S_MASK)) != 0 ? kJoiner : kOther;
}

bool losesAccents(UChar32 c) {
  if (c < 128) return kASCII.kind[static_cast<size_t>(c)] == kLetter;
  UErrorCode status = U_ZERO_ERROR;
  const UScriptCode script = uscript_getScript(c, &status);
  return script == USCRIPT_LATIN || script == USCRIPT_GREEK || script == USCRIPT_CYRILLIC;
}

// The letter without accents. In these scripts a canonical decomposition is one base letter plus
// marks.
UChar32 withoutAccents(UChar32 c) {
  if (c < 0xC0) return c;
  UErrorCode status = U_ZERO_ERROR;
  const UNormalizer2* decomposer = unorm2_getNFDInstance(&status);
  TL_ASSERT(U_SUCCESS(status));
  std::array<char16_t, 32> decomposed;
  const int32_t length = unorm2_getDecomposition(decomposer, c, decomposed.data(),
                                                 int32_t{decomposed.size()}, &status);
  if (length <= 0 || U_FAILURE(status)) return c;
  UChar32 base;
  U16_GET(decomposed.data(), 0, 0, length, base);
  return base;
}

void appendCodePoint(TLString& word, UChar32 c) {
  if (U_IS_BMP(c)) {
    word.push_back(static_cast<char16_t>(c));
  } else {
    word.push_back(U16_LEAD(c));
    word.push_back(U16_TRAIL(c));
  }
}

// Builds one word from folded code points.
class WordBuilder {
 public:
  explicit WordBuilder(TLString& word) : _word(word) { _word.clear(); }

  // False when the word ends before `c`.
  bool add(UChar32 c) {
    const Kind kind = kindOf(c);
    if (isWordKind(kind)) return addWordCharacter(c, kind);
    if (_word.empty()) return true;
    if (_pending != 0) return false;
    if (kind == kMark) {
      if (!_stripMarks) appendCodePoint(_word, c);
      return true;
    }
    if (kind == kApostrophe || (kind == kJoiner && _last == kDigit)) {
      _pending = c;
      _pendingKind = kind;
      return true;
    }
    return false;
  }

  // Completes the word; true if there is one.
  bool finish() {
    dropPossessive(_word, _joint);
    return !_word.empty();
  }

 private:
  bool addWordCharacter(UChar32 c, Kind kind) {
    if (_pending != 0) {
      if (kind != _last) return false;
      if (_pendingKind == kApostrophe) {
        _joint = _word.size();
      } else if (kind == kDigit) {
        appendCodePoint(_word, _pending);
      }
      _pending = 0;
    }
    _stripMarks = losesAccents(c);
    appendCodePoint(_word, _stripMarks ? withoutAccents(c) : c);
    _last = kind;
    return true;
  }

  TLString& _word;
  UChar32 _pending = 0;  // kept if a character of the right kind follows
  Kind _pendingKind = kOther;
  Kind _last = kOther;  // of the last letter or digit
  bool _stripMarks = false;
  size_t _joint = 0;
};

bool nextFoldedWord(FoldedText& text, TLString& word) {
  for (;;) {
    WordBuilder builder(word);
    UChar32 c;
    while ((c = text.next()) >= 0) {
      if (!builder.add(c)) {
        text.unread();
        break;
      }
    }
    if (builder.finish()) return true;
    if (c == FoldedText::kEnd) return false;
  }
}

}  // namespace

WordScanner::WordScanner(TLStringView text, const std::string& locale, Mode mode)
    : _text(text), _locale(locale), _mode(mode) {}

bool WordScanner::next(TLString& word) {
  do {
    if (_folded ? nextFoldedWord(*_folded, word) : nextInASCII(word)) return true;
  } while (enterNextStretch());
  return false;
}

bool WordScanner::enterNextStretch() {
  _folded.reset();
  const size_t start = _stretchEnd;
  if (start == _text.size()) return false;
  const size_t firstNonASCII =
      _mode == Mode::unicodeOnly ? start : start + platform::asciiPrefixLength(_text.substr(start));
  size_t mixedStart = firstNonASCII;
  while (mixedStart > start && !isASCIIWhiteSpace(_text[mixedStart - 1])) --mixedStart;
  _position = start;
  if (firstNonASCII == _text.size() && _mode == Mode::asciiByTable) {
    _stretchEnd = _text.size();
  } else if (mixedStart > start) {
    _stretchEnd = mixedStart;
  } else {
    _stretchEnd = _position = mixedStretchEnd(firstNonASCII);
    if (!_lease) _lease.emplace(_locale);
    _folded.emplace(_text.substr(start, _stretchEnd - start), _lease->workspace());
  }
  return true;
}

// The white space at which a stretch of mixed text ends, or the end of the text.
size_t WordScanner::mixedStretchEnd(size_t firstNonASCII) const {
  if (_mode == Mode::unicodeOnly) return _text.size();
  const size_t bound = firstNonASCII + kLongStretch;
  size_t nonASCII = firstNonASCII;
  for (;;) {
    const auto space = std::find_if(_text.begin() + static_cast<ptrdiff_t>(nonASCII), _text.end(),
                                    isASCIIWhiteSpace);
    const size_t end = static_cast<size_t>(space - _text.begin());
    const size_t ascii = platform::asciiPrefixLength(_text.substr(end, kShortASCII));
    if (end >= bound || ascii == kShortASCII || end + ascii == _text.size()) return end;
    nonASCII = end + ascii;
  }
}

bool WordScanner::nextInASCII(TLString& word) {
  const auto kindAt = [this](size_t i) { return kASCII.kind[_text[i]]; };
  const size_t end = _stretchEnd;
  size_t i = _position;
  while (i < end && !isWordKind(kindAt(i))) ++i;
  word.clear();
  size_t joint = 0;
  while (i < end) {
    size_t run = i;
    while (run < end && isWordKind(kindAt(run))) word.push_back(kASCII.lower[_text[run++]]);
    i = run;
    if (i + 1 >= end || kindAt(i - 1) != kindAt(i + 1)) break;
    const bool apostrophe = kindAt(i) == kApostrophe;
    if (!apostrophe && (kindAt(i) != kJoiner || kindAt(i + 1) != kDigit)) break;
    if (apostrophe) {
      joint = word.size();
    } else {
      word.push_back(_text[i]);
    }
    ++i;
  }
  _position = i;
  dropPossessive(word, joint);
  return !word.empty();
}

}  // namespace lexemon
