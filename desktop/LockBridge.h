#pragma once

#include <memory>
#include <string>

#include "desktop/ScreenLock.h"
#include "platform/RunLoop.h"
#include "platform/TLError.h"

namespace desktop {

// Keeps the daemon's lock status in step with the screen. The status is "locked" unless a session
// with an open screen is known: at the start until logind has answered, and after the end.
//
// Threads: that of the loop.
class LockBridge {
 public:
  // Writes the status to the file `path`. Null with an error if the file cannot be written or
  // logind does not answer.
  [[nodiscard]] static std::unique_ptr<LockBridge> start(platform::RunLoop& loop, std::string path,
                                                         TLErrorOut error);
  ~LockBridge();
  LockBridge(const LockBridge&) = delete;
  LockBridge& operator=(const LockBridge&) = delete;

  // False once the file could not be written; the loop has then been stopped.
  [[nodiscard]] bool good() const { return _good; }

 private:
  LockBridge(platform::RunLoop& loop, std::string path) : _loop(loop), _path(std::move(path)) {}
  bool write(bool locked, TLErrorOut error);
  void follow();

  platform::RunLoop& _loop;
  const std::string _path;
  bool _good = true;
  std::unique_ptr<ScreenLock> _screen;
};

}  // namespace desktop
