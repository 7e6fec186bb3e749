#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/TLError.h"

// File access with error objects. Paths are bytes; every operation refuses a path containing NUL
// with EINVAL instead of truncating it.
namespace platform {

[[nodiscard]] bool fileExists(const std::string& path);

// Creates `path` and its missing parents with mode 0700. An existing directory is no error. The
// protection class, if given, is stored in the extended attribute user.tallow.protection of the
// last directory, where the file system supports it.
bool createDirectories(const std::string& path, TLErrorOut error,
                       const std::optional<std::string>& protectionClass = std::nullopt);

// Names of the entries without "." and "..", in no particular order.
[[nodiscard]] std::optional<std::vector<std::string>> listDirectory(const std::string& path,
                                                                    TLErrorOut error);

// Removes a file, or a directory recursively. Symbolic links are removed, not followed.
bool removeItem(const std::string& path, TLErrorOut error);

// At most `maximum` bytes are read; a larger file is an error (EFBIG).
[[nodiscard]] std::optional<std::string> readFile(const std::string& path, size_t maximum,
                                                  TLErrorOut error);

// Reads or writes all bytes at `offset` of an open file. False, with errno set, on failure; also at
// the end of the file, with errno 0.
[[nodiscard]] bool readAt(int file, uint64_t offset, char* bytes, size_t count);
[[nodiscard]] bool writeAt(int file, uint64_t offset, std::string_view bytes);

// A new file without a name on the file system of the directory, which is gone once it is closed,
// also by a crash. Invalid, with errno set, on failure.
[[nodiscard]] FileDescriptor openUnnamedFile(const std::string& directory);

// Writes a temporary file beside the target, syncs it and renames it over the target.
bool writeFileAtomically(const std::string& path, const std::string& bytes, TLErrorOut error);
// The same with write(file), which returns false, with errno set, on failure.
bool writeFileAtomically(const std::string& path, const std::function<bool(int file)>& write,
                         TLErrorOut error);

// The bytes that this process can still write to the file system of `path`; the largest number when
// unknown.
[[nodiscard]] uint64_t freeBytes(const std::string& path);

// Raises the limit of open files as far as the system allows.
void raiseDescriptorLimit();

// The number of files that this process can still open. Reads a directory in /proc.
[[nodiscard]] size_t freeDescriptors();

// The number of descriptors that databases leave for connections: a quarter of all, at most 256.
[[nodiscard]] size_t descriptorReserve();

}  // namespace platform
