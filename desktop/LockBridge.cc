#include "desktop/LockBridge.h"

#include <utility>

#include "platform/DeviceVault.h"
#include "platform/Log.h"

namespace desktop {

namespace {

const platform::Log& log() {
  static const platform::Log handle(platform::kSubsystem, "LockBridge");
  return handle;
}

}  // namespace

std::unique_ptr<LockBridge> LockBridge::start(platform::RunLoop& loop, std::string path,
                                              TLErrorOut error) {
  std::unique_ptr<LockBridge> bridge(new LockBridge(loop, std::move(path)));
  if (!bridge->write(true, error)) return nullptr;
  bridge->_screen = ScreenLock::follow(
      loop, true, [self = bridge.get()] { self->follow(); }, error);
  if (bridge->_screen == nullptr) return nullptr;
  bridge->follow();
  return bridge;
}

LockBridge::~LockBridge() {
  write(true, nullptr);
}

bool LockBridge::write(bool locked, TLErrorOut error) {
  std::optional<TLError> failure;
  if (platform::writeLockStatus(_path, locked, &failure)) return true;
  platform::setError(error, *failure);
  return false;
}

void LockBridge::follow() {
  const bool locked = _screen->screen() != Screen::open;
  std::optional<TLError> error;
  _good = write(locked, &error);
  if (_good) return log().standard("The screen is {}", locked ? "locked" : "open");
  log().fault("The lock status cannot be written: {}", platform::printable(error));
  _loop.stop();
}

}  // namespace desktop
