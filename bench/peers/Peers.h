#pragma once

#include <cstdint>
#include <functional>
#include <limits>
#include <string>
#include <vector>

#include "bench/Percentiles.h"
#include "bench/Queries.h"

// What is measured beside each other, and how. Each `measure...` below works in a scratch directory
// of its own, which is gone when it returns, and throws when something fails.
namespace peers {

// The same for all.
struct Workload {
  std::string maildir;    // an absolute path
  std::string spoolPath;  // its mails as encoded items
  uint64_t mails;
  std::vector<std::string> queries;
  size_t passes;  // over the queries, after one that is not timed
};

inline constexpr double kUnknown = std::numeric_limits<double>::quiet_NaN();

// What is measured of each. Whatever is not known, or depends on that, is NaN.
struct Figures {
  double mailsPerSecond = kUnknown;
  double cpuSeconds = kUnknown;  // of all processes that indexed
  double diskBytes = kUnknown;
  double residentPeak = kUnknown;  // of the indexing process, in bytes
  double startSeconds = 0;         // taken off each query
  double median = kUnknown;        // of the queries, in seconds
  double percentile95 = kUnknown;
  double maximum = kUnknown;
  uint64_t results = 0;  // of all timed queries together
};

using Search = std::function<bench::TimedSearch(const std::string& query)>;

// Runs the queries once unless they are warm, then `passes` times, and enters what that took into
// the figures.
void timeQueries(const Workload& work, const Search& search, bool warm, Figures& figures);

// This daemon.
struct TallowFigures : Figures {
  double settleSeconds = 0;  // from the last mail until all merges have ended
  uint64_t settleMerges = 0;
  double anonymousPeak = 0;  // RssAnon, in bytes, of the daemon at any time
  Figures duringMerge;
  uint64_t merges = 0;    // that ran during those queries
  uint64_t mailsFed = 0;  // indexed meanwhile
};
[[nodiscard]] TallowFigures measureTallow(const Workload& work);

// This daemon without the parsing of mail, and the same keys as raw batches.
struct EncodedFigures {
  uint64_t suffixes = 0;
  double seconds = 0;
  double cpuSeconds = 0;
  double rawSeconds = 0;
  double rawDiskBytes = 0;
  double anonymousPeak = 0;
};
[[nodiscard]] EncodedFigures measureEncoded(const Workload& work);

[[nodiscard]] Figures measureMu(const Workload& work);
[[nodiscard]] Figures measureNotmuch(const Workload& work);

// With `optimize`, all segments of the full-text index are merged into one before searching.
[[nodiscard]] Figures measureFts5(const Workload& work, bool optimize);

}  // namespace peers
