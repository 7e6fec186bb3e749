#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "cli/Options.h"

namespace cli {

// Where the daemon has its data: as the command line or $STATE_DIRECTORY says; else, when it is the
// user's own service, where systemd puts its state, of new and of old; else as the system's
// service.
[[nodiscard]] std::string stateDirectory(const Options& options);

// Whether the client can see that nothing was ever indexed for the class: a daemon has worked in
// the state directory, and the class has no directory there. False where the state directory is not
// known to be that of the daemon, or cannot be read.
[[nodiscard]] bool isUnknownClass(const Options& options);

// The classes that have a directory, in order; none where the state directory is not known to be
// that of the daemon, or cannot be read.
[[nodiscard]] std::vector<std::string> classesOnDisk(const Options& options);

// What to tell the user then.
[[nodiscard]] std::string unknownClassText(const Options& options);
// Says so; the status that goes with it.
[[nodiscard]] ExitStatus complainOfUnknownClass(const Options& options);

// Bytes of the files of one protection class.
struct DiskUse {
  uint64_t index = 0;
  uint64_t store = 0;
};

// None where this process does not see them.
[[nodiscard]] std::optional<DiskUse> diskUse(const Options& options);

}  // namespace cli
