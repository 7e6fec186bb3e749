#include "bench/peers/Peers.h"

namespace peers {

void timeQueries(const Workload& work, const Search& search, bool warm, Figures& figures) {
  bench::Percentiles seconds;
  for (size_t pass = warm ? 1 : 0; pass <= work.passes; ++pass) {
    for (const std::string& query : work.queries) {
      const bench::TimedSearch timed = search(query);
      if (pass == 0) continue;
      seconds.add(timed.seconds);
      figures.results += timed.results;
    }
  }
  figures.median = seconds.at(0.5);
  figures.percentile95 = seconds.at(0.95);
  figures.maximum = seconds.at(1);
}

}  // namespace peers
