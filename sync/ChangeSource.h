#pragma once

#include <set>
#include <string>
#include <vector>

namespace mailsync {

// A change of an entry of a watched directory, or of the directory itself.
struct Change {
  enum class Kind {
    entry,  // `name` was created, removed or changed
    self,   // the directory was removed or is no longer watched
    lost,   // some changes were not reported
  };
  Kind kind = Kind::entry;
  std::string directory;  // as passed to `watch`
  std::string name;
  bool isDirectory = false;  // about the entry
};

// Reports changes in single directories, not in their subdirectories. One thread.
class ChangeSource {
 public:
  enum class Result {
    watched,
    absent,   // the directory does not exist
    refused,  // it cannot be watched, mostly because the system's limit is reached
  };

  virtual ~ChangeSource() = default;

  // May be called again for a watched directory. If the directory has been moved, its changes are
  // reported under the new path from then on, and under the old path until then.
  virtual Result watch(const std::string& directory) = 0;

  // Ends the watches of all other directories.
  virtual void keepOnly(const std::set<std::string>& directories) = 0;

  // The changes since the last call. Does not wait.
  [[nodiscard]] virtual std::vector<Change> read() = 0;

  // Readable while changes are waiting; negative if there can be none.
  [[nodiscard]] virtual int descriptor() const = 0;
};

}  // namespace mailsync
