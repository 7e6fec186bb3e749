#pragma once

namespace platform {

// Limits the number of malloc arenas, because each keeps the peak memory of its threads. Call it
// before any thread starts.
void limitMemoryArenas();

// Returns freed memory to the system, after work that used much of it temporarily. Any thread.
void returnFreeMemory();

}  // namespace platform
