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
  // How often the power state is checked while messages wait for it or a long round runs.
  std::chrono::milliseconds powerInterval{std::chrono::minutes(1)};
};

struct WatchObserver {
  std::function<void(const std::string& line)> say;
  std::function<void(const SyncReport& report)> finished;  // after each round that succeeded
  std::function<bool()> cancelled;                         // as in SyncObserver
};

// Continuously keeps the index of one protection class in step with mailboxes. Each round is a
// separate run (see MailSync.h), so between rounds only the watches and the watch lock of this
// class are held.
//
// A directory is watched from just before it is first listed. Watches of directories that have
// moved away end with the next full round. One thread.
class MailWatch {
 public:
  using Time = RescanPlan::Time;

  // On battery, a backlog above this number of messages waits for power.
  static constexpr uint64_t kBatteryBacklog = 500;

  // Null with an error if the class is watched already or the lock file cannot be created.
  [[nodiscard]] static std::unique_ptr<MailWatch> start(WatchSettings settings,
                                                        std::unique_ptr<ChangeSource> source,
                                                        WatchObserver observer, Time now,
                                                        TLErrorOut error);

  // Call `turn` at `next`, and when the descriptor, if any, becomes readable.
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

  std::map<std::string, std::string> _gates;  // by root: the watched directory above it
  std::set<std::string> _entered;             // directories scanned in this round
  std::set<std::string> _refused;             // directories that cannot be watched
  std::set<std::string> _said;                // lines reported since the last full round
  std::string _failure;                       // of the last round; empty if it succeeded
  uint64_t _held = 0;                         // messages waiting for power
  Time _nextPower;
  bool _stoppedForPower = false;  // the current round
  uint64_t _remaining = 0;        // messages left in the current round
};

}  // namespace mailsync
