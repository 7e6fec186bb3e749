#include "platform/Memory.h"

#include <malloc.h>

namespace platform {

namespace {

// Usually one each for ingest, search and merge; leveldb's thread shares one.
constexpr int kMaxArenas = 3;

}  // namespace

void limitMemoryArenas() {
  mallopt(M_ARENA_MAX, kMaxArenas);
}

void returnFreeMemory() {
  malloc_trim(0);
}

}  // namespace platform
