#include "platform/Memory.h"

#include <malloc.h>

namespace platform {

namespace {

// Ingest, search and merge mostly have one each; leveldb's thread shares.
constexpr int kMostArenas = 3;

}  // namespace

void limitMemoryArenas() {
  mallopt(M_ARENA_MAX, kMostArenas);
}

void returnFreeMemory() {
  malloc_trim(0);
}

}  // namespace platform
