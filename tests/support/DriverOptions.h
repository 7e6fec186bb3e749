#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <variant>

namespace testsupport {

// The variables of options "--NAME VALUE", each a number or a text.
using DriverOptions = std::map<std::string_view, std::variant<uint64_t*, std::string*>>;

// Reads the command line of a driver into these variables. Prints the usage and ends the process
// with 2 if an option is unknown, has no value, or needs a number and has none.
void readOptions(int count, char** words, const char* usage, const DriverOptions& options);

}  // namespace testsupport
