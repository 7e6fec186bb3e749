#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "cli/Options.h"

namespace cli {

// The daemon's data directory: from the command line or $STATE_DIRECTORY; otherwise, for the user's
// own service, the directory that current or older versions of systemd use for state; otherwise
// that of root's daemon.
[[nodiscard]] std::string stateDirectory(const Options& options);

// Whether the client can see that nothing was ever indexed for the class: a daemon has used the
// state directory, and the class has no directory there. False if the state directory is not known
// to be the daemon's or cannot be read.
[[nodiscard]] bool isUnknownClass(const Options& options);

// The message for an unknown class.
[[nodiscard]] std::string unknownClassText(const Options& options);

// Prints that message and returns the matching exit status.
[[nodiscard]] ExitStatus complainOfUnknownClass(const Options& options);

// The sorted classes that have a directory; empty if the state directory is not known to be the
// daemon's or cannot be read.
[[nodiscard]] std::vector<std::string> classesOnDisk(const Options& options);

// The size in bytes of the files of one protection class.
struct DiskUse {
  uint64_t index = 0;
  uint64_t store = 0;
};

// Nullopt if this process cannot see the files.
[[nodiscard]] std::optional<DiskUse> diskUse(const Options& options);

}  // namespace cli
