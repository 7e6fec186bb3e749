#pragma once

#include <leveldb/write_batch.h>

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Mutex.h"
#include "salt/Coding.h"

namespace salt {

class index;

// Writes to an index: adds zones to the hot part and deletes documents, one call at a time. Any
// thread. The index outlives it.
class ZoneWriter {
 public:
  // What the caller of addZone still has to do when no lock is held any more.
  struct Aftermath {
    bool vacuumDue = false;
    std::chrono::nanoseconds delay{0};
  };

  explicit ZoneWriter(index& owner) : _idx(owner), _batch(std::in_place) {}

  // See Index::AddZone and Index::DeleteDocs. Nullopt, with a log line, when nothing is stored.
  [[nodiscard]] std::optional<Aftermath> addZone(uint32_t docID, uint16_t zoneID,
                                                 std::string_view text,
                                                 std::vector<uint32_t>& offsets, bool merge)
      TL_EXCLUDES(_writeMutex);
  [[nodiscard]] bool deleteDocs(const std::vector<uint32_t>& docIDs) TL_EXCLUDES(_writeMutex);

  void waitForZoneInHand() TL_EXCLUDES(_writeMutex) { platform::MutexLock lock(_writeMutex); }

 private:
  using Clock = std::chrono::steady_clock;

  [[nodiscard]] bool zoneFits(uint32_t docID, uint16_t zoneID, std::string_view text,
                              const std::vector<uint32_t>& offsets) const;
  enum class Stored { none, duplicate, appended, failed };
  [[nodiscard]] Stored appendToStored(const TextKey& key, std::string_view text,
                                      std::vector<uint32_t>& offsets, bool merge,
                                      std::string* stored) TL_REQUIRES(_writeMutex);
  [[nodiscard]] bool mayBeStored(uint32_t docID, uint16_t zoneID) const TL_REQUIRES(_writeMutex);
  void putZone(const TextKey& key, uint32_t docID, uint16_t zoneID, std::string_view text,
               const std::vector<uint32_t>& offsets) TL_REQUIRES(_writeMutex);
  [[nodiscard]] std::optional<Aftermath> commitZone(Clock::time_point start,
                                                    Clock::time_point locked, uint32_t docID,
                                                    uint16_t zoneID, size_t suffixes)
      TL_REQUIRES(_writeMutex);

  index& _idx;
  platform::Mutex _writeMutex;
  // Reused to avoid allocation.
  std::optional<leveldb::WriteBatch> _batch TL_GUARDED_BY(_writeMutex);
  std::string _key TL_GUARDED_BY(_writeMutex);
  // The newest document and its zones; 0 before the first. Tells without a read what is stored.
  uint32_t _newestDoc TL_GUARDED_BY(_writeMutex) = 0;
  std::vector<uint16_t> _newestZones TL_GUARDED_BY(_writeMutex);
};

}  // namespace salt
