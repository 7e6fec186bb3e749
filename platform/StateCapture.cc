#include "platform/StateCapture.h"

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

struct Registration {
  SerialQueue& queue;
  std::string title;
  std::function<nlohmann::json()> block;
};

// The mutex is held while blocks run, so that a cancellation waits for a running capture.
struct Registry {
  Mutex mutex;
  std::map<uint64_t, Registration> entries TL_GUARDED_BY(mutex);
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
  Registry& r = registry();
  MutexLock lock(r.mutex);
  for (auto& [id, entry] : r.entries) {
    entry.queue.sync([&records, &entry = entry] {
      if (auto record = stateCaptureRecord(entry.title, entry.block())) {
        records.push_back(std::move(*record));
      }
    });
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
  r.entries.try_emplace(id, platform::Registration{queue, std::move(title), std::move(block)});
  return [id] {
    platform::Registry& owner = platform::registry();
    platform::MutexLock cancelLock(owner.mutex);
    owner.entries.erase(id);
  };
}
