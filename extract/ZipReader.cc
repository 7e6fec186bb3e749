#include "extract/ZipReader.h"

#include <archive_entry.h>

namespace extract {

ZipReader::ZipReader(std::string_view bytes) : _zip(archive_read_new()) {
  _whole = _zip != nullptr && archive_read_support_format_zip(_zip.get()) == ARCHIVE_OK &&
           archive_read_open_memory(_zip.get(), bytes.data(), bytes.size()) == ARCHIVE_OK;
}

std::optional<ZipReader::Entry> ZipReader::next() {
  if (!_whole) return std::nullopt;
  archive_entry* entry = nullptr;
  const int result = archive_read_next_header(_zip.get(), &entry);
  if (result == ARCHIVE_EOF) return std::nullopt;
  _whole = (result == ARCHIVE_OK || result == ARCHIVE_WARN) && ++_entries <= kMaxEntries;
  if (!_whole) return std::nullopt;
  const char* const name = archive_entry_pathname(entry);
  return Entry{name == nullptr ? "" : name, archive_entry_is_encrypted(entry) != 0};
}

std::string_view ZipReader::read() {
  if (!_whole) return {};
  const void* data = nullptr;
  size_t size = 0;
  la_int64_t offset = 0;
  const int result = archive_read_data_block(_zip.get(), &data, &size, &offset);
  if (result == ARCHIVE_EOF) return {};
  _unpacked += size;
  _whole = result == ARCHIVE_OK && _unpacked <= kMaxUnpackedBytes;
  return _whole ? std::string_view(static_cast<const char*>(data), size) : std::string_view();
}

}  // namespace extract
