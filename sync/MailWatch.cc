#include "sync/MailWatch.h"

#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "cli/ErrorText.h"
#include "cli/Identifier.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "sync/Inventory.h"

namespace mailsync {

namespace {

constexpr size_t kMaxReported = 1000;

std::string above(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
}

// Files that mail programs keep next to mail and write on each access; a scan for them would be
// useless. Folders and messages may have such names.
bool isNoMail(const Change& change) {
  const std::string& name = change.name;
  if (change.isDirectory || cli::isMaildirFile(platform::joinPath(change.directory, name))) {
    return false;
  }
  for (const char* const start : {"dovecot", ".mbsyncstate", ".uidvalidity", ".isyncuidmap"}) {
    if (name.starts_with(start)) return true;
  }
  return name.ends_with(".lock");
}

}  // namespace

std::unique_ptr<MailWatch> MailWatch::start(WatchSettings settings,
                                            std::unique_ptr<ChangeSource> source,
                                            WatchObserver observer, Time now, TLErrorOut error) {
  std::optional<TLError> failure;
  auto lock = platform::ProcessLock::acquire(watchLockPath(settings.sync), &failure);
  if (lock == nullptr) {
    if (failure->code == EWOULDBLOCK) {
      failure = {kBusyDomain, EWOULDBLOCK, "another watch of this class is at work"};
    }
    platform::setError(error, *failure);
    return nullptr;
  }
  return std::unique_ptr<MailWatch>(new MailWatch(std::move(settings), std::move(source),
                                                  std::move(observer), std::move(lock), now));
}

MailWatch::MailWatch(WatchSettings settings, std::unique_ptr<ChangeSource> source,
                     WatchObserver observer, std::unique_ptr<platform::ProcessLock> lock, Time now)
    : _settings(std::move(settings)),
      _source(std::move(source)),
      _observer(std::move(observer)),
      _lock(std::move(lock)),
      _plan(now),
      _nextPower(now + _settings.powerInterval) {
  watchAround();
}

MailWatch::Time MailWatch::next() const {
  return _held > 0 ? std::min(_plan.next(), _nextPower) : _plan.next();
}

void MailWatch::turn(Time now) {
  for (const Change& change : _source->read()) take(change, now);
  checkPower(now);
  if (const auto round = _plan.take(now)) run(*round);
}

// --- Changes

void MailWatch::take(const Change& change, Time now) {
  if (change.kind == Change::Kind::lost) return _plan.lost(now);
  if (change.directory == _settings.sync.runtimeDirectory &&
      change.name == rpc::kSearchServiceName) {
    _plan.retry(now);
  }
  const std::string entry =
      change.name.empty() ? change.directory : platform::joinPath(change.directory, change.name);
  for (const std::string& root : _settings.roots) {
    const bool inside = isAtOrBelow(change.directory, root);
    if (inside && !isNoMail(change)) _plan.changed(change.directory, now);
    if (!inside && isAtOrBelow(root, entry)) _plan.changed(root, now);
  }
}

// To notice that a root appears or disappears, or that a daemon starts, watches the nearest
// existing directory above each root and the directory of the daemon's sockets.
void MailWatch::watchAround() {
  for (const std::string& root : _settings.roots) {
    std::string gate = above(root);
    while (_source->watch(gate) == ChangeSource::Result::absent && gate != "/") gate = above(gate);
    _gates[root] = gate;
  }
  (void)_source->watch(_settings.sync.runtimeDirectory);
}

// --- Power

void MailWatch::checkPower(Time now) {
  if (_held == 0 || now < _nextPower) return;
  _nextPower = now + _settings.powerInterval;
  if (!platform::runsOnBattery(_settings.powerDirectory)) _plan.request(now);
}

// True if the device has switched to battery while many messages are still to be sent.
bool MailWatch::stopsForPower() {
  const Time now = RescanPlan::Clock::now();
  if (_settings.onBattery || _remaining <= kBatteryBacklog || now < _nextPower) return false;
  _nextPower = now + _settings.powerInterval;
  _stoppedForPower = platform::runsOnBattery(_settings.powerDirectory);
  return _stoppedForPower;
}

void MailWatch::tellHeld(uint64_t held) {
  if (held > 0 && _held == 0) {
    _observer.say(fmt::format(
        "{} messages wait for power; --on-battery or on_battery = true sends them now", held));
  } else if (held == 0 && _held > 0) {
    _observer.say("no message waits for power any more");
  }
  _held = held;
}

// --- Rounds

void MailWatch::run(const RescanPlan::Round& round) {
  _entered.clear();
  if (round.everything) _said.clear();
  _stoppedForPower = false;
  _remaining = 0;
  _nextPower = RescanPlan::Clock::now() + _settings.powerInterval;
  SyncSettings settings = _settings.sync;
  const bool onBattery = !_settings.onBattery && platform::runsOnBattery(_settings.powerDirectory);
  settings.backlogLimit = onBattery ? kBatteryBacklog : 0;
  SyncReport report;
  std::optional<TLError> error;
  const SyncObserver observer = roundObserver();
  const bool done = round.everything
                        ? syncMail(settings, _settings.roots, observer, report, &error)
                        : syncPlaces(settings, {round.places.begin(), round.places.end()}, observer,
                                     report, &error);
  const Time now = RescanPlan::Clock::now();
  watchAround();
  const bool incomplete = report.cancelled && !_stoppedForPower;
  _plan.finished(done && !incomplete, now);
  if (incomplete) return;
  if (!done) return tellFailure(error);
  if (!_failure.empty()) _observer.say("in step again");
  _failure.clear();
  // The next round applies the battery limit.
  if (_stoppedForPower) _plan.request(now);
  if (!_stoppedForPower) tellHeld(report.held);
  settle(report, round.everything, now);
  _observer.finished(report);
}

SyncObserver MailWatch::roundObserver() {
  return {[this](const std::string& where, const std::string& reason) {
            sayOnce(fmt::format("{}: {}", where, reason));
          },
          [this](uint64_t messages, uint64_t, const DeliveryCounts& done) {
            _remaining = messages - std::min(messages, done.added + done.replaced + done.failed);
          },
          [this] { return _observer.cancelled() || stopsForPower(); },
          [](const char*, const std::string&) {},
          [this](const std::string& directory) { enter(directory); }};
}

void MailWatch::enter(const std::string& directory) {
  _entered.insert(directory);
  if (_source->watch(directory) == ChangeSource::Result::refused) {
    _refused.insert(directory);
  } else {
    _refused.erase(directory);
  }
}

// Updates the plan with what this round found: which directories cannot be watched, and what waits
// for power.
void MailWatch::settle(const SyncReport& report, bool everything, Time now) {
  if (everything) {
    std::erase_if(_refused, [&](const std::string& path) { return !_entered.contains(path); });
    std::set<std::string> kept = _entered;
    for (const auto& [root, gate] : _gates) kept.insert(gate);
    kept.insert(_settings.sync.runtimeDirectory);
    _source->keepOnly(kept);
  }
  if (!_refused.empty()) {
    sayOnce(fmt::format(
        "some directories, such as {}, cannot be watched and are looked at every {} minutes; "
        "see fs.inotify in sysctl(8)",
        *_refused.begin(), RescanPlan::kUnwatchedInterval.count()));
  }
  std::set<std::string> unwatched = _refused;
  unwatched.insert(report.missing.begin(), report.missing.end());
  for (const std::string& root : _settings.roots) {
    if (!platform::fileExists(root)) unwatched.insert(root);
  }
  _plan.setUnwatched(std::move(unwatched), now);
}

// --- Messages to the user

void MailWatch::tellFailure(const std::optional<TLError>& error) {
  const std::string failure = error ? cli::plainText(*error) : "the daemon gave no answer";
  if (failure == _failure) return;
  _failure = failure;
  _observer.say(failure + "; tried again until it succeeds");
}

void MailWatch::sayOnce(const std::string& line) {
  if (_said.size() >= kMaxReported || !_said.insert(line).second) return;
  _observer.say(line);
}

}  // namespace mailsync
