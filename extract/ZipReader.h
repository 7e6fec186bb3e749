#pragma once

#include <archive.h>

#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace extract {

// Reads the entries of a zip file in memory, one after the other, and looks into no archive inside
// of it. One thread.
class ZipReader {
 public:
  static constexpr size_t kMaxEntries = 10000;
  static constexpr size_t kMaxUnpackedBytes = size_t{64} << 20;  // of all entries together

  struct Entry {
    std::string name;  // any bytes
    bool encrypted = false;
  };

  // The bytes must stay valid.
  explicit ZipReader(std::string_view bytes);

  // Nullopt at the end and at a limit or fault, which `whole` tells apart.
  [[nodiscard]] std::optional<Entry> next();

  // A part of the content of the last entry; empty at its end and at a limit or fault.
  [[nodiscard]] std::string_view read();

  // Whether all until here could be read.
  [[nodiscard]] bool whole() const { return _whole; }

 private:
  struct Close {
    void operator()(archive* zip) const { archive_read_free(zip); }
  };
  const std::unique_ptr<archive, Close> _zip;
  size_t _entries = 0;
  size_t _unpacked = 0;
  bool _whole = true;
};

}  // namespace extract
