#pragma once

#include <memory>
#include <string>
#include <vector>

#include "salt/Index.h"
#include "salt/Search.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace testsupport {

// The term of one query word in two zones, 13 and 171; with a trailing space it is a whole word.
[[nodiscard]] saltsearch::Term word(const std::string& token);

// The first tokens of the terms, joined by bars, in brackets.
[[nodiscard]] std::string tokensOf(const std::vector<saltsearch::Term>& terms);

// An index of documents 1, 2, ... with one text each, and a log capture.
struct Corpus {
  // Each word of a text is followed by a space.
  explicit Corpus(const std::vector<std::string>& texts);

  // The terms after a search, with `found` set.
  [[nodiscard]] std::vector<saltsearch::Term> searched(std::vector<saltsearch::Term> terms) const;

  LogCapture log;
  TemporaryDirectory directory;
  std::unique_ptr<salt::Index> index;
};

}  // namespace testsupport
