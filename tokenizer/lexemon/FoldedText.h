#pragma once

#include <unicode/utypes.h>

#include <memory>
#include <string>
#include <utility>

#include "platform/Text.h"

namespace lexemon {

struct Workspace;

// A break iterator and buffers, borrowed from the calling thread for as long as the lease lives: a
// thread keeps one set, for the locale it used last, so that none is opened per text. Two leases
// alive on one thread get a set each. Throws std::runtime_error where ICU has no iterator for the
// locale.
class WorkspaceLease {
 public:
  explicit WorkspaceLease(const std::string& locale);
  ~WorkspaceLease();
  WorkspaceLease(const WorkspaceLease&) = delete;
  WorkspaceLease& operator=(const WorkspaceLease&) = delete;

  [[nodiscard]] Workspace& workspace() { return *_workspace; }

 private:
  std::unique_ptr<Workspace> _workspace;
};

// The code points of a text after NFKC case folding, word by word of the ICU break iterator (UAX 29
// with dictionaries for scripts without blanks). Words without letter, digit or ideograph are left
// out. Folding goes in pieces of bounded length, so memory does not grow with the text.
//
// A run of combining marks counts up to its 30th (the bound of the stream-safe text format, UAX
// 15): the rest is dropped, as putting n marks in canonical order takes n * n steps.
class FoldedText {
 public:
  static constexpr UChar32 kBreak = -1;  // between two words
  static constexpr UChar32 kEnd = -2;

  // Both arguments must outlive the object.
  FoldedText(TLStringView text, Workspace& workspace);

  // The next code point (a lone surrogate stands for itself), kBreak, or kEnd for good.
  [[nodiscard]] UChar32 next();

  // Brings back the code point that `next` gave last.
  void unread() { _foldedPosition = _previousPosition; }

  // True once after each stretch that was left out.
  [[nodiscard]] bool takeSkipped() { return std::exchange(_skipped, false); }

 private:
  bool enterNextWord();
  [[nodiscard]] bool isWord(int32_t start, int32_t end) const;
  [[nodiscard]] bool isDigitAt(int32_t index) const;
  [[nodiscard]] bool isJoiningColon(int32_t index) const;
  [[nodiscard]] bool colonJoinsAt(int32_t index) const;
  void foldPiece();

  const TLStringView _text;
  Workspace& _workspace;
  int32_t _position = 0;  // first unit of the word that is not folded yet
  int32_t _wordEnd = 0;
  int32_t _marks = 0;  // length of the current run of combining marks
  int32_t _foldedPosition = 0;
  int32_t _previousPosition = 0;
  int32_t _foldedLength = 0;
  bool _skipped = false;
};

}  // namespace lexemon
