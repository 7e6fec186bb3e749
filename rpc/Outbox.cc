#include "rpc/Outbox.h"

#include <utility>

namespace rpc {

bool Outbox::post(std::function<void()> item) {
  platform::MutexLock lock(_mutex);
  if (_loop == nullptr) return false;
  _loop->post(std::move(item));
  return true;
}

void Outbox::open(platform::RunLoop* loop) {
  platform::MutexLock lock(_mutex);
  _loop = loop;
}

bool Outbox::isCurrent() {
  platform::MutexLock lock(_mutex);
  return _thread == std::this_thread::get_id();
}

void Outbox::begin() {
  platform::MutexLock lock(_mutex);
  _thread = std::this_thread::get_id();
}

void Outbox::close() {
  platform::MutexLock lock(_mutex);
  _loop = nullptr;
  _thread = {};
}

}  // namespace rpc
