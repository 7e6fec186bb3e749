#pragma once

#include <chrono>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "platform/PowerSupply.h"
#include "platform/ProcessLock.h"
#include "sync/ChangeSource.h"
#include "sync/MailSync.h"
#include "sync/RescanPlan.h"

namespace mailsync {

struct WatchSettings {
  SyncSettings sync;
  std::vector<std::string> roots;  // canonical paths, none below another
  bool onBattery = false;          // large backlogs do not wait for power
  std::string powerDirectory = platform::kPowerSupplyDirectory;
  // How often the power is looked at while something waits for it, or a round takes that long.
  std::chrono::milliseconds powerInterval{std::chrono::minutes(1)};
};

struct WatchObserver {
  std::function<void(const std::string& line)> say;
  std::function<void(const SyncReport& report)> finished;  // after each round that succeeded
  std::function<bool()> cancelled;                         // as of SyncObserver
};

// Keeps the index of one protection class in step with mailboxes, all the time. Each round is a run
// of its own (see MailSync.h), so that between two rounds nothing is open or locked but the watches
// and the lock that says that this class is watched.
//
// A directory is watched from just before it is first listed. Watches of what has moved elsewhere
// end with the next round over everything. One thread.
class MailWatch {
 public:
  using Time = RescanPlan::Time;

  // On battery more messages than this wait for power.
  static constexpr uint64_t kBatteryBacklog = 500;

  // Null with an error when the class is watched already, or the lock cannot be made.
  [[nodiscard]] static std::unique_ptr<MailWatch> start(WatchSettings settings,
                                                        std::unique_ptr<ChangeSource> source,
                                                        WatchObserver observer, Time now,
                                                        TLErrorOut error);

  // `turn` has something to do at `next`, and when the descriptor can be read, if there is one.
  [[nodiscard]] int descriptor() const { return _source->descriptor(); }
  [[nodiscard]] Time next() const;
  void turn(Time now);

 private:
  MailWatch(WatchSettings settings, std::unique_ptr<ChangeSource> source, WatchObserver observer,
            std::unique_ptr<platform::ProcessLock> lock, Time now);

  void take(const Change& change, Time now);
  void checkPower(Time now);
  void run(const RescanPlan::Round& round);
  [[nodiscard]] SyncObserver roundObserver();
  bool stopsForPower();
  void enter(const std::string& directory);
  void settle(const SyncReport& report, bool everything, Time now);
  void watchAround();
  void tellHeld(uint64_t held);
  void tellFailure(const std::optional<TLError>& error);
  void sayOnce(const std::string& line);

  const WatchSettings _settings;
  const std::unique_ptr<ChangeSource> _source;
  const WatchObserver _observer;
  const std::unique_ptr<platform::ProcessLock> _lock;
  RescanPlan _plan;

  std::map<std::string, std::string> _gates;  // by root, a directory above it that is watched
  std::set<std::string> _entered;             // directories, of this round
  std::set<std::string> _refused;             // directories that cannot be watched
  std::set<std::string> _said;                // since the last round over everything
  std::string _failure;                       // of the last round; empty where it succeeded
  uint64_t _held = 0;                         // messages that wait for power
  Time _nextPower;
  bool _stoppedForPower = false;  // the round in hand
  uint64_t _remaining = 0;        // messages of the round in hand
};

}  // namespace mailsync
