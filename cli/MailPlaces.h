#pragma once

#include <optional>
#include <string>
#include <vector>

#include "cli/MailReader.h"
#include "cli/Options.h"

// Translates the paths that users name into the identifiers of the index.
namespace cli {

// Looks offsets up in the catalogue of `tallow sync`, which is opened for the first message.
[[nodiscard]] MailReader::OffsetOf offsetsOfSync(const Options& options);

// Whether an argument is a path, not an identifier: it begins like a path, or such a file exists.
[[nodiscard]] bool namesPath(const std::string& argument);

// The absolute path as written, and with symbolic links resolved; only one if both are the same.
[[nodiscard]] std::vector<std::string> spellingsOf(const std::string& path);

// The identifiers that `index` and `sync` may have given to a message file, most likely first; for
// PATH:OFFSET those of a message in an mbox file.
[[nodiscard]] std::vector<std::string> identifiersOf(const std::string& path);

}  // namespace cli
