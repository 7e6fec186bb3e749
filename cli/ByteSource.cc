#include "cli/ByteSource.h"

#include <fcntl.h>
#include <lzma.h>
#include <sys/stat.h>
#include <unistd.h>
#include <zlib.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <memory>
#include <string_view>

namespace cli {

namespace {

constexpr size_t kBufferBytes = size_t{64} << 10;

// Enough for files from xz -9; a file that needs more is refused.
constexpr uint64_t kMaxDecoderBytes = uint64_t{160} << 20;

constexpr const char* kCompressionDomain = "compression";
constexpr const char* kEndsEarly = "the compressed data ends early";
constexpr const char* kDamaged = "the compressed data is damaged";

constexpr std::string_view kGzipMagic("\x1F\x8B", 2);
constexpr std::string_view kXzMagic("\xFD\x37\x7A\x58\x5A\x00", 6);

std::nullopt_t fail(TLErrorOut error, int code, const char* message) {
  platform::setError(error, {kCompressionDomain, code, message});
  return std::nullopt;
}

// The file without decoding, with a buffer that decoders read in place.
class FileSource final : public ByteSource {
 public:
  explicit FileSource(int descriptor)
      : _descriptor(descriptor), _buffer(std::make_unique_for_overwrite<char[]>(kBufferBytes)) {}
  ~FileSource() override { close(_descriptor); }

  // The buffered bytes; empty only at the end of the file.
  std::optional<std::string_view> peek(TLErrorOut error) {
    if (_begin == _end) {
      ssize_t n;
      do {
        n = ::read(_descriptor, _buffer.get(), kBufferBytes);
      } while (n < 0 && errno == EINTR);
      if (n < 0) {
        platform::setError(error, platform::posixError(errno, "cannot read"));
        return std::nullopt;
      }
      _begin = 0;
      _end = static_cast<size_t>(n);
    }
    return std::string_view(_buffer.get() + _begin, _end - _begin);
  }
  void skip(size_t count) {
    _begin += count;
    _consumed += count;
  }

  std::optional<size_t> read(char* buffer, size_t size, TLErrorOut error) override {
    const auto bytes = peek(error);
    if (!bytes) return std::nullopt;
    const size_t count = bytes->copy(buffer, size);
    skip(count);
    return count;
  }
  uint64_t consumed() const override { return _consumed; }

  // Seeks instead of reading.
  bool advance(uint64_t count, TLErrorOut error) override {
    const size_t buffered = static_cast<size_t>(std::min<uint64_t>(count, _end - _begin));
    skip(buffered);
    const uint64_t rest = count - buffered;
    if (rest == 0) return true;
    if (rest > INT64_MAX || lseek(_descriptor, static_cast<off_t>(rest), SEEK_CUR) < 0) {
      platform::setError(error, platform::posixError(errno, "cannot read"));
      return false;
    }
    _consumed += rest;
    return true;
  }

 private:
  const int _descriptor;
  const std::unique_ptr<char[]> _buffer;
  size_t _begin = 0;
  size_t _end = 0;
  uint64_t _consumed = 0;
};

// gzip, possibly with several members. Trailing bytes that are not a member are ignored, as gzip
// does.
class GzipSource final : public ByteSource {
 public:
  explicit GzipSource(std::unique_ptr<FileSource> file) : _file(std::move(file)) {
    _usable = inflateInit2(&_stream, 15 + 16) == Z_OK;
  }
  ~GzipSource() override { inflateEnd(&_stream); }

  std::optional<size_t> read(char* buffer, size_t size, TLErrorOut error) override {
    if (!_usable) return fail(error, ENOMEM, "cannot decompress");
    _stream.next_out = reinterpret_cast<Bytef*>(buffer);
    _stream.avail_out = static_cast<uInt>(size);
    while (!_ended && _stream.avail_out == size) {
      const auto input = _file->peek(error);
      if (!input) return std::nullopt;
      if (_betweenMembers && !input->starts_with(kGzipMagic[0])) {
        _ended = true;
        break;
      }
      if (input->empty()) return fail(error, Z_BUF_ERROR, kEndsEarly);
      _betweenMembers = false;
      _stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(input->data()));
      _stream.avail_in = static_cast<uInt>(input->size());
      const int result = inflate(&_stream, Z_NO_FLUSH);
      _file->skip(input->size() - _stream.avail_in);
      if (result == Z_STREAM_END) {
        _betweenMembers = true;
        inflateReset(&_stream);
      } else if (result != Z_OK) {
        return fail(error, result, kDamaged);
      }
    }
    return size - _stream.avail_out;
  }
  uint64_t consumed() const override { return _file->consumed(); }

 private:
  const std::unique_ptr<FileSource> _file;
  z_stream _stream{};
  bool _usable = false;
  bool _betweenMembers = false;
  bool _ended = false;
};

class XzSource final : public ByteSource {
 public:
  explicit XzSource(std::unique_ptr<FileSource> file) : _file(std::move(file)) {
    _state = lzma_stream_decoder(&_stream, kMaxDecoderBytes, LZMA_CONCATENATED);
  }
  ~XzSource() override { lzma_end(&_stream); }

  std::optional<size_t> read(char* buffer, size_t size, TLErrorOut error) override {
    _stream.next_out = reinterpret_cast<uint8_t*>(buffer);
    _stream.avail_out = size;
    while (_state == LZMA_OK && _stream.avail_out == size) {
      const auto input = _file->peek(error);
      if (!input) return std::nullopt;
      _stream.next_in = reinterpret_cast<const uint8_t*>(input->data());
      _stream.avail_in = input->size();
      _state = lzma_code(&_stream, input->empty() ? LZMA_FINISH : LZMA_RUN);
      _file->skip(input->size() - _stream.avail_in);
    }
    if (_state == LZMA_OK || _stream.avail_out < size) return size - _stream.avail_out;
    if (_state == LZMA_STREAM_END) return 0;
    if (_state == LZMA_MEMLIMIT_ERROR) {
      return fail(error, _state, "decompression takes too much memory");
    }
    return fail(error, _state, _state == LZMA_BUF_ERROR ? kEndsEarly : kDamaged);
  }
  uint64_t consumed() const override { return _file->consumed(); }

 private:
  const std::unique_ptr<FileSource> _file;
  lzma_stream _stream = LZMA_STREAM_INIT;
  lzma_ret _state;
};

}  // namespace

bool ByteSource::advance(uint64_t count, TLErrorOut error) {
  const auto buffer = std::make_unique_for_overwrite<char[]>(kBufferBytes);
  while (count > 0) {
    const auto bytes =
        read(buffer.get(), static_cast<size_t>(std::min<uint64_t>(count, kBufferBytes)), error);
    if (!bytes) return false;
    if (*bytes == 0) return true;
    count -= *bytes;
  }
  return true;
}

std::unique_ptr<ByteSource> openByteSource(const std::string& path, TLErrorOut error) {
  // O_NONBLOCK, so that opening a pipe does not block.
  const int descriptor = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
  struct stat info;
  if (descriptor < 0 || fstat(descriptor, &info) != 0) {
    platform::setError(error, platform::posixError(errno, "cannot open"));
    if (descriptor >= 0) close(descriptor);
    return nullptr;
  }
  auto file = std::make_unique<FileSource>(descriptor);
  if (!S_ISREG(info.st_mode)) {
    platform::setError(error, {kPOSIXErrorDomain, EINVAL, "not a regular file"});
    return nullptr;
  }
  const auto head = file->peek(error);
  if (!head) return nullptr;
  if (head->starts_with(kGzipMagic)) return std::make_unique<GzipSource>(std::move(file));
  if (head->starts_with(kXzMagic)) return std::make_unique<XzSource>(std::move(file));
  return file;
}

std::optional<bool> isCompressed(const std::string& path) {
  const auto source = openByteSource(path, nullptr);
  if (source == nullptr) return std::nullopt;
  return dynamic_cast<const FileSource*>(source.get()) == nullptr;
}

}  // namespace cli
