#pragma once

#include <string>
#include <string_view>

namespace platform {

// $STATE_DIRECTORY; else, for a user who is not root, tallow below $XDG_STATE_HOME, which is
// ~/.local/state unless set; else /var/lib/tallow. Data root, synonym file and defaults file lie
// below it. Of a colon-separated list, as systemd may set it, the first entry counts.
[[nodiscard]] std::string stateDirectory();

// $RUNTIME_DIRECTORY; else, for a user who is not root, tallow below $XDG_RUNTIME_DIR; else
// /run/tallow. Sockets and the lock status lie below it.
[[nodiscard]] std::string runtimeDirectory();

// What a running daemon holds as long as it may touch anything below its state directory.
[[nodiscard]] std::string processLockPath(const std::string& state = stateDirectory());

[[nodiscard]] std::string dataRoot(const std::string& state = stateDirectory());  // TallowSearch
// Where a purge builds a class. The holder of the process lock may remove it. Not below the data
// root, where any name can be a class.
[[nodiscard]] std::string purgeDirectory(const std::string& state = stateDirectory());
[[nodiscard]] std::string synonymFilePath();  // TALLOW/en_synonyms.txt
[[nodiscard]] std::string defaultsFilePath();
[[nodiscard]] std::string lockStatusPath();

// A protection class is one directory below the data root, whose name clients choose: neither
// empty, nor a way to elsewhere, nor longer than a file system takes.
[[nodiscard]] bool namesOneDirectory(std::string_view protectionClass);
inline constexpr size_t kLongestName = 255;  // bytes

// Directory of the text index of a class.
[[nodiscard]] std::string textIndexPath(const std::string& root,
                                        const std::string& protectionClass);

// `base` and `component` with exactly one slash between.
[[nodiscard]] std::string joinPath(const std::string& base, const std::string& component);

}  // namespace platform
