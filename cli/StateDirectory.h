#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "cli/Options.h"

namespace cli {

// Where the daemon has its data: as the command line says, or as the daemon is told; else, when it
// is the user's own service, where systemd puts its state, of new and of old; else as the system's
// service.
[[nodiscard]] std::string daemonStateDirectory(const Options& options);

// Bytes of the files of one protection class.
struct DiskUse {
  uint64_t index = 0;
  uint64_t store = 0;
};

// None where this process does not see them.
[[nodiscard]] std::optional<DiskUse> diskUse(const Options& options);

}  // namespace cli
