#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <unordered_set>
#include <vector>

#include "sync/Catalogue.h"

struct stat;

namespace mailsync {

// A directory whose time is not older than this when it is looked into may change again without
// showing it, since file systems count in steps; it is looked into again the next time.
inline constexpr int64_t kTimeStep = int64_t{2'000'000'000};  // nanoseconds

struct ScanCounts {
  uint64_t directories = 0;
  uint64_t entered = 0;      // of these
  uint64_t flagChanges = 0;  // of messages that are otherwise the same
  uint64_t moves = 0;        // within a folder, "new" to "cur" above all
  uint64_t unreadable = 0;   // files and directories
  uint64_t missing = 0;      // directories
};

struct ScanSettings {
  std::vector<std::string> excluded;  // canonical paths of directories
  bool pruneMissing = false;
  // What the user is to hear.
  std::function<void(const std::string& where, const std::string& reason)> complain;
  std::function<bool()> cancelled;
  // Told of each directory before its time is read, so that a watch that begins here misses
  // nothing; may be empty.
  std::function<void(const std::string& directory)> entering = {};
};

// Compares roots with the catalogue and writes the difference into it: new messages wait, those
// that have gone become deletions. The caller has begun a transaction.
//
// A directory is listed only when its time or inode has changed, and then each file's size, time
// and inode are compared. Files outside of Maildirs, which can change without their directory, are
// compared each time. Of an mbox file that has changed all messages are read and told by digest.
//
// What has gone from one place and come at another is settled at the end, in `finish`, when all
// roots have been seen: a message of the same Maildir folder and name is the same, whatever its
// flags; the same file by two paths counts once.
//
// Symbolic links are followed to files, and for a root itself. Directories are entered up to 64
// deep. One thread.
class MailboxScan {
 public:
  MailboxScan(Catalogue& catalogue, ScanSettings settings);

  // `path` is absolute; a file or a directory. False where there is nothing, or nothing readable.
  bool scan(const std::string& path);

  // Looks only into the directory `path`, at or below `root`, whatever its time tells, and into
  // those below it that are new, have gone or have come back. Of one that the catalogue does not
  // have, the nearest above it is looked into.
  void rescan(const std::string& path, const std::string& root);
  void finish();

  // Directories that are not there, without those below them; of the whole catalogue.
  [[nodiscard]] std::vector<std::string> missing() const;

  [[nodiscard]] const ScanCounts& counts() const { return _counts; }

 private:
  // A file that was not at this place before.
  struct Arrival {
    int64_t directory;
    std::string path;
    FileRow row;
    int64_t device;
  };
  struct Place {
    std::string path;
    int64_t parent;
    size_t depth;
    bool alone = false;  // as of `rescan`
  };

  void scanFrom(Place place);
  void scanDirectory(const Place& place, std::vector<Place>& pending);
  [[nodiscard]] bool isToBeEntered(const std::string& path) const;
  bool listDirectory(DirectoryRow& row, const struct stat& info, std::vector<std::string>& below);
  void compareFiles(const DirectoryRow& row);
  void compareFile(const std::string& path, FileRow row, const struct stat& info);
  void scanFile(const std::string& path, const struct stat& info);
  DirectoryRow& directoryAt(const std::string& path, int64_t parent);
  [[nodiscard]] std::vector<std::string> treeOf(const std::string& path) const;
  void noteMissing(const std::string& path);
  void removeTree(const std::string& path);
  void settleMissing();

  void settle(Arrival& arrival);
  bool settleMaildir(Arrival& arrival);
  bool settleAlias(Arrival& arrival);
  void addFile(Arrival& arrival);
  void removeFile(const FileRow& row);

  void readPlainFile(const std::string& path, FileRow& row);
  void checkContent(const std::string& path, const FileRow& row);
  [[nodiscard]] std::string pathOf(const FileRow& row) const;
  [[nodiscard]] bool excluded(const std::string& path) const;
  [[nodiscard]] FileRow rowOf(const struct stat& info) const;

  Catalogue& _catalogue;
  const ScanSettings _settings;
  const int64_t _now;
  ScanCounts _counts;
  std::map<std::string, DirectoryRow> _directories;  // by path
  std::map<int64_t, std::string> _paths;             // of directories
  std::map<int64_t, std::vector<std::string>> _children;
  std::set<std::string> _visited;  // directories; each is listed once
  std::vector<Arrival> _arrivals;
  std::unordered_set<int64_t> _departures;         // file IDs
  std::set<std::string, std::greater<>> _missing;  // directories, those below others first
};

}  // namespace mailsync
