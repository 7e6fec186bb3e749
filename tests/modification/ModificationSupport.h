#pragma once

#include <memory>
#include <string>
#include <vector>

#include "salt/Index.h"
#include "salt/Search.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace testsupport {

// The term of one word of a query in two zones, 13 and 171; with a blank at its end a whole word.
[[nodiscard]] saltsearch::Term word(const std::string& token);

// The first tokens of the terms in brackets.
[[nodiscard]] std::string tokensOf(const std::vector<saltsearch::Term>& terms);

// An index of documents 1 and on, each of one text, and the log.
struct Corpus {
  // Texts are words with a blank behind each.
  explicit Corpus(const std::vector<std::string>& texts);

  // The terms as they are after a search that found what there is of them.
  [[nodiscard]] std::vector<saltsearch::Term> searched(std::vector<saltsearch::Term> terms) const;

  LogCapture log;
  TemporaryDirectory directory;
  std::unique_ptr<salt::Index> index;
};

}  // namespace testsupport
