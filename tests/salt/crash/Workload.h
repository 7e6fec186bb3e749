#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "salt/Index.h"
#include "tests/salt/Model.h"

namespace salttest {

// How space is withheld from a worker.
enum class Shortage { none, fileSize, fullDisk };

// The workload of one database, a pure function of these arguments, so that the worker and the
// checker need not communicate.
[[nodiscard]] salt::Index::Options workloadOptions(uint32_t seed, Shortage shortage);
[[nodiscard]] Operation workloadOperation(uint32_t seed, uint32_t number);

// Reports of a worker on its standard output, one byte each.
enum class Report : char {
  opened = 'o',
  done = 't',
  refused = 'f',  // the operation returned false, permanently
  failed = 'x',   // there was no space; the operation will be repeated
};

// The command line arguments of a worker.
struct WorkerTask {
  std::string path;
  uint32_t seed = 0;        // of the workload
  uint32_t first = 0;       // number of the first operation
  uint32_t generation = 0;  // seeds randomness outside the workload
  bool create = false;      // create the index instead of opening it
  Shortage shortage = Shortage::none;
};

// The file beside the index that fills the disk.
[[nodiscard]] inline std::string ballastOf(const std::string& path) {
  return path + ".ballast";
}

// Runs operations until it is killed. Returns only if it cannot continue.
int runWorker(const WorkerTask& task);

}  // namespace salttest
