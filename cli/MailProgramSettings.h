#pragma once

#include <string>
#include <vector>

namespace cli {

// Absolute paths, as written, that the settings of mail programs name as their mailboxes: of
// mbsync, OfflineIMAP, mutt, NeoMutt and aerc, and the local folders of Thunderbird's profiles.
// They need not exist. Settings that cannot be read, and values that only the program itself
// understands, are skipped.
[[nodiscard]] std::vector<std::string> placesOfMailPrograms(const std::string& home);

}  // namespace cli
