#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/TLError.h"

namespace salt {

// Damage in an index can end the process that reads it: some damaged bytes fail an assertion, some
// mislead leveldb. An index at which that has happened twice within an hour is set aside, so that
// it does not happen for ever. `path` is the directory of the index; the rest lies beside it.

// Where fatal signals leave a note of work on the index: see platform::CrashNote.
[[nodiscard]] std::string crashNotesPath(const std::string& path);

// Whether the latest two notes are of the same hour.
[[nodiscard]] bool hasCrashedTwice(const std::string& path);

// Renames the directory to `path`.damaged-TIME, and removes the notes and what was set aside
// before. Returns the new name; none with an error set when that fails: it can be tried again.
[[nodiscard]] std::optional<std::string> setAside(const std::string& path, TLErrorOut error);

// The directories that were set aside: one, or none.
[[nodiscard]] std::vector<std::string> indexesSetAside(const std::string& path);

}  // namespace salt
