#pragma once

#include <optional>
#include <string>
#include <vector>

#include "cli/MailReader.h"
#include "cli/Options.h"

// From what a user names to what the index calls it.
namespace cli {

// By the catalogue of `tallow sync`, which is opened when the first message is asked for.
[[nodiscard]] MailReader::OffsetOf offsetsOfSync(const Options& options);

// Whether an argument names a place on the disk, not an identifier: it begins as a path does, or
// there is such a file.
[[nodiscard]] bool namesPath(const std::string& argument);

// As it is written and as it is without symbolic links, absolute; one path where they are the same.
[[nodiscard]] std::vector<std::string> spellingsOf(const std::string& path);

// The identifiers that a message file may have, as `index` and `sync` name it, the likeliest first;
// for PATH:OFFSET those of a message of an mbox file.
[[nodiscard]] std::vector<std::string> identifiersOf(const std::string& path);

}  // namespace cli
