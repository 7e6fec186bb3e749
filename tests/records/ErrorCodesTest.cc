#include <gtest/gtest.h>

#include <regex>
#include <set>

#include "platform/Files.h"
#include "records/TLErrorCodes.h"

namespace {

using Errors = std::set<std::pair<std::string, int>>;

template <typename... Codes>
void add(Errors& errors, const char* domain, Codes... codes) {
  (errors.emplace(domain, static_cast<int>(codes)), ...);
}

// The rows of the page that have a code of their own.
Errors rowsOf(const std::string& page) {
  static const std::regex row("\\| `([\\w.]+)` \\| (-?[0-9]+) \\| \\S");
  Errors errors;
  for (std::sregex_iterator found(page.begin(), page.end(), row), end; found != end; ++found) {
    errors.emplace((*found)[1], std::stoi((*found)[2]));
  }
  return errors;
}

}  // namespace

TEST(ErrorCodes, ThePageForClientsListsThemAll) {
  const auto page = platform::readFile(TALLOW_ERRORS_PAGE, size_t{1} << 20, nullptr);
  ASSERT_TRUE(page.has_value());
  Errors errors;
  add(errors, kTALIndexerErrorDomain, TALIndexerError::document, TALIndexerError::query,
      TALIndexerError::shuttingDown, TALIndexerError::validationFailed);
  add(errors, kTALIndexerManagerErrorDomain, TALIndexerManagerError::unavailable);
  add(errors, kDocStoreErrorDomain, TALDocStoreError::notFound, TALDocStoreError::noConnection);
  EXPECT_EQ(rowsOf(*page), errors);
}
