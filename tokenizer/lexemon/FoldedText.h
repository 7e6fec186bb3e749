#pragma once

#include <unicode/utypes.h>

#include <memory>
#include <string>
#include <utility>

#include "platform/Text.h"

namespace lexemon {

struct Workspace;

// A break iterator and buffers, borrowed from the calling thread for the lifetime of the lease. A
// thread caches one set, for its last locale, so that no iterator is opened per text. Two leases
// alive on one thread get separate sets. Throws std::runtime_error if ICU has no iterator for the
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

// The code points of a text after NFKC case folding, word by word of the ICU break iterator (UAX
// 29, with dictionaries for scripts without spaces). Words without a letter, digit or ideograph are
// skipped. Text is folded in pieces of bounded length, so memory does not grow with the text.
//
// Of a run of combining marks only the first 30 count (the bound of the stream-safe text format,
// UAX 15), because sorting n marks into canonical order takes n * n steps.
class FoldedText {
 public:
  static constexpr UChar32 kBreak = -1;  // between two words
  static constexpr UChar32 kEnd = -2;

  // Both arguments must outlive the object.
  FoldedText(TLStringView text, Workspace& workspace);

  // The next code point (a lone surrogate is returned as it is), kBreak, or, permanently, kEnd.
  [[nodiscard]] UChar32 next();

  // Puts back the code point last returned by `next`.
  void unread() { _foldedPosition = _previousPosition; }

  // True once after each skipped stretch.
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
  int32_t _position = 0;  // first unit of the word that is not yet folded
  int32_t _wordEnd = 0;
  int32_t _marks = 0;  // length of the current run of combining marks
  int32_t _foldedPosition = 0;
  int32_t _previousPosition = 0;
  int32_t _foldedLength = 0;
  bool _skipped = false;
};

}  // namespace lexemon
