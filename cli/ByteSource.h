#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/TLError.h"

namespace cli {

// Reads the bytes of a mail file and decompresses them on the fly. Memory use does not grow with
// the file. One thread.
class ByteSource {
 public:
  virtual ~ByteSource() = default;

  // Reads at most `size` bytes into `buffer` and returns their number, 0 at the end. Nullopt with
  // an error if the file cannot be read or decompressed further.
  [[nodiscard]] virtual std::optional<size_t> read(char* buffer, size_t size, TLErrorOut error) = 0;

  // Skips up to `count` bytes; stops at the end of the file. False with an error, as for `read`.
  [[nodiscard]] virtual bool advance(uint64_t count, TLErrorOut error);

  // Bytes read from the file itself, before decompression.
  [[nodiscard]] virtual uint64_t consumed() const = 0;
};

// Opens a regular file, which may be compressed with gzip or xz, detected by its first bytes.
[[nodiscard]] std::unique_ptr<ByteSource> openByteSource(const std::string& path, TLErrorOut error);

// Whether that would decompress the file. Nullopt if it cannot be read.
[[nodiscard]] std::optional<bool> isCompressed(const std::string& path);

}  // namespace cli
