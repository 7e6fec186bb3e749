#pragma once

#include <map>
#include <unordered_map>

#include "platform/FileDescriptor.h"
#include "sync/ChangeSource.h"

struct inotify_event;

namespace mailsync {

// Changes reported by the kernel (inotify). A file counts as changed when it is closed after
// writing, so a file is not read again and again while it is being written. If the system provides
// no inotify object, every watch is refused.
class DirectoryWatch : public ChangeSource {
 public:
  DirectoryWatch();

  Result watch(const std::string& directory) override;
  void keepOnly(const std::set<std::string>& directories) override;
  [[nodiscard]] std::vector<Change> read() override;
  [[nodiscard]] int descriptor() const override { return _inotify.get(); }

 private:
  void take(const inotify_event& event, std::vector<Change>& changes);
  void drop(int watch);

  const platform::FileDescriptor _inotify;
  std::unordered_map<int, std::string> _directories;  // by watch
  std::map<std::string, int> _watches;                // by directory
};

}  // namespace mailsync
