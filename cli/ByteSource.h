#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/TLError.h"

namespace cli {

// The bytes of a mail file, decompressed as they are read, in memory that does not grow with the
// file. One thread.
class ByteSource {
 public:
  virtual ~ByteSource() = default;

  // Puts at most `size` bytes into `buffer` and returns their number, 0 at the end; none, with an
  // error, when the file cannot be read or decompressed any further.
  [[nodiscard]] virtual std::optional<size_t> read(char* buffer, size_t size, TLErrorOut error) = 0;

  // Passes over so many bytes, as far as there are any; false, with an error, as for `read`.
  [[nodiscard]] virtual bool advance(uint64_t count, TLErrorOut error);

  // How much of the file itself has been read.
  [[nodiscard]] virtual uint64_t consumed() const = 0;
};

// Opens a regular file, which may be compressed with gzip or xz; its first bytes tell.
[[nodiscard]] std::unique_ptr<ByteSource> openByteSource(const std::string& path, TLErrorOut error);

}  // namespace cli
