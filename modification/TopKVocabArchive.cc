#include "modification/TopKVocabArchive.h"

#include <bit>
#include <limits>
#include <utility>

namespace topkvocab {

namespace {

// The major type of an item, in the upper three bits of its first byte.
enum class Major : uint8_t { number = 0, bytes = 2, text = 3, array = 4, simple = 7 };

// The lower five bits hold the argument itself up to this value, otherwise its size.
constexpr uint8_t kMaxInline = 23;
constexpr uint8_t kOneByte = 24;
constexpr uint8_t kEightBytes = 27;  // for `simple`: a double

void putHead(std::string& out, Major major, uint64_t argument) {
  const auto kind = static_cast<uint8_t>(static_cast<unsigned>(major) << 5);
  if (argument <= kMaxInline) {
    out += static_cast<char>(kind | argument);
    return;
  }
  unsigned sizeLog = 0;
  while (sizeLog < 3 && argument >> (8U << sizeLog) != 0) ++sizeLog;
  out += static_cast<char>(kind | (kOneByte + sizeLog));
  for (unsigned shift = 8U << sizeLog; shift > 0; shift -= 8) {
    out += static_cast<char>(argument >> (shift - 8));
  }
}

void putString(std::string& out, Major major, std::string_view bytes) {
  putHead(out, major, bytes.size());
  out += bytes;
}

// Consumes items from the front of the bytes.
class Reader {
 public:
  explicit Reader(std::string_view bytes) : _rest(bytes) {}

  [[nodiscard]] bool atEnd() const { return _rest.empty(); }

  // The argument of an item of this type; nullopt for any other, after which the reader is
  // unusable.
  std::optional<uint64_t> head(Major major) {
    if (_rest.empty()) return std::nullopt;
    const auto first = static_cast<uint8_t>(_rest.front());
    _rest.remove_prefix(1);
    if (first >> 5 != static_cast<uint8_t>(major)) return std::nullopt;
    const auto low = static_cast<uint8_t>(first & 0x1F);
    if (low <= kMaxInline) return low;
    if (low > kEightBytes) return std::nullopt;
    const size_t size = size_t{1} << (low - kOneByte);
    if (_rest.size() < size) return std::nullopt;
    uint64_t argument = 0;
    for (size_t i = 0; i < size; ++i) argument = argument << 8 | static_cast<uint8_t>(_rest[i]);
    _rest.remove_prefix(size);
    return argument;
  }

  std::optional<std::string_view> string(Major major) {
    const auto size = head(major);
    if (!size || *size > _rest.size()) return std::nullopt;
    const std::string_view bytes = _rest.substr(0, *size);
    _rest.remove_prefix(*size);
    return bytes;
  }

  // An array of strings that extends to the end of the bytes.
  template <typename String>
  std::optional<std::vector<String>> strings(Major major) {
    const auto count = head(Major::array);
    if (!count || *count > _rest.size()) return std::nullopt;  // each takes at least one byte
    std::vector<String> result;
    for (uint64_t i = 0; i < *count; ++i) {
      const auto bytes = string(major);
      if (!bytes) return std::nullopt;
      result.emplace_back(*bytes);
    }
    if (!atEnd()) return std::nullopt;
    return result;
  }

 private:
  std::string_view _rest;
};

}  // namespace

std::string archive(const std::vector<std::string>& words, uint32_t docID, double date) {
  std::string wordBytes;
  putHead(wordBytes, Major::array, words.size());
  for (const std::string& word : words) putString(wordBytes, Major::text, word);
  std::string docIDBytes;
  putHead(docIDBytes, Major::number, docID);
  std::string dateBytes;
  dateBytes += static_cast<char>(static_cast<unsigned>(Major::simple) << 5 | kEightBytes);
  const auto bits = std::bit_cast<uint64_t>(date);
  for (int shift = 56; shift >= 0; shift -= 8) dateBytes += static_cast<char>(bits >> shift);

  std::string out;
  putHead(out, Major::array, 3);
  for (const std::string* bytes : {&wordBytes, &docIDBytes, &dateBytes}) {
    putString(out, Major::bytes, *bytes);
  }
  return out;
}

std::optional<std::vector<std::string_view>> unarchive(std::string_view bytes) {
  return Reader(bytes).strings<std::string_view>(Major::bytes);
}

std::optional<std::vector<std::string>> unarchiveWords(std::string_view bytes) {
  return Reader(bytes).strings<std::string>(Major::text);
}

std::optional<uint32_t> unarchiveDocID(std::string_view bytes) {
  Reader reader(bytes);
  const auto value = reader.head(Major::number);
  if (!value || !reader.atEnd() || *value > std::numeric_limits<uint32_t>::max()) {
    return std::nullopt;
  }
  return static_cast<uint32_t>(*value);
}

std::optional<double> unarchiveDate(std::string_view bytes) {
  constexpr size_t kDoubleItem = 9;
  Reader reader(bytes);
  const auto bits = reader.head(Major::simple);
  if (!bits || !reader.atEnd() || bytes.size() != kDoubleItem) return std::nullopt;
  return std::bit_cast<double>(*bits);
}

}  // namespace topkvocab
