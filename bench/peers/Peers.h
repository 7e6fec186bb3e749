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
  // No query stands twice in these, so that each is new to whoever is asked it first.
  std::vector<std::string> warmUp;       // not timed
  std::vector<std::string> queries;      // timed twice
  std::vector<std::string> duringMerge;  // timed once, of this daemon
};

inline constexpr double kUnknown = std::numeric_limits<double>::quiet_NaN();

// What some searches took.
class SearchTimes {
 public:
  void add(const bench::TimedSearch& timed);

  // From now on each search took so much less.
  void takeOff(double seconds) { _takenOff = seconds; }

  // In seconds; NaN without any search.
  [[nodiscard]] double at(double part) const;

  [[nodiscard]] uint64_t queries() const { return _queries; }
  [[nodiscard]] uint64_t results() const { return _results; }  // of all together

 private:
  bench::Percentiles _seconds;
  uint64_t _queries = 0;
  uint64_t _results = 0;
  double _takenOff = 0;
};

// What is measured of each. Whatever is not known, or depends on that, is NaN.
struct Figures {
  double mailsPerSecond = kUnknown;
  double cpuSeconds = kUnknown;  // of all processes that indexed
  double diskBytes = kUnknown;
  double residentPeak = kUnknown;  // of the indexing process, in bytes
  double startSeconds = 0;         // taken off each query
  SearchTimes first;               // each query when it is asked for the first time
  SearchTimes again;               // and for the second
};

using Search = std::function<bench::TimedSearch(const std::string& query)>;

// Warms up, then runs the queries twice and enters what that took into the figures.
void timeQueries(const Workload& work, const Search& search, Figures& figures);

// Queries that began and ended while one and the same merge ran.
struct DuringMerge {
  SearchTimes times;
  uint64_t merges = 0;    // that ran during those queries
  uint64_t mailsFed = 0;  // indexed meanwhile
};

// This daemon.
struct TallowFigures : Figures {
  double settleSeconds = 0;  // from the last mail until all merges have ended
  uint64_t settleMerges = 0;
  double anonymousPeak = kUnknown;  // RssAnon, in bytes, of the daemon at any time
  DuringMerge duringMerge;          // no mail comes in
  DuringMerge duringIngest;         // another client indexes mail, too
};
[[nodiscard]] TallowFigures measureTallow(const Workload& work);

// As above, but for indexing alone: there are no searches in the figures.
[[nodiscard]] Figures indexByTallow(const Workload& work);

// This daemon without the parsing of mail, and the same keys as raw batches. What is not known is
// NaN.
struct EncodedFigures {
  double seconds = kUnknown;
  double cpuSeconds = kUnknown;
  double anonymousPeak = kUnknown;
  double suffixes = kUnknown;  // this and the following only `withRaw`
  double rawSeconds = kUnknown;
  double rawDiskBytes = kUnknown;
};
[[nodiscard]] EncodedFigures measureEncoded(const Workload& work, bool withRaw);

[[nodiscard]] Figures measureMu(const Workload& work);
[[nodiscard]] Figures indexByMu(const Workload& work);  // alone, as above
[[nodiscard]] Figures measureNotmuch(const Workload& work);

// With `optimize`, all segments of the full-text index are merged into one before searching.
[[nodiscard]] Figures measureFts5(const Workload& work, bool optimize);

}  // namespace peers
