#pragma once

#include <cstdint>
#include <string>

namespace bench {

struct RawRun {
  uint64_t suffixes;
  double seconds;
  double cpuSeconds;  // of all threads of this process
};

// The bound that the store sets to indexing: writes the texts and suffixes of the index at
// `indexPath`, which nobody has open, as one bare batch a zone to a new database of the same kind
// at `path`. Making the keys from the texts is timed too, reading the index is not. Takes 8 bytes a
// suffix beside all texts. Throws when either database fails.
[[nodiscard]] RawRun writeRawBatches(const std::string& indexPath, const std::string& path);

}  // namespace bench
