#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/TLError.h"

// Writes mailboxes into config.toml.
namespace cli {

// Whether TOML, which is UTF-8, can hold this path.
[[nodiscard]] bool fitsSettings(const std::string& path);

// The line `roots = [...]` for these paths, with "~/" for the home directory.
[[nodiscard]] std::string rootsLine(const std::vector<std::string>& paths, const std::string& home);

// The text of the file with these roots added, everything else left as it is. Nullopt if the
// outcome would not be the same settings with these roots.
[[nodiscard]] std::optional<std::string> withRoots(const std::string& text,
                                                   const std::vector<std::string>& paths,
                                                   const std::string& home);

// Adds roots to the user's file, or creates it, in one step, readable by its owner only. A file
// that is a link stays one. False with an error, and with the file as it was.
bool addRootsToSettings(const std::vector<std::string>& paths, const std::string& home,
                        TLErrorOut error);

}  // namespace cli
