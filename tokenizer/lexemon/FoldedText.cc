#include "tokenizer/lexemon/FoldedText.h"

#include <unicode/ubrk.h>
#include <unicode/uchar.h>
#include <unicode/unorm2.h>
#include <unicode/utf16.h>

#include <algorithm>
#include <array>
#include <stdexcept>
#include <utility>

#include "platform/Assert.h"

namespace lexemon {

namespace {

constexpr char16_t kFullwidthColon = 0xFF1A;

constexpr int32_t kMaxMarks = 30;

// A piece ends at the first normalization boundary after the first bound, at worst at the second
// bound. No code point grows to more than 18 units.
constexpr int32_t kPieceUnits = 256;
constexpr int32_t kMaxPieceUnits = 512;
constexpr int32_t kMaxGrowth = 18;

// Iterators have caches that grow with the longest text between two boundaries; after a longer text
// they are discarded.
constexpr size_t kMaxKeptTextUnits = size_t{1} << 16;

struct BreakIteratorCloser {
  void operator()(UBreakIterator* iterator) const { ubrk_close(iterator); }
};

const UNormalizer2* folder() {
  UErrorCode status = U_ZERO_ERROR;
  const UNormalizer2* instance = unorm2_getNFKCCasefoldInstance(&status);
  TL_ASSERT(U_SUCCESS(status));
  return instance;
}

bool isMark(UChar32 c) {
  return (U_GET_GC_MASK(c) & U_GC_M_MASK) != 0 || c == 0xFF9E || c == 0xFF9F;
}

}  // namespace

struct Workspace {
  std::string locale;
  std::unique_ptr<UBreakIterator, BreakIteratorCloser> iterator;
  size_t longestText = 0;
  std::array<char16_t, kMaxPieceUnits + 2> raw;
  std::array<char16_t, size_t{kMaxPieceUnits + 2} * kMaxGrowth> folded;
};

namespace {

std::unique_ptr<Workspace>& keptWorkspace() {
  thread_local std::unique_ptr<Workspace> kept;
  return kept;
}

}  // namespace

WorkspaceLease::WorkspaceLease(const std::string& locale) : _workspace(std::move(keptWorkspace())) {
  if (_workspace && _workspace->locale == locale) return;
  _workspace = std::make_unique<Workspace>();
  _workspace->locale = locale;
  UErrorCode status = U_ZERO_ERROR;
  _workspace->iterator.reset(ubrk_open(UBRK_WORD, locale.c_str(), nullptr, 0, &status));
  if (U_FAILURE(status)) throw std::runtime_error(u_errorName(status));
}

WorkspaceLease::~WorkspaceLease() {
  if (_workspace->longestText <= kMaxKeptTextUnits) keptWorkspace() = std::move(_workspace);
}

FoldedText::FoldedText(TLStringView text, Workspace& workspace)
    : _text(text), _workspace(workspace) {
  if (text.size() > INT32_MAX) throw std::length_error("text too long");
  UErrorCode status = U_ZERO_ERROR;
  ubrk_setText(workspace.iterator.get(), text.data(), static_cast<int32_t>(text.size()), &status);
  if (U_FAILURE(status)) throw std::runtime_error(u_errorName(status));
  workspace.longestText = std::max(workspace.longestText, text.size());
}

UChar32 FoldedText::next() {
  while (_foldedPosition == _foldedLength) {
    if (_position < _wordEnd) {
      foldPiece();
    } else {
      const int32_t boundary = _wordEnd;
      if (!enterNextWord()) return kEnd;
      if (boundary > 0 && (_position > boundary || !colonJoinsAt(boundary))) return kBreak;
    }
  }
  _previousPosition = _foldedPosition;
  UChar32 c;
  U16_NEXT(_workspace.folded.data(), _foldedPosition, _foldedLength, c);
  return c;
}

// Moves _position and _wordEnd to the next significant word of the iterator.
bool FoldedText::enterNextWord() {
  for (;;) {
    const int32_t start = _wordEnd;
    const int32_t end = ubrk_next(_workspace.iterator.get());
    if (end == UBRK_DONE) return false;
    _wordEnd = end;
    _marks = 0;
    if (isWord(start, end) || (end == start + 1 && isJoiningColon(start))) {
      _position = start;
      return true;
    }
    _position = end;
    _skipped = true;
  }
}

bool FoldedText::isWord(int32_t start, int32_t end) const {
  for (int32_t i = start; i < end;) {
    UChar32 c;
    U16_NEXT(_text.data(), i, end, c);
    if ((U_GET_GC_MASK(c) & (U_GC_L_MASK | U_GC_N_MASK)) != 0 || u_isUAlphabetic(c)) return true;
  }
  return false;
}

bool FoldedText::isDigitAt(int32_t index) const {
  return index >= 0 && static_cast<size_t>(index) < _text.size() && u_isdigit(_text[index]);
}

// Keeps times together: the boundaries around a colon between two digits are ignored.
bool FoldedText::colonJoinsAt(int32_t index) const {
  return isJoiningColon(index - 1) || isJoiningColon(index);
}

bool FoldedText::isJoiningColon(int32_t index) const {
  return isDigitAt(index - 1) && isDigitAt(index + 1) &&
         (_text[index] == u':' || _text[index] == kFullwidthColon);
}

void FoldedText::foldPiece() {
  int32_t length = 0;
  while (_position < _wordEnd && length < kMaxPieceUnits) {
    int32_t next = _position;
    UChar32 c;
    U16_NEXT(_text.data(), next, _wordEnd, c);
    if (length >= kPieceUnits && unorm2_hasBoundaryBefore(folder(), c)) break;
    _position = next;
    if (u_hasBinaryProperty(c, UCHAR_DEFAULT_IGNORABLE_CODE_POINT)) continue;
    _marks = isMark(c) ? _marks + 1 : 0;
    if (_marks <= kMaxMarks) {
      U16_APPEND_UNSAFE(_workspace.raw.data(), length, c);
    }
  }
  UErrorCode status = U_ZERO_ERROR;
  _foldedPosition = 0;
  _foldedLength =
      unorm2_normalize(folder(), _workspace.raw.data(), length, _workspace.folded.data(),
                       static_cast<int32_t>(_workspace.folded.size()), &status);
  TL_ASSERT(U_SUCCESS(status));
}

}  // namespace lexemon
