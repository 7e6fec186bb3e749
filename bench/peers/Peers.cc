#include "bench/peers/Peers.h"

#include <algorithm>

namespace peers {

void SearchTimes::add(const bench::TimedSearch& timed) {
  _seconds.add(timed.seconds);
  ++_queries;
  _results += timed.results;
}

double SearchTimes::at(double part) const {
  return _queries == 0 ? kUnknown : std::max(_seconds.at(part) - _takenOff, 0.0);
}

void timeQueries(const Workload& work, const Search& search, Figures& figures) {
  for (const std::string& query : work.warmUp) static_cast<void>(search(query));
  for (SearchTimes* pass : {&figures.first, &figures.again}) {
    for (const std::string& query : work.queries) pass->add(search(query));
  }
}

}  // namespace peers
