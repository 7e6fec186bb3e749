#include "tests/support/DriverOptions.h"

#include <charconv>
#include <cstdio>
#include <cstdlib>

namespace testsupport {

namespace {

bool readOption(std::string_view name, std::string_view value, const DriverOptions& options) {
  const auto option = options.find(name);
  if (option == options.end()) return false;
  if (auto* const text = std::get_if<std::string*>(&option->second)) {
    **text = value;
    return true;
  }
  const char* const end = value.data() + value.size();
  const auto [stop, error] =
      std::from_chars(value.data(), end, *std::get<uint64_t*>(option->second));
  return stop == end && error == std::errc();
}

}  // namespace

void readOptions(int count, char** words, const char* usage, const DriverOptions& options) {
  for (int i = 1; i < count; i += 2) {
    if (i + 1 < count && readOption(words[i], words[i + 1], options)) continue;
    std::fputs(usage, stderr);
    std::exit(2);
  }
}

}  // namespace testsupport
