#pragma once

#include <string>

namespace platform {

// $STATE_DIRECTORY or /var/lib/tallow: data root, synonym file and defaults file lie below it. Of a
// colon-separated list, as systemd may set it, the first entry counts.
[[nodiscard]] std::string stateDirectory();

// $RUNTIME_DIRECTORY or /run/tallow: sockets and the lock status lie below it.
[[nodiscard]] std::string runtimeDirectory();

[[nodiscard]] std::string dataRoot();         // TallowSearch
[[nodiscard]] std::string synonymFilePath();  // TALLOW/en_synonyms.txt
[[nodiscard]] std::string defaultsFilePath();
[[nodiscard]] std::string lockStatusPath();

// `base` and `component` with exactly one slash between.
[[nodiscard]] std::string joinPath(const std::string& base, const std::string& component);

}  // namespace platform
