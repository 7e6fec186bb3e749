#pragma once

#include <string>
#include <string_view>

namespace platform {

// $STATE_DIRECTORY; else, for a user other than root, tallow in $XDG_STATE_HOME (default
// ~/.local/state); else /var/lib/tallow. Contains the data root, the synonym file and the defaults
// file. Of a colon-separated list, as systemd may set it, the first entry counts.
[[nodiscard]] std::string stateDirectory();

// $RUNTIME_DIRECTORY; else, for a user other than root, tallow in $XDG_RUNTIME_DIR; else
// /run/tallow. Contains the sockets and the lock status.
[[nodiscard]] std::string runtimeDirectory();

// The lock that a running daemon holds while it may touch anything in its state directory.
[[nodiscard]] std::string processLockPath(const std::string& state = stateDirectory());

[[nodiscard]] std::string dataRoot(const std::string& state = stateDirectory());  // TallowSearch
// The directory in which a purge rebuilds a class. The holder of the process lock may remove it.
// Not in the data root, where any name can be a class.
[[nodiscard]] std::string purgeDirectory(const std::string& state = stateDirectory());
[[nodiscard]] std::string synonymFilePath();  // TALLOW/en_synonyms.txt
[[nodiscard]] std::string defaultsFilePath();
[[nodiscard]] std::string lockStatusPath();

// Whether clients may use this name for a protection class, which is a directory in the data root:
// not empty, not a path elsewhere, and not too long for a file system.
[[nodiscard]] bool namesOneDirectory(std::string_view protectionClass);
inline constexpr size_t kMaxNameBytes = 255;

// The directory of the text index of a class.
[[nodiscard]] std::string textIndexPath(const std::string& root,
                                        const std::string& protectionClass);

// `base` and `component` joined with exactly one slash.
[[nodiscard]] std::string joinPath(const std::string& base, const std::string& component);

}  // namespace platform
