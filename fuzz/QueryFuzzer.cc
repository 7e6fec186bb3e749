// Parses any bytes as a query. A parsed query must print as text that parses to the same tree; the
// tree built from it must survive the wire, and optimising it may remove only free text and
// constants.

#include <cstddef>
#include <cstdint>
#include <string>

#include "platform/Assert.h"
#include "platform/Log.h"
#include "querylang/TLQueryAdditions.h"

namespace {

void checkText(const std::string& text) {
  sq::Tree tree;
  size_t stop = 0;
  const bool good = sq::parse(text.c_str(), tree, &stop);
  TL_ASSERT(tree != nullptr && stop <= text.size());
  if (!good) return;
  const std::string written = sq::expressionText(*tree);
  sq::Tree again;
  TL_ASSERT(sq::parse(written.c_str(), again));
  TL_ASSERT(sq::expressionText(*again) == written);
}

void checkTravels(const TLQuery& query) {
  TLQuery read;
  TL_ASSERT(read.initWithData(query.data()));
}

void checkQuery(const TLString& text) {
  const auto query = TLQueryAdditions::initWithBeaconQueryString(text, false);
  checkTravels(*query);
  const bool built = query->hasRoot();
  TLQueryAdditions::optimizeQuery(*query);
  TL_ASSERT(built || !query->hasRoot());
  checkTravels(*query);
  TLQueryAdditions::addFiltersToQuery(*query, {text, u"true"}, true);
  checkTravels(*query);
  static_cast<void>(TLQueryAdditions::_stringifyQueryTree(query->root().get(), 0));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const bool quiet = [] {
    platform::setProcessLogThreshold(platform::LogLevel::fault);
    return true;
  }();
  static_cast<void>(quiet);
  const std::string text(reinterpret_cast<const char*>(data), size);
  checkText(text);
  checkQuery(platform::fromUTF8(text));
  return 0;
}
