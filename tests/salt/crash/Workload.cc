#include "tests/salt/crash/Workload.h"

#include <random>

namespace salttest {

namespace {

constexpr uint16_t kZones[] = {1, 2, 129, 256};

std::mt19937 randomOf(uint32_t seed, uint32_t number) {
  std::seed_seq seeds{seed, number};
  return std::mt19937(seeds);
}

template <typename Value, size_t count>
Value oneOf(std::mt19937& random, const Value (&values)[count]) {
  return values[random() % count];
}

}  // namespace

// One database in eight has realistic sizes; the others merge all the time.
salt::Index::Options workloadOptions(uint32_t seed, Shortage shortage) {
  std::mt19937 random = randomOf(seed, UINT32_MAX);
  salt::Index::Options op;
  op.MaxShards = oneOf(random, {1u, 3u, 16u});
  op.MaxShardSuffixes = oneOf(random, {100u, 2000u, 1000000u});
  if (shortage != Shortage::none) {
    // A hot part this small is never compacted after a merge: leveldb 1.23 ends the process when it
    // fails to write a memtable during a compaction on demand.
    op.MaxHotSuffixes = 15;
    op.MaxPageSuffixes = oneOf(random, {1u, 3u, 50u});
    op.MaxBatchBytes = oneOf(random, {1u, 1000u, 20000u});
    return op;
  }
  op.CompactAfterVacuum = random() % 8 == 0;
  if (random() % 8 == 0) {
    op.MaxHotSuffixes = 5000;
    return op;
  }
  op.MaxPageSuffixes = oneOf(random, {1u, 3u, 50u});
  op.MaxHotSuffixes = oneOf(random, {20u, 100u, 500u});
  op.MaxBatchBytes = oneOf(random, {1u, 1000u, 20000u});
  return op;
}

Operation workloadOperation(uint32_t seed, uint32_t number) {
  std::mt19937 random = randomOf(seed, number);
  auto dice = random() % 40;
  if (dice == 0 && number > 0) {  // the previous operation again, mostly a duplicate
    number -= 1 + random() % std::min(number, 8u);
    random = randomOf(seed, number);
    dice = random() % 40;
  }
  Operation made;
  made.docID = 1 + number / std::size(kZones);
  if (dice < 6) made.docID = 1 + random() % made.docID;
  if (dice == 1) return made;  // a deletion
  made.zoneID = kZones[(dice < 6 ? random() : number) % std::size(kZones)];
  // Some log records exceed the log's blocks of 32 KiB and the buffer of a file.
  const size_t size = dice == 39 ? 20000 + random() % 60000 : random() % 300;
  made.text = randomText(random, size);
  made.offsets = randomOffsets(random, std::string_view(made.text).substr(0, 300));
  return made;
}

}  // namespace salttest
