#include "cli/ErrorText.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>
#include <string_view>

#include "records/TLErrorCodes.h"
#include "rpc/Channel.h"

namespace cli {

namespace {

struct Row {
  const char* domain;
  int code;
  const char* text;
};

constexpr Row row(TALIndexerError code, const char* text) {
  return {kTALIndexerErrorDomain, static_cast<int>(code), text};
}

constexpr Row kRows[] = {
    row(TALIndexerError::document, "the daemon could not put the message into the index"),
    row(TALIndexerError::query, "there is nothing in the search that can be looked up"),
    row(TALIndexerError::shuttingDown, "the daemon is about to end; try again in a moment"),
    row(TALIndexerError::validationFailed,
        "the index of this class is damaged; `tallow validate` tells more"),
    {kTALIndexerManagerErrorDomain, static_cast<int>(TALIndexerManagerError::unavailable),
     "the index of this class cannot be opened now; `tallow status` tells whether the device is "
     "locked"},
    {kDocStoreErrorDomain, static_cast<int>(TALDocStoreError::notFound), "not in the index"},
};

// The name of a D-Bus error is in parentheses at the end.
std::string withoutName(const std::string& message) {
  const size_t name = message.rfind(" (");
  return name == std::string::npos ? message : message.substr(0, name);
}

}  // namespace

bool isNotIndexed(const TLError& error) {
  return error.domain == kDocStoreErrorDomain &&
         error.code == static_cast<int>(TALDocStoreError::notFound);
}

bool isRefusedMessage(const TLError& error) {
  return error.domain == kTALIndexerErrorDomain &&
         error.code == static_cast<int>(TALIndexerError::document);
}

std::string plainText(const TLError& error) {
  const auto known = std::find_if(std::begin(kRows), std::end(kRows), [&error](const Row& one) {
    return error.domain == one.domain && error.code == one.code;
  });
  if (known != std::end(kRows)) return known->text;
  if (error.domain == rpc::kProtocolDomain) return withoutName(error.message);
  if (error.domain == kDocStoreErrorDomain) {
    return fmt::format("the daemon's store failed{}{}", error.message.empty() ? "" : ": ",
                       error.message);
  }
  return error.message.empty() ? "the daemon gave no reason" : error.message;
}

}  // namespace cli
