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

// File systems store times in steps. A directory that changed less than this before it was listed
// may change again with the same time, so it is listed again in the next run.
inline constexpr int64_t kTimeStep = int64_t{2'000'000'000};  // nanoseconds

struct ScanCounts {
  uint64_t directories = 0;
  uint64_t entered = 0;      // of the directories
  uint64_t flagChanges = 0;  // of otherwise unchanged messages
  uint64_t moves = 0;        // within a folder, mostly "new" to "cur"
  uint64_t unreadable = 0;   // files and directories
  uint64_t missing = 0;      // directories
};

struct ScanSettings {
  std::vector<std::string> excluded;  // canonical paths of directories
  bool pruneMissing = false;
  // Reports a problem to the user.
  std::function<void(const std::string& where, const std::string& reason)> complain;
  std::function<bool()> cancelled;
  // Called for each directory before its time is read, so that a watch that starts here misses
  // nothing; may be empty.
  std::function<void(const std::string& directory)> entering = {};
};

// Compares roots with the catalogue and records the differences in it: new messages wait to be
// sent, and messages that are gone become deletions. The caller has begun a transaction.
//
// A directory is listed only if its time or inode has changed; then the size, time and inode of
// each file are compared. Files outside of Maildirs can change without their directory and are
// compared in every run. All messages of a changed mbox file are read and identified by digest.
//
// Moves are settled in `finish`, after all roots have been scanned: a message with the same Maildir
// folder and name is the same message, whatever its flags, and a file with two paths counts once.
//
// Symbolic links to files are followed, and a root may be a link. Directories are entered up to 64
// levels deep; link folders of searches are not. One thread.
class MailboxScan {
 public:
  MailboxScan(Catalogue& catalogue, ScanSettings settings);

  // `path` is absolute, a file or a directory. False if it does not exist or cannot be read.
  bool scan(const std::string& path);

  // Lists only the directory `path`, at or below `root`, even if its time is unchanged, and
  // directories below it that are new, gone or back again. If the catalogue does not have `path`,
  // its nearest known parent is listed.
  void rescan(const std::string& path, const std::string& root);
  void finish();

  // Directories of the whole catalogue that do not exist, without their subdirectories.
  [[nodiscard]] std::vector<std::string> missing() const;

  [[nodiscard]] const ScanCounts& counts() const { return _counts; }

 private:
  // A file that is new at this place.
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
    bool alone = false;  // as in `rescan`
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
  std::set<std::string, std::greater<>> _missing;  // directories, children before parents
};

}  // namespace mailsync
