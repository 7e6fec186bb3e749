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
  client::Patience patience{0};    // for a daemon that is not there
  std::chrono::milliseconds lockPatience{std::chrono::seconds(30)};  // for another sync

  std::vector<std::string> excluded;  // directories
  uint64_t maximumFileBytes = 0;      // larger files are left out; 0 for no limit
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
};

struct SyncReport {
  ScanCounts scan;
  DeliveryCounts delivery;
  uint64_t toSend = 0;
  uint64_t toDelete = 0;
  bool compared = false;  // the index was asked for what it holds
  bool cancelled = false;
};

// One run: scans `paths`, or all roots of the catalogue where there are none, and sends the
// difference. Paths that are new become roots. None with an error when the daemon, the catalogue or
// the lock has failed; `report` tells in either case what was done.
bool syncMail(const SyncSettings& settings, const std::vector<std::string>& paths,
              const SyncObserver& observer, SyncReport& report, TLErrorOut error);

// The catalogue of these settings, to read; null without an error where there is none yet.
[[nodiscard]] std::unique_ptr<Catalogue> openCatalogue(const SyncSettings& settings,
                                                       TLErrorOut error);

// Seconds since 1970 of the last run that went to its end; none where there was none.
[[nodiscard]] std::optional<int64_t> lastSync(Catalogue& catalogue);

}  // namespace mailsync
