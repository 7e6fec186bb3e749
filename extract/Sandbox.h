#pragma once

#include <cstdint>

namespace extract {

// Limits of the process.
inline constexpr uint64_t kMaxMemoryBytes = uint64_t{512} << 20;  // of address space
inline constexpr uint64_t kMaxCPUSeconds = 40;                    // after which the kernel ends it
inline constexpr uint64_t kRetiringCPUSeconds = 20;  // after which it asks to be replaced

// Gives up everything but memory, reading open descriptors, and the socket `socket`: no other file,
// no network, no program, no process, and no way back. Where the kernel has Landlock, the tables of
// character sets that PDF files refer to stay readable. False if the kernel cannot do this; then
// the process must not look at any file.
[[nodiscard]] bool enterSandbox(int socket);

// Whether the process should be replaced soon, before it reaches the limit of its processor time.
[[nodiscard]] bool shouldRetire();

}  // namespace extract
