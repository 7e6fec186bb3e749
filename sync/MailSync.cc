#include "sync/MailSync.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sqlite3.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <thread>

#include "platform/FileDescriptor.h"
#include "platform/Files.h"
#include "sync/Inventory.h"

namespace mailsync {

std::string canonicalPath(const std::string& path) {
  std::error_code failure;
  std::string found = std::filesystem::weakly_canonical(path, failure).string();
  if (failure) found = std::filesystem::absolute(path, failure).lexically_normal().string();
  while (found.size() > 1 && found.back() == '/') found.pop_back();
  return found;
}

std::vector<std::string> outermost(std::vector<std::string> paths) {
  std::sort(paths.begin(), paths.end());
  std::vector<std::string> kept;
  for (std::string& path : paths) {
    const bool covered = std::any_of(kept.begin(), kept.end(), [&](const std::string& other) {
      return isAtOrBelow(path, other);
    });
    if (!covered) kept.push_back(std::move(path));
  }
  return kept;
}

namespace {

constexpr std::chrono::milliseconds kLockStep{50};

std::string pathOf(const SyncSettings& settings) {
  return cataloguePath(settings.catalogueDirectory, settings.runtimeDirectory,
                       settings.protectionClass);
}

// The modification time of this file is the end of the last run. A run without changes does not
// write to the catalogue, because a transaction would wait for the disk several times.
std::string endPath(const SyncSettings& settings) {
  return pathOf(settings) + ".ended";
}

// Failures are ignored: the time is only shown to the user.
void noteEnd(const SyncSettings& settings) {
  const platform::FileDescriptor file(
      open(endPath(settings).c_str(), O_WRONLY | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
  if (file.get() >= 0) futimens(file.get(), nullptr);
}

// Such as 20240206.
int64_t today() {
  const std::time_t now = std::time(nullptr);
  std::tm parts{};
  localtime_r(&now, &parts);
  return (parts.tm_year + 1900) * 10000 + (parts.tm_mon + 1) * 100 + parts.tm_mday;
}

// Locks one catalogue. Waits for another process for at most `lockPatience`.
std::unique_ptr<platform::ProcessLock> acquireLock(const SyncSettings& settings,
                                                   const std::function<bool()>& cancelled,
                                                   TLErrorOut error) {
  const std::string path = pathOf(settings) + ".lock";
  const auto end = std::chrono::steady_clock::now() + settings.lockPatience;
  while (true) {
    std::optional<TLError> failure;
    auto lock = platform::ProcessLock::acquire(path, &failure);
    if (lock != nullptr) return lock;
    if (failure->code != EWOULDBLOCK) {
      platform::setError(error, *failure);
      return nullptr;
    }
    if (std::chrono::steady_clock::now() >= end || cancelled()) {
      platform::setError(error,
                         {kBusyDomain, EWOULDBLOCK, "another sync of this class is at work"});
      return nullptr;
    }
    std::this_thread::sleep_for(kLockStep);
  }
}

std::string damagedPath(const std::string& path) {
  return path + ".damaged";
}

// A damaged file is set aside and replaced by a new catalogue.
std::unique_ptr<Catalogue> openForWriting(const std::string& path, TLErrorOut error) {
  std::optional<TLError> failure;
  auto catalogue = Catalogue::open(path, &failure);
  if (catalogue == nullptr && (failure->code == SQLITE_NOTADB || failure->code == SQLITE_CORRUPT)) {
    std::rename(path.c_str(), damagedPath(path).c_str());
    std::remove((path + "-wal").c_str());
    std::remove((path + "-shm").c_str());
    failure.reset();
    catalogue = Catalogue::open(path, &failure);
  }
  if (catalogue == nullptr) platform::setError(error, *failure);
  return catalogue;
}

// What a run scans: `paths` as in syncMail, or single places.
struct Scope {
  std::vector<std::string> paths;
  bool onlyPlaces = false;
  std::vector<std::string> places = {};
};

class Run {
 public:
  Run(const SyncSettings& settings, const SyncObserver& observer, SyncReport& report)
      : _settings(settings),
        _observer(observer),
        _report(report),
        _service(settings.runtimeDirectory, settings.patience) {}

  bool run(const Scope& scope, TLErrorOut error) {
    const auto lock = acquireLock(_settings, _observer.cancelled, error);
    if (lock == nullptr) return false;
    _catalogue = openForWriting(pathOf(_settings), error);
    if (_catalogue == nullptr) return false;
    std::optional<TLError> failure;
    const auto text =
        _service.fetchLastClientState(_settings.name, _settings.protectionClass, &failure);
    if (failure) {
      platform::setError(error, *failure);
      return false;
    }
    if (text) _stored = DeliveredState::parse(*text);
    return update(scope, error) && (_settings.dryRun || _report.cancelled || deliver(error));
  }

 private:
  // After this the catalogue has all changes to send.
  bool update(const Scope& scope, TLErrorOut error) {
    _catalogue->begin();
    const int64_t last = _catalogue->lastMessage();
    scan(scope);
    _report.cancelled = _observer.cancelled();
    if (_report.cancelled || !reconcile(error)) {
      _catalogue->rollback();
      return _report.cancelled;
    }
    if (_settings.retryFailed) _catalogue->retryFailed();
    if (_settings.reread) _catalogue->setAllStale();
    _report.toSend = static_cast<uint64_t>(_catalogue->waitingCount());
    if (_settings.backlogLimit > 0 && _report.toSend > _settings.backlogLimit) hold(last + 1);
    _report.toDelete = static_cast<uint64_t>(_catalogue->waitingDeletionCount());
    if (_settings.dryRun) tellPlan();
    const auto failure = _catalogue->failure();
    if (_settings.dryRun) {
      _catalogue->rollback();
    } else {
      _catalogue->commit();
    }
    const auto& failed = failure ? failure : _catalogue->failure();
    if (failed) platform::setError(error, *failed);
    return !failed;
  }

  // Only messages from `first` on will be sent.
  void hold(int64_t first) {
    const uint64_t recent = _catalogue->waitingIDs(first).size();
    const uint64_t sent = recent <= _settings.backlogLimit ? recent : 0;
    _firstMessage = sent > 0 ? first : kWaiting;
    _report.held = _report.toSend - sent;
    _report.toSend = sent;
  }

  void scan(const Scope& scope) {
    MailboxScan scanner(*_catalogue, scanSettings());
    if (scope.onlyPlaces) {
      scanPlaces(scanner, scope.places);
    } else {
      scanRoots(scanner, scope.paths);
    }
    scanner.finish();
    _report.scan = scanner.counts();
    _report.missing = scanner.missing();
  }

  [[nodiscard]] ScanSettings scanSettings() const {
    ScanSettings settings;
    for (const std::string& path : _settings.excluded) {
      settings.excluded.push_back(canonicalPath(path));
    }
    settings.pruneMissing = _settings.pruneMissing;
    settings.complain = _observer.complain;
    settings.cancelled = _observer.cancelled;
    settings.entering = _observer.entering;
    return settings;
  }

  void scanRoots(MailboxScan& scanner, const std::vector<std::string>& paths) {
    const std::vector<std::string> before = _catalogue->roots();
    std::vector<std::string> roots = before;
    std::vector<std::string> wanted;
    for (const std::string& path : paths) wanted.push_back(canonicalPath(path));
    wanted = outermost(std::move(wanted));
    for (const std::string& path : paths.empty() ? before : wanted) {
      const bool found = scanner.scan(path);
      if (found) roots.push_back(path);
      if (!found && _settings.pruneMissing) std::erase(roots, path);
    }
    roots = outermost(std::move(roots));
    if (roots == before) return;
    for (const std::string& root : before) _catalogue->removeRoot(root);
    for (const std::string& root : roots) _catalogue->addRoot(root);
  }

  void scanPlaces(MailboxScan& scanner, std::vector<std::string> places) {
    // A parent directory finds its new subdirectories, so parents come first.
    std::sort(places.begin(), places.end());
    const std::vector<std::string> roots = _catalogue->roots();
    for (const std::string& place : places) {
      const auto root = std::find_if(roots.begin(), roots.end(), [&](const std::string& path) {
        return isAtOrBelow(place, path);
      });
      if (root != roots.end()) {
        scanner.rescan(place, *root);
      } else if (scanner.scan(place)) {
        _catalogue->addRoot(place);
      }
    }
  }

  // Brings catalogue and index into agreement. If the daemon's state is from this catalogue, the
  // state decides: a batch that the daemon has counts as sent even if that was not recorded, and a
  // lost batch waits again. Otherwise the index is asked for its contents.
  bool reconcile(TLErrorOut error) {
    if (_stored && _stored->catalogue == _catalogue->id() &&
        _stored->sequence <= _catalogue->highestSequence() &&
        _stored->sequence >= _catalogue->horizon()) {
      if (_stored->sequence != _catalogue->acknowledged()) {
        _catalogue->setAcknowledged(_stored->sequence);
      }
      return true;
    }
    _report.compared = true;
    std::vector<std::string> folders;
    for (const DirectoryRow& row : _catalogue->directories()) folders.push_back(row.path);
    for (const FolderCount& count : _catalogue->folderCounts()) folders.push_back(count.path);
    const auto present =
        readInventory(_service, _settings.protectionClass, _catalogue->roots(), folders, error);
    const bool ours = _stored && _stored->catalogue == _catalogue->id();
    if (present) _catalogue->adopt(*present, ours ? _stored->sequence : kWaiting);
    return present.has_value();
  }

  void tellPlan() {
    for (const int64_t id : _catalogue->waitingIDs()) {
      if (const auto waiting = _catalogue->waitingMessage(id)) {
        _observer.plan("send", waiting->message.identifier);
      }
    }
    for (const std::string& identifier : _catalogue->waitingDeletions()) {
      _observer.plan("delete", identifier);
    }
  }

  bool deliver(TLErrorOut error) {
    const auto progress = [&](const DeliveryCounts& done) {
      _observer.progress(_report.toSend, _report.toDelete, done);
    };
    if (_report.toSend + _report.toDelete > 0) progress({});
    Delivery delivery(*_catalogue, _service,
                      {_settings.name, _settings.protectionClass, _settings.largestMessage,
                       _firstMessage, _settings.extractProgram},
                      {_observer.complain, progress, _observer.cancelled});
    const bool done = delivery.run(_stored, error);
    _report.delivery = delivery.counts();
    _report.cancelled = _observer.cancelled();
    if (!done || _report.cancelled) return done;
    noteEnd(_settings);
    return measure(error);
  }

  bool measure(TLErrorOut error) {
    const int64_t day = today();
    if (!_settings.measure || _catalogue->isMeasured(day)) return true;
    auto measurement = _settings.measure();
    if (!measurement) return true;
    measurement->day = day;
    _catalogue->begin();
    _catalogue->addMeasurement(*measurement);
    if (_catalogue->commit()) return true;
    platform::setError(error, *_catalogue->failure());
    return false;
  }

  const SyncSettings& _settings;
  const SyncObserver& _observer;
  SyncReport& _report;
  client::SearchServiceProxy _service;
  std::unique_ptr<Catalogue> _catalogue;
  std::optional<DeliveredState> _stored;
  int64_t _firstMessage = 0;  // to be sent
};

}  // namespace

bool syncMail(const SyncSettings& settings, const std::vector<std::string>& paths,
              const SyncObserver& observer, SyncReport& report, TLErrorOut error) {
  return Run(settings, observer, report).run({paths}, error);
}

bool syncPlaces(const SyncSettings& settings, const std::vector<std::string>& places,
                const SyncObserver& observer, SyncReport& report, TLErrorOut error) {
  return Run(settings, observer, report).run({{}, true, places}, error);
}

std::string watchLockPath(const SyncSettings& settings) {
  return pathOf(settings) + ".watch";
}

bool hasCatalogue(const SyncSettings& settings) {
  return platform::fileExists(pathOf(settings));
}

std::unique_ptr<Catalogue> openCatalogue(const SyncSettings& settings, TLErrorOut error) {
  return hasCatalogue(settings) ? Catalogue::open(pathOf(settings), error) : nullptr;
}

bool forgetDeleted(const SyncSettings& settings, TLErrorOut error) {
  std::remove(damagedPath(pathOf(settings)).c_str());
  if (!hasCatalogue(settings)) return true;
  const auto lock = acquireLock(
      settings, [] { return false; }, error);
  if (lock == nullptr) return false;
  const auto catalogue = Catalogue::open(pathOf(settings), error);
  if (catalogue == nullptr) return false;
  if (!catalogue->forgetDeletions()) platform::setError(error, *catalogue->failure());
  return !catalogue->failure();
}

std::optional<int64_t> lastSync(const SyncSettings& settings) {
  struct stat info;
  if (stat(endPath(settings).c_str(), &info) != 0) return std::nullopt;
  return info.st_mtim.tv_sec;
}

}  // namespace mailsync
