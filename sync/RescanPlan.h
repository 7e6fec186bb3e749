#pragma once

#include <chrono>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace mailsync {

// Schedules the rounds of a watch: changed directories shortly after the change; everything at the
// start, once a day and after lost changes; directories that cannot be watched at intervals. The
// caller passes the time. One thread.
class RescanPlan {
 public:
  using Clock = std::chrono::steady_clock;
  using Time = Clock::time_point;

  // Changes are gathered until none has arrived for kQuiet, for at most kTogether.
  static constexpr std::chrono::milliseconds kQuiet{50};
  static constexpr std::chrono::milliseconds kTogether{300};
  static constexpr std::chrono::minutes kUnwatchedInterval{2};
  static constexpr std::chrono::hours kFullInterval{24};
  // Pause after a failed round; doubled each time up to the second value.
  static constexpr std::chrono::milliseconds kFirstRetry{250};
  static constexpr std::chrono::milliseconds kLastRetry{60000};
  // With more places than this, everything is scanned.
  static constexpr size_t kMaxPlaces = 10000;

  struct Round {
    bool everything = false;
    std::set<std::string> places;  // if not `everything`
  };

  // A full round is due at once.
  explicit RescanPlan(Time now);

  // A directory or root must be scanned.
  void changed(const std::string& place, Time now);
  // Changes were lost, so a full round is needed.
  void lost(Time now);
  // Requests a round although no place has changed.
  void request(Time now);
  // The daemon may be running again: retries a failed round at once.
  void retry(Time now);
  // Replaces the set of places that are scanned at intervals.
  void setUnwatched(std::set<std::string> places, Time now);

  // When the next round may be due if nothing else changes.
  [[nodiscard]] Time next() const;
  // The round that is due, if any; it is current until `finished`.
  [[nodiscard]] std::optional<Round> take(Time now);
  // If the current round failed, its places are scheduled again.
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
