#include "cli/StateDirectory.h"

#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <filesystem>

#include "cli/Commands.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "rpc/Channel.h"

namespace cli {

namespace {

std::string variable(const char* name) {
  const char* const value = std::getenv(name);
  return value == nullptr ? "" : value;
}

// Files may be removed during the scan.
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

// The data root of the daemon in use; nullopt if unknown.
std::optional<std::string> knownDataRoot(const Options& options) {
  const bool told = !options.stateDirectory.empty() || !variable("STATE_DIRECTORY").empty();
  if (!told && options.runtimeDirectory != rpc::defaultRuntimeDirectory()) return std::nullopt;
  const std::string state = stateDirectory(options);
  if (!platform::fileExists(platform::processLockPath(state))) return std::nullopt;
  return platform::dataRoot(state);
}

}  // namespace

std::string stateDirectory(const Options& options) {
  if (!options.stateDirectory.empty()) return options.stateDirectory;
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

bool isUnknownClass(const Options& options) {
  const auto root = knownDataRoot(options);
  if (!root || !platform::namesOneDirectory(options.protectionClass)) return false;
  const std::string directory = platform::joinPath(*root, options.protectionClass);
  struct stat info;
  return stat(directory.c_str(), &info) != 0 && errno == ENOENT;
}

std::string unknownClassText(const Options& options) {
  return options.protectionClass == "default"
             ? "nothing has been indexed yet; `tallow setup` does that"
             : fmt::format("nothing has been indexed for class \"{}\" yet",
                           options.protectionClass);
}

std::vector<std::string> classesOnDisk(const Options& options) {
  const auto root = knownDataRoot(options);
  if (!root) return {};
  std::vector<std::string> names =
      platform::listDirectory(*root, nullptr).value_or(std::vector<std::string>());
  std::erase_if(names, [&root](const std::string& name) {
    return !platform::fileExists(platform::textIndexPath(*root, name));
  });
  std::sort(names.begin(), names.end());
  return names;
}

ExitStatus complainOfUnknownClass(const Options& options) {
  complain(unknownClassText(options));
  return ExitStatus::nothingFound;
}

std::optional<DiskUse> diskUse(const Options& options) {
  if (!platform::namesOneDirectory(options.protectionClass)) return std::nullopt;
  const std::string root = platform::dataRoot(stateDirectory(options));
  const std::string index = platform::textIndexPath(root, options.protectionClass);
  const auto indexBytes = bytesIn(index);
  const auto storeBytes = bytesIn(std::filesystem::path(index).parent_path() / "docstore");
  if (!indexBytes || !storeBytes) return std::nullopt;
  return DiskUse{*indexBytes, *storeBytes};
}

}  // namespace cli
