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

// Keeps the index of one protection class in step with mailboxes. A catalogue of sent messages
// shows what was added, changed, moved or deleted since the last run.
namespace mailsync {

// The error domain for when another process is syncing the same class.
inline constexpr const char* kBusyDomain = "com.quill.tallow.sync.Busy";

struct SyncSettings {
  std::string runtimeDirectory;
  std::string protectionClass;
  std::string name;                // of the client, and of its state in the daemon
  std::string catalogueDirectory;  // see defaultCatalogueDirectory
  rpc::Patience patience{0};       // for a daemon that is not running
  std::chrono::milliseconds lockPatience{std::chrono::seconds(30)};  // for another sync

  std::vector<std::string> excluded;  // directories
  uint64_t largestMessage = 0;        // in bytes; larger ones fail; 0 for no limit
  std::string extractProgram;         // see ItemReader
  // The number of messages that may wait. If more wait, only those found by this run are sent, and
  // only if they do not exceed the limit either. 0 means no limit.
  uint64_t backlogLimit = 0;
  // The figures for the history; called at most once a day, at the end of a complete run. Nullopt
  // if they are not known now; may be empty.
  std::function<std::optional<Measurement>()> measure = {};
  bool pruneMissing = false;
  bool retryFailed = false;
  bool reread = false;  // all messages are sent again
  bool dryRun = false;
};

struct SyncObserver {
  std::function<void(const std::string& where, const std::string& reason)> complain;
  // Called before the first message is sent and after each call, with the totals and what is done.
  std::function<void(uint64_t messages, uint64_t deletions, const DeliveryCounts& done)> progress;
  // Called often; true ends the run at the next consistent point. The result may change on any
  // thread.
  std::function<bool()> cancelled;
  // With `dryRun`: the action that would be taken for a message, "send" or "delete".
  std::function<void(const char* action, const std::string& message)> plan;
  // See ScanSettings.
  std::function<void(const std::string& directory)> entering = {};
};

struct SyncReport {
  ScanCounts scan;
  DeliveryCounts delivery;
  uint64_t toSend = 0;
  uint64_t toDelete = 0;
  uint64_t held = 0;                 // messages beyond the backlog limit
  std::vector<std::string> missing;  // directories of the catalogue that do not exist
  bool compared = false;             // the index was asked for its contents
  bool cancelled = false;
};

// One run: scans `paths`, or all roots of the catalogue if there are none, and sends the
// differences. New paths become roots. False with an error if the daemon, the catalogue or the lock
// failed; `report` is filled in either case.
bool syncMail(const SyncSettings& settings, const std::vector<std::string>& paths,
              const SyncObserver& observer, SyncReport& report, TLErrorOut error);

// As above, but scans only the given directories at or below roots, and roots (see
// MailboxScan::rescan). A place below no root becomes a root if it exists. Without places, only
// waiting changes are sent.
bool syncPlaces(const SyncSettings& settings, const std::vector<std::string>& places,
                const SyncObserver& observer, SyncReport& report, TLErrorOut error);

// The absolute path without symbolic links, resolved as far as the path exists.
[[nodiscard]] std::string canonicalPath(const std::string& path);

// Removes duplicates and paths that are below another one.
[[nodiscard]] std::vector<std::string> outermost(std::vector<std::string> paths);

// The lock file of a watch on these mailboxes. A watch holds it all the time, and takes the lock of
// a run for each round as well.
[[nodiscard]] std::string watchLockPath(const SyncSettings& settings);

[[nodiscard]] bool hasCatalogue(const SyncSettings& settings);

// Opens the catalogue of these settings for reading; null without an error if there is none yet.
[[nodiscard]] std::unique_ptr<Catalogue> openCatalogue(const SyncSettings& settings,
                                                       TLErrorOut error);

// Makes the catalogue, if there is one, forget the names of deleted messages whose deletion the
// daemon has acknowledged. They are kept otherwise, to be deleted again if the daemon is restored
// to an older state.
bool forgetDeleted(const SyncSettings& settings, TLErrorOut error);

// When the last complete run ended, in seconds since 1970; nullopt if there was none.
[[nodiscard]] std::optional<int64_t> lastSync(const SyncSettings& settings);

}  // namespace mailsync
