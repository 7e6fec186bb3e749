#pragma once

#include <span>

#include "cli/HitSearch.h"
#include "cli/MailFacts.h"
#include "cli/Options.h"

namespace cli {

// Makes a link folder (see LinkFolder) of the results that the options select, in
// options.maildir, and prints how many there are. A result of which no copy can be read is left out
// with a remark.
[[nodiscard]] ExitStatus showMaildir(const Options& options, std::span<const Hit> hits,
                                     MailFacts& facts);

// Makes the folder with nothing in it.
[[nodiscard]] ExitStatus emptyMaildir(const Options& options);

}  // namespace cli
