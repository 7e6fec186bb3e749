#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "cli/Options.h"
#include "cli/StateDirectory.h"
#include "platform/TLError.h"
#include "sync/Catalogue.h"

// What is known about mailboxes and index, for the forms that `tallow status` shows it in.
namespace cli {

// The daemon's statistics for one class.
struct IndexStatus {
  int64_t stored = 0;      // items
  int64_t searchable = 0;  // of these
  int64_t textBytes = 0;
  int64_t suffixes = 0;
  int64_t hotSuffixes = 0;  // not yet merged into a shard
  int64_t merges = 0;       // since the index was opened
  double mergeSeconds = 0;  // total duration of the merges
  int64_t scans = 0;        // for prefixes
  double scanSeconds = 0;   // total duration of the scans
  bool merging = false;
  int64_t deleted = 0;  // documents whose text is still in the files

  // The share of the files that belongs to deleted mail, from 0 to 1, assuming mails of equal
  // length.
  [[nodiscard]] double deletedShare() const {
    const int64_t all = searchable + deleted;
    return all <= 0 ? 0.0 : static_cast<double>(deleted) / static_cast<double>(all);
  }
};

// All information about one class.
struct ClassStatus {
  std::string name;
  std::unique_ptr<mailsync::Catalogue> catalogue;
  std::optional<int64_t> lastSync;
  bool isNew = false;  // nothing was ever indexed, so the daemon is not asked
  std::optional<IndexStatus> index;
  std::optional<DiskUse> disk;
  bool watched = false;
  std::optional<TLError> error;  // from the catalogue or the index
};

// The status of each class in question: that of the command line; otherwise the default class and
// those known from the state directory and the settings, as far as they have an index or a
// catalogue; the default class if none has.
[[nodiscard]] std::vector<ClassStatus> readClasses(const Options& options);

// Whether a watch is running for the mailboxes of the class.
[[nodiscard]] bool isWatched(const Options& options);

// The lock state of the device: locked, unlocked or unknown.
[[nodiscard]] std::string lockStatus(const Options& options);

// The figures of the class of the options as they are now; nullopt if the daemon does not tell.
[[nodiscard]] std::optional<mailsync::Measurement> measureIndex(const Options& options);

// A time in the user's time zone, such as 2024-02-06T09:42:00+0100.
[[nodiscard]] std::string timeText(int64_t seconds);

}  // namespace cli
