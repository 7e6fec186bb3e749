#include "query/TALTerm.h"

#include <fmt/format.h>

#include <iterator>

std::string TALTerm::description() const {
  std::string out = "[";
  for (size_t i = 0; i < _tokens.size(); ++i) {
    fmt::format_to(std::back_inserter(out), "{}\"{}\" {}", i == 0 ? "" : " | ",
                   platform::toUTF8(_tokens[i]), _tokenScores[i]);
  }
  fmt::format_to(std::back_inserter(out), "] nomatch:{} zones:{{", _scoreNoMatch);
  for (size_t i = 0; i < _zoneIDs.size(); ++i) {
    fmt::format_to(std::back_inserter(out), "{}{}:{:.4g}", i == 0 ? "" : ",", _zoneIDs[i],
                   _zoneScores[i]);
  }
  out += _isUnigram ? "} unigram" : "}";
  return out;
}
