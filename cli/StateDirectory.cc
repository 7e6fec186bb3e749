#include "cli/StateDirectory.h"

#include <cstdlib>
#include <filesystem>

#include "platform/Files.h"
#include "platform/Paths.h"

namespace cli {

namespace {

std::string variable(const char* name) {
  const char* const value = std::getenv(name);
  return value == nullptr ? "" : value;
}

std::string defaultStateDirectory() {
  if (!variable("STATE_DIRECTORY").empty()) return platform::stateDirectory();
  const auto homes = {std::pair("XDG_STATE_HOME", ".local/state"),
                      std::pair("XDG_CONFIG_HOME", ".config")};
  for (const auto& [name, below] : homes) {
    std::string base = variable(name);
    if (base.empty()) base = platform::joinPath(variable("HOME"), below);
    const std::string own = platform::joinPath(base, "tallow");
    if (platform::fileExists(platform::processLockPath(own))) return own;
  }
  return platform::stateDirectory();
}

// Files may go while this looks.
std::optional<uint64_t> bytesIn(const std::filesystem::path& directory) {
  std::error_code failure;
  uint64_t bytes = 0;
  for (std::filesystem::directory_iterator at(directory, failure), end; !failure && at != end;
       at.increment(failure)) {
    std::error_code gone;
    const uint64_t size = at->is_regular_file(gone) ? at->file_size(gone) : 0;
    if (!gone) bytes += size;
  }
  return failure ? std::nullopt : std::optional(bytes);
}

}  // namespace

std::string daemonStateDirectory(const Options& options) {
  return options.stateDirectory.empty() ? defaultStateDirectory() : options.stateDirectory;
}

std::optional<DiskUse> diskUse(const Options& options) {
  if (!platform::namesOneDirectory(options.protectionClass)) return std::nullopt;
  const std::string root = platform::dataRoot(daemonStateDirectory(options));
  const std::string index = platform::textIndexPath(root, options.protectionClass);
  const auto indexBytes = bytesIn(index);
  const auto storeBytes = bytesIn(std::filesystem::path(index).parent_path() / "docstore");
  if (!indexBytes || !storeBytes) return std::nullopt;
  return DiskUse{*indexBytes, *storeBytes};
}

}  // namespace cli
