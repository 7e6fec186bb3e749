#include "cli/ErrorText.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>
#include <string_view>

#include "rpc/Channel.h"

namespace cli {

namespace {

constexpr const char* kStoreDomain = "DocStore";
constexpr int kNotStored = 12;
constexpr const char* kIndexerDomain = "TALIndexer";
constexpr int kRefused = 1;

struct Row {
  const char* domain;
  int code;
  const char* text;
};

constexpr Row kRows[] = {
    {kIndexerDomain, kRefused, "the daemon could not put the message into the index"},
    {kIndexerDomain, 3, "there is nothing in the search that can be looked up"},
    {kIndexerDomain, 4, "the daemon is about to end; try again in a moment"},
    {kIndexerDomain, 5, "the index of this class is damaged; `tallow validate` tells more"},
    {"com.quill.tallow.TALIndexerManager", -2,
     "the index of this class cannot be opened now; `tallow status` tells whether the device is "
     "locked"},
    {kStoreDomain, kNotStored, "not in the index"},
};

// The name of a D-Bus error stands in parentheses at the end.
std::string withoutName(const std::string& message) {
  const size_t name = message.rfind(" (");
  return name == std::string::npos ? message : message.substr(0, name);
}

}  // namespace

bool isNotIndexed(const TLError& error) {
  return error.domain == kStoreDomain && error.code == kNotStored;
}

bool isRefusedMessage(const TLError& error) {
  return error.domain == kIndexerDomain && error.code == kRefused;
}

std::string plainText(const TLError& error) {
  const auto row = std::find_if(std::begin(kRows), std::end(kRows), [&error](const Row& one) {
    return error.domain == one.domain && error.code == one.code;
  });
  if (row != std::end(kRows)) return row->text;
  if (error.domain == rpc::kProtocolDomain) return withoutName(error.message);
  if (error.domain == kStoreDomain) {
    return fmt::format("the daemon's store failed{}{}", error.message.empty() ? "" : ": ",
                       error.message);
  }
  return error.message.empty() ? "the daemon gave no reason" : error.message;
}

}  // namespace cli
