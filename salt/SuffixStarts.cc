#include "salt/SuffixStarts.h"

#include <system_error>
#include <utility>

#include "platform/Queue.h"

namespace salt {

SuffixStarts::~SuffixStarts() {
  _ending = true;
  platform::MutexLock lock(_mutex);
  if (_thread.joinable()) _thread.join();
}

void SuffixStarts::beginWith(ForEachText forEachText) {
  platform::MutexLock lock(_mutex);
  if (_thread.joinable()) return;
  _begun = true;
  const auto body = [this, forEachText = std::move(forEachText)] {
    platform::setThreadName("tallow-starts");
    platform::lowerThreadPriority();
    const bool all = forEachText([this](std::string_view text) {
      for (; text.size() >= kBytes && !_ending; text.remove_prefix(1)) add(text);
      return !_ending;
    });
    if (all && !_ending) _complete = true;
  };
  try {
    _thread = std::thread(body);
  } catch (const std::system_error&) {
    // Until a later call succeeds, every prefix may be present.
  }
}

}  // namespace salt
