#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "client/SearchServiceProxy.h"
#include "platform/ProcessLock.h"
#include "sync/Catalogue.h"
#include "sync/Delivery.h"
#include "sync/MailboxScan.h"

// Keeps the index of one protection class in step with mailboxes: what is new, has changed, has
// moved or has gone since the last time is told from a catalogue of what was sent.
namespace mailsync {

// Another process syncs the same class; the domain of that error.
inline constexpr const char* kBusyDomain = "com.quill.tallow.sync.Busy";

struct SyncSettings {
  std::string runtimeDirectory;
  std::string protectionClass;
  std::string name;                // of the client, and of its state in the daemon
  std::string catalogueDirectory;  // see defaultCatalogueDirectory
  rpc::Patience patience{0};       // for a daemon that is not there
  std::chrono::milliseconds lockPatience{std::chrono::seconds(30)};  // for another sync

  std::vector<std::string> excluded;  // directories
  uint64_t largestMessage = 0;        // in bytes; larger ones fail; 0 for no limit
  // Of messages. Where more wait, only those that the run itself has found go out, and these only
  // where they are not more, too. 0 for no limit.
  uint64_t backlogLimit = 0;
  bool pruneMissing = false;
  bool retryFailed = false;
  bool dryRun = false;
};

struct SyncObserver {
  std::function<void(const std::string& where, const std::string& reason)> complain;
  // Before the first message is sent, and after each call: how many there are, and what was done.
  std::function<void(uint64_t messages, uint64_t deletions, const DeliveryCounts& done)> progress;
  // Asked often; true ends the run at the next point where all is in order. Any thread may set it.
  std::function<bool()> cancelled;
  // With `dryRun`: what would be done with a message, "send" or "delete".
  std::function<void(const char* action, const std::string& message)> plan;
  // See ScanSettings.
  std::function<void(const std::string& directory)> entering = {};
};

struct SyncReport {
  ScanCounts scan;
  DeliveryCounts delivery;
  uint64_t toSend = 0;
  uint64_t toDelete = 0;
  uint64_t held = 0;                 // messages beyond the limit of the backlog
  std::vector<std::string> missing;  // directories of the catalogue that are not there
  bool compared = false;             // the index was asked for what it holds
  bool cancelled = false;
};

// One run: scans `paths`, or all roots of the catalogue where there are none, and sends the
// difference. Paths that are new become roots. None with an error when the daemon, the catalogue or
// the lock has failed; `report` tells in either case what was done.
bool syncMail(const SyncSettings& settings, const std::vector<std::string>& paths,
              const SyncObserver& observer, SyncReport& report, TLErrorOut error);

// As above, of single directories at or below roots of the catalogue, and of roots: only these are
// looked into (see MailboxScan::rescan). A place that is below no root becomes one where it is
// there. Without any place, what waits is sent.
bool syncPlaces(const SyncSettings& settings, const std::vector<std::string>& places,
                const SyncObserver& observer, SyncReport& report, TLErrorOut error);

// Absolute and without links; what is not there, as far as that goes.
[[nodiscard]] std::string canonicalPath(const std::string& path);

// Each of the paths once, and none that lies below another.
[[nodiscard]] std::vector<std::string> outermost(std::vector<std::string> paths);

// What one process at a time may hold that watches the mailboxes of these settings; beside the lock
// of a run, which it takes for each.
[[nodiscard]] std::string watchLockPath(const SyncSettings& settings);

[[nodiscard]] bool hasCatalogue(const SyncSettings& settings);

// The catalogue of these settings, to read; null without an error where there is none yet.
[[nodiscard]] std::unique_ptr<Catalogue> openCatalogue(const SyncSettings& settings,
                                                       TLErrorOut error);

// Has the catalogue of these settings, if there is one, forget the names of messages that are
// deleted in the daemon as well. Without it they are kept, so that they can be deleted again in a
// daemon that is set back.
bool forgetDeleted(const SyncSettings& settings, TLErrorOut error);

// Seconds since 1970 of the last run that went to its end; none where there was none.
[[nodiscard]] std::optional<int64_t> lastSync(const SyncSettings& settings);

}  // namespace mailsync
