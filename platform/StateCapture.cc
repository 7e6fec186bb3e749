#include "platform/StateCapture.h"

#include <condition_variable>
#include <cstring>
#include <map>
#include <memory>
#include <new>

#include "platform/Log.h"
#include "platform/Mutex.h"

namespace platform {

namespace {

constexpr size_t kHeaderSize = 200;
constexpr size_t kTitleOffset = 136;
constexpr size_t kTitleSize = 64;
constexpr uint32_t kSerialisedDictionary = 1;

const Log& log() {
  static const Log handle(kSubsystem, "default");
  return handle;
}

// One registered block. A capture holds it while it waits for its queue. A cancellation waits for
// such a capture, because the caller may destroy the queue afterwards.
struct Registration {
  Registration(SerialQueue& on, std::string name, std::function<nlohmann::json()> make)
      : queue(on), title(std::move(name)), block(std::move(make)) {}

  SerialQueue& queue;
  const std::string title;
  const std::function<nlohmann::json()> block;
  Mutex mutex;
  std::condition_variable_any changed;
  int capturing TL_GUARDED_BY(mutex) = 0;
  bool cancelled TL_GUARDED_BY(mutex) = false;

  // False after cancellation.
  bool begin() {
    MutexLock lock(mutex);
    if (!cancelled) ++capturing;
    return !cancelled;
  }
  void end() {
    MutexLock lock(mutex);
    --capturing;
    changed.notify_all();
  }
  void cancel() {
    MutexLock lock(mutex);
    cancelled = true;
    while (capturing != 0) changed.wait(mutex);
  }
  bool isCancelled() {
    MutexLock lock(mutex);
    return cancelled;
  }
};

struct Registry {
  Mutex mutex;
  std::map<uint64_t, std::shared_ptr<Registration>> entries TL_GUARDED_BY(mutex);
  uint64_t next TL_GUARDED_BY(mutex) = 0;
};

Registry& registry() {
  static auto* instance = new Registry;
  return *instance;
}

void putLittleEndian(std::string& record, size_t offset, uint32_t value) {
  for (size_t i = 0; i < 4; ++i) record[offset + i] = static_cast<char>(value >> (8 * i));
}

std::string makeRecord(const std::string& title, const std::vector<uint8_t>& data) {
  std::string record(kHeaderSize, '\0');
  putLittleEndian(record, 0, kSerialisedDictionary);
  putLittleEndian(record, 4, static_cast<uint32_t>(data.size()));
  std::memcpy(record.data() + kTitleOffset, title.data(), std::min(title.size(), kTitleSize - 1));
  record.append(data.begin(), data.end());
  return record;
}

}  // namespace

std::optional<std::string> stateCaptureRecord(const std::string& title,
                                              const nlohmann::json& dictionary) {
  if (dictionary.empty()) return std::nullopt;
  std::vector<uint8_t> data;
  try {
    data = nlohmann::json::to_cbor(dictionary);
  } catch (const std::exception& failure) {
    log().error(
        "Looks like this failed to transform state dictionary {} into a property list, please "
        "check previous logging: {}",
        title, failure.what());
    return std::nullopt;
  }
  try {
    return makeRecord(title, data);
  } catch (const std::bad_alloc&) {
    log().error("no state data could be collected, see previous logging");
    return std::nullopt;
  }
}

std::vector<std::string> captureState() {
  std::vector<std::string> records;
  std::vector<std::shared_ptr<Registration>> entries;
  Registry& r = registry();
  {
    MutexLock lock(r.mutex);
    for (const auto& [id, entry] : r.entries) entries.push_back(entry);
  }
  for (const auto& entry : entries) {
    if (!entry->begin()) continue;
    entry->queue.sync([&records, &entry] {
      if (entry->isCancelled()) return;
      if (auto record = stateCaptureRecord(entry->title, entry->block())) {
        records.push_back(std::move(*record));
      }
    });
    entry->end();
  }
  return records;
}

void logCapturedState() {
  for (const std::string& record : captureState()) {
    const auto dictionary = nlohmann::json::from_cbor(record.substr(kHeaderSize), true, false);
    log().standard("{}: {}", record.c_str() + kTitleOffset,
                   dictionary.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace));
  }
}

}  // namespace platform

std::function<void()> TLLogRegisterStateCaptureBlock(platform::SerialQueue& queue,
                                                     std::string title,
                                                     std::function<nlohmann::json()> block) {
  platform::Registry& r = platform::registry();
  platform::MutexLock lock(r.mutex);
  const uint64_t id = r.next++;
  const auto entry =
      std::make_shared<platform::Registration>(queue, std::move(title), std::move(block));
  r.entries.emplace(id, entry);
  return [id, entry] {
    platform::Registry& owner = platform::registry();
    {
      platform::MutexLock cancelLock(owner.mutex);
      owner.entries.erase(id);
    }
    entry->cancel();
  };
}
