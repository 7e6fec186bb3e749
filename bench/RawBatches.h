#pragma once

#include <cstdint>
#include <string>

namespace bench {

struct RawRun {
  uint64_t suffixes;
  double seconds;
  double cpuSeconds;  // of all threads of this process
};

// The upper bound that the store sets for indexing: writes the texts and suffixes of the closed
// index at `indexPath` to a new database of the same kind at `path`, one raw batch per zone. The
// time includes making the keys from the texts, but not reading the index. Takes 8 bytes per suffix
// besides all texts. Throws if either database fails.
[[nodiscard]] RawRun writeRawBatches(const std::string& indexPath, const std::string& path);

}  // namespace bench
