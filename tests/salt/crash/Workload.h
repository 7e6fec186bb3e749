#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "salt/Index.h"
#include "tests/salt/Model.h"

namespace salttest {

// One call of AddZone or, where `zoneID` is 0, of DeleteDoc.
struct Operation {
  uint32_t docID = 0;
  uint16_t zoneID = 0;
  std::string text;
  std::vector<uint32_t> offsets;
};

// How a worker is kept from writing at times.
enum class Shortage { none, fileSize, fullDisk };

// What one database is put through. It follows from these arguments alone, so that the process that
// does the work and the one that checks it need not tell each other.
[[nodiscard]] salt::Index::Options workloadOptions(uint32_t seed, Shortage shortage);
[[nodiscard]] Operation workloadOperation(uint32_t seed, uint32_t number);

// The answers of index and model.
bool carryOut(salt::Index& index, Operation operation);
bool carryOut(Model& model, const Operation& operation);

// What a worker process writes to its standard output, a byte each.
enum class Report : char {
  opened = 'o',
  done = 't',
  refused = 'f',  // the operation was answered with false for good
  failed = 'x',   // there was no space; the operation will be tried again
};

// What a worker is told on its command line.
struct WorkerTask {
  std::string path;
  uint32_t seed = 0;        // of the workload
  uint32_t first = 0;       // number of the operation to begin with
  uint32_t generation = 0;  // seeds what is random beside the workload
  bool create = false;      // rather than open
  Shortage shortage = Shortage::none;
};

// What fills the disk, beside the index.
[[nodiscard]] inline std::string ballastOf(const std::string& path) {
  return path + ".ballast";
}

// Carries out one operation after the other until it is killed. Returns only when it cannot go on.
int runWorker(const WorkerTask& task);

}  // namespace salttest
