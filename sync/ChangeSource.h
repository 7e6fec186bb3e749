#pragma once

#include <set>
#include <string>
#include <vector>

namespace mailsync {

// What has happened to an entry of a watched directory, or to the directory itself.
struct Change {
  enum class Kind {
    entry,  // `name` has come, gone or changed
    self,   // the directory has gone, or is not watched any more
    lost,   // some changes were not told
  };
  Kind kind = Kind::entry;
  std::string directory;  // as it was given to `watch`
  std::string name;
  bool isDirectory = false;  // the entry
};

// Tells of changes in single directories, not in those below them. One thread.
class ChangeSource {
 public:
  enum class Result {
    watched,
    absent,   // no directory is there
    refused,  // it cannot be watched; the system has no room for one more, above all
  };

  virtual ~ChangeSource() = default;

  // Also of a directory that is watched already. One that has moved since is told by its new path
  // from now on; until then, by the old one.
  virtual Result watch(const std::string& directory) = 0;

  // Ends the watches of all other directories.
  virtual void keepOnly(const std::set<std::string>& directories) = 0;

  // What has happened since the last call; does not wait.
  [[nodiscard]] virtual std::vector<Change> read() = 0;

  // Readable while there is something to read; negative where there can be nothing.
  [[nodiscard]] virtual int descriptor() const = 0;
};

}  // namespace mailsync
