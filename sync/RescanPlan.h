#pragma once

#include <chrono>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace mailsync {

// Decides when a watch looks at what: changed directories shortly after the change, everything at
// the start, once a day and when changes were lost, and what cannot be watched from time to time.
// Knows the time only from its caller. One thread.
class RescanPlan {
 public:
  using Clock = std::chrono::steady_clock;
  using Time = Clock::time_point;

  // Changes are taken together until none has come for kQuiet, but for kTogether at most.
  static constexpr std::chrono::milliseconds kQuiet{50};
  static constexpr std::chrono::milliseconds kTogether{300};
  static constexpr std::chrono::minutes kUnwatchedInterval{2};
  static constexpr std::chrono::hours kFullInterval{24};
  // After a round that has failed; doubled each time up to the second.
  static constexpr std::chrono::milliseconds kFirstRetry{250};
  static constexpr std::chrono::milliseconds kLastRetry{60000};
  // More places than this are one round over everything.
  static constexpr size_t kMaxPlaces = 10000;

  struct Round {
    bool everything = false;
    std::set<std::string> places;  // without `everything`
  };

  // A round over everything is due at once.
  explicit RescanPlan(Time now);

  // A directory or root is to be looked at.
  void changed(const std::string& place, Time now);
  // Nobody knows what has changed.
  void lost(Time now);
  // A round is wanted although no place has changed.
  void request(Time now);
  // The daemon may be there again: what has failed is tried at once.
  void retry(Time now);
  // What is looked at in intervals, in place of what was.
  void setUnwatched(std::set<std::string> places, Time now);

  // When a round may be due without anything new.
  [[nodiscard]] Time next() const;
  // The round that is due, if one is; it is in hand until `finished`.
  [[nodiscard]] std::optional<Round> take(Time now);
  // What was in hand is still to be done where it did not succeed.
  void finished(bool succeeded, Time now);

  // Whether the last round has failed.
  [[nodiscard]] bool failing() const { return _retry.count() > 0; }

 private:
  void note(Time now);
  [[nodiscard]] Time pendingDue() const;

  Round _pending;
  std::optional<Time> _firstChange;  // of the pending round
  Time _lastChange;
  std::optional<Round> _inHand;
  std::set<std::string> _unwatched;
  Time _nextUnwatched;
  Time _nextFull;
  std::chrono::milliseconds _retry{0};  // 0 unless the last round has failed
  Time _earliest;                       // of the next round
};

}  // namespace mailsync
