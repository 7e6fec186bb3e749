#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/TLError.h"

// File access that reports by error object. Paths are bytes; a path that holds a NUL is refused by
// each operation with EINVAL rather than cut.
namespace platform {

[[nodiscard]] bool fileExists(const std::string& path);

// Creates `path` and what is missing above it, mode 0700. A directory that exists is no error. With
// a protection class, the last directory carries it in the extended attribute
// user.tallow.protection, where the file system has such attributes.
bool createDirectories(const std::string& path, TLErrorOut error,
                       const std::optional<std::string>& protectionClass = std::nullopt);

// Names of the entries, without "." and "..", in no order.
[[nodiscard]] std::optional<std::vector<std::string>> listDirectory(const std::string& path,
                                                                    TLErrorOut error);

// Removes a file, or a directory with all below it. Symbolic links are removed, not followed.
bool removeItem(const std::string& path, TLErrorOut error);

// At most `maximum` bytes are read; a larger file is an error (EFBIG).
[[nodiscard]] std::optional<std::string> readFile(const std::string& path, size_t maximum,
                                                  TLErrorOut error);

// Reads or writes all bytes at `offset` of an open file. False, with errno set, when the system
// does not; the end of the file (then errno is 0) is such a case, too.
[[nodiscard]] bool readAt(int file, uint64_t offset, char* bytes, size_t count);
[[nodiscard]] bool writeAt(int file, uint64_t offset, std::string_view bytes);

// Written beside the target, synced, then renamed over it.
bool writeFileAtomically(const std::string& path, const std::string& bytes, TLErrorOut error);

// How many bytes this process could still write on the file system of `path`; as many as a number
// can hold where that cannot be told.
[[nodiscard]] uint64_t freeBytes(const std::string& path);

// As many open files as the system lets this process have.
void raiseDescriptorLimit();

// How many more files this process can open. Reads a directory of /proc.
[[nodiscard]] size_t freeDescriptors();

// Of these, how many databases leave for connections: a quarter of all, 256 at most.
[[nodiscard]] size_t descriptorReserve();

}  // namespace platform
