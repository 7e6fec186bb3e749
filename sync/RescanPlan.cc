#include "sync/RescanPlan.h"

#include <algorithm>
#include <utility>

namespace mailsync {

RescanPlan::RescanPlan(Time now)
    : _lastChange(now), _nextUnwatched(now + kUnwatchedInterval), _nextFull(now), _earliest(now) {}

void RescanPlan::note(Time now) {
  if (!_firstChange) _firstChange = now;
  _lastChange = now;
}

void RescanPlan::changed(const std::string& place, Time now) {
  note(now);
  if (!_pending.everything) _pending.places.insert(place);
  if (_pending.places.size() > kMaxPlaces) lost(now);
}

void RescanPlan::lost(Time now) {
  note(now);
  _pending.everything = true;
  _pending.places.clear();
}

void RescanPlan::request(Time now) {
  note(now);
}

void RescanPlan::retry(Time now) {
  _earliest = now;
  _retry = std::chrono::milliseconds(0);
  note(now);
}

void RescanPlan::setUnwatched(std::set<std::string> places, Time now) {
  if (_unwatched.empty()) _nextUnwatched = now + kUnwatchedInterval;
  _unwatched = std::move(places);
}

RescanPlan::Time RescanPlan::pendingDue() const {
  if (!_firstChange) return Time::max();
  return std::min(_lastChange + kQuiet, *_firstChange + kTogether);
}

RescanPlan::Time RescanPlan::next() const {
  const Time unwatched = _unwatched.empty() ? Time::max() : _nextUnwatched;
  return std::max(_earliest, std::min({pendingDue(), _nextFull, unwatched}));
}

std::optional<RescanPlan::Round> RescanPlan::take(Time now) {
  if (now < next()) return std::nullopt;
  if (!_unwatched.empty() && now >= _nextUnwatched) {
    _pending.places.insert(_unwatched.begin(), _unwatched.end());
  }
  if (now >= _nextUnwatched) _nextUnwatched = now + kUnwatchedInterval;
  if (now >= _nextFull) {
    _pending.everything = true;
    _nextFull = now + kFullInterval;
  }
  if (_pending.everything) _pending.places.clear();
  _firstChange.reset();
  _inHand = std::exchange(_pending, {});
  return _inHand;
}

void RescanPlan::finished(bool succeeded, Time now) {
  if (!_inHand) return;
  const Round round = *std::exchange(_inHand, std::nullopt);
  if (succeeded) {
    _retry = std::chrono::milliseconds(0);
    return;
  }
  if (round.everything) lost(now);
  for (const std::string& place : round.places) changed(place, now);
  request(now);
  _retry = std::clamp(_retry * 2, kFirstRetry, kLastRetry);
  _earliest = now + _retry;
}

}  // namespace mailsync
