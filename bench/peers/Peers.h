#pragma once

#include <cstdint>
#include <functional>
#include <limits>
#include <string>
#include <vector>

#include "bench/Percentiles.h"
#include "bench/Queries.h"

// Measures several indexers under the same conditions. Each `measure...` function works in its own
// scratch directory, which it removes, and throws on failure.
namespace peers {

// Common to all.
struct Workload {
  std::string maildir;    // an absolute path
  std::string spoolPath;  // its mails as encoded items
  uint64_t mails;
  // All queries in these lists are distinct, so each is new to the program that gets it first.
  std::vector<std::string> warmUp;       // not timed
  std::vector<std::string> queries;      // timed twice
  std::vector<std::string> duringMerge;  // timed once, for this daemon only
};

inline constexpr double kUnknown = std::numeric_limits<double>::quiet_NaN();

// The times of several searches.
class SearchTimes {
 public:
  void add(const bench::TimedSearch& timed);

  // Subtracts this time from each search from now on.
  void takeOff(double seconds) { _takenOff = seconds; }

  // In seconds; NaN without searches.
  [[nodiscard]] double at(double part) const;

  [[nodiscard]] uint64_t queries() const { return _queries; }
  [[nodiscard]] uint64_t results() const { return _results; }  // total over all searches

 private:
  bench::Percentiles _seconds;
  uint64_t _queries = 0;
  uint64_t _results = 0;
  double _takenOff = 0;
};

// The figures of one system. Unknown ones, and those that depend on them, are NaN.
struct Figures {
  double mailsPerSecond = kUnknown;
  double cpuSeconds = kUnknown;  // of all processes that took part in indexing
  double diskBytes = kUnknown;
  double residentPeak = kUnknown;  // of the indexing process, in bytes
  double startSeconds = 0;         // subtracted from each query
  SearchTimes first;               // first run of each query
  SearchTimes again;               // second run
};

using Search = std::function<bench::TimedSearch(const std::string& query)>;

// Warms up, then runs the queries twice and adds the times to the figures.
void timeQueries(const Workload& work, const Search& search, Figures& figures);

// Queries that began and ended during the same merge.
struct DuringMerge {
  SearchTimes times;
  uint64_t merges = 0;    // that ran during those queries
  uint64_t mailsFed = 0;  // indexed meanwhile
};

// The figures of this daemon.
struct TallowFigures : Figures {
  double settleSeconds = 0;  // from the last mail until all merges have ended
  uint64_t settleMerges = 0;
  double anonymousPeak = kUnknown;  // peak RssAnon of the daemon, in bytes
  DuringMerge duringMerge;          // without incoming mail
  DuringMerge duringIngest;         // while another client indexes mail
};
[[nodiscard]] TallowFigures measureTallow(const Workload& work);

// Indexing only: the figures contain no searches.
[[nodiscard]] Figures indexByTallow(const Workload& work);

// This daemon without parsing mail, and raw batches with the same keys. Unknown values are NaN.
struct EncodedFigures {
  double seconds = kUnknown;
  double cpuSeconds = kUnknown;
  double anonymousPeak = kUnknown;
  double suffixes = kUnknown;  // this and the following only with `withRaw`
  double rawSeconds = kUnknown;
  double rawDiskBytes = kUnknown;
};
[[nodiscard]] EncodedFigures measureEncoded(const Workload& work, bool withRaw);

[[nodiscard]] Figures measureMu(const Workload& work);
[[nodiscard]] Figures indexByMu(const Workload& work);  // indexing only
[[nodiscard]] Figures measureNotmuch(const Workload& work);

// With `optimize`, merges all segments of the full-text index into one before searching.
[[nodiscard]] Figures measureFts5(const Workload& work, bool optimize);

}  // namespace peers
