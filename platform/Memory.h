#pragma once

namespace platform {

// Few memory arenas: each keeps what its threads had at their highest. Before any thread starts.
void limitMemoryArenas();

// Gives freed memory back to the system, after work that took much of it for a while. Any thread.
void returnFreeMemory();

}  // namespace platform
