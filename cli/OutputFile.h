#pragma once

#include <string>
#include <string_view>

// Writes files that users name. Only their owner can read them.
namespace cli {

// Creates a new file and does not follow links. Removes the file if the write fails. False, with
// errno set, on failure.
[[nodiscard]] bool writeNewFile(const std::string& path, std::string_view bytes);

// Replaces a regular file with one rename, or creates it. Anything else is left alone.
[[nodiscard]] bool replaceFile(const std::string& path, std::string_view bytes);

}  // namespace cli
