#pragma once

#include <functional>
#include <string>
#include <vector>

#include "bench/ChildProcess.h"
#include "bench/DaemonRun.h"

namespace peers {

using Arguments = std::vector<std::string>;

// A mail indexer whose index and search are commands.
struct Tool {
  std::string directory;  // of its database
  bench::Variables variables;
  Arguments prepare;                                          // not timed; may be empty
  Arguments index;                                            // also brings the index in step later
  std::function<Arguments(const std::string& query)> search;  // prints one line a result
  std::vector<int> searchStatuses;                            // found or nothing found

  // Runs one of its commands; the output goes to a file, which is replaced.
  [[nodiscard]] bench::Run run(const Arguments& arguments, const std::string& output,
                               std::vector<int> statuses = {0}, bool watchMemory = false) const;
};

// Both with their databases below the scratch directory, and for the mail at and below `mail`.
[[nodiscard]] Tool mu(const std::string& mail, const bench::ScratchDirectory& scratch);
[[nodiscard]] Tool notmuch(const std::string& mail, const bench::ScratchDirectory& scratch);

}  // namespace peers
