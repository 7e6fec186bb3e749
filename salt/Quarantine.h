#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/TLError.h"

namespace salt {

// Quarantine for damaged indexes. Damage can end the process that reads the index, because some
// damaged bytes fail an assertion and some mislead leveldb. An index that has done so twice within
// an hour is set aside, so that it does not happen forever. `path` is the directory of the index;
// all other files lie beside it.

// The file in which fatal signals record work on the index: see platform::CrashNote.
[[nodiscard]] std::string crashNotesPath(const std::string& path);

// Whether the last two notes are less than an hour apart.
[[nodiscard]] bool hasCrashedTwice(const std::string& path);

// Renames the directory to `path`.damaged-TIME, and removes the notes and any index set aside
// earlier. Returns the new name; nullopt with an error on failure, after which it can be tried
// again.
[[nodiscard]] std::optional<std::string> setAside(const std::string& path, TLErrorOut error);

// The directories that were set aside: one or none.
[[nodiscard]] std::vector<std::string> indexesSetAside(const std::string& path);

}  // namespace salt
