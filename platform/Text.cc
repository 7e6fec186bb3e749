#include "platform/Text.h"

#include <unicode/ustring.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <cstdint>
#include <cstring>

namespace platform {

namespace {

constexpr UChar32 kReplacement = 0xFFFD;

// ICU takes 32-bit lengths; longer texts are converted in pieces that end at a character boundary.
constexpr size_t kPiece = size_t{1} << 28;

// Moves the cut back by at most three bytes, to the lead byte of the character that it would split.
size_t pieceLength(std::string_view bytes) {
  size_t n = std::min(bytes.size(), kPiece);
  if (n < bytes.size()) {
    for (int i = 0; i < 3 && n > 1 && U8_IS_TRAIL(static_cast<uint8_t>(bytes[n])); ++i) --n;
  }
  return n;
}

void appendNonASCII(TLStringView text, std::string& out) {
  while (!text.empty()) {
    size_t n = std::min(text.size(), kPiece);
    if (n < text.size() && U16_IS_LEAD(text[n - 1])) --n;
    const size_t start = out.size();
    out.resize(start + n * 3);
    int32_t written = 0;
    UErrorCode status = U_ZERO_ERROR;
    u_strToUTF8WithSub(out.data() + start, static_cast<int32_t>(n * 3), &written, text.data(),
                       static_cast<int32_t>(n), kReplacement, nullptr, &status);
    out.resize(start + (U_SUCCESS(status) ? static_cast<size_t>(written) : 0));
    text.remove_prefix(n);
  }
}

}  // namespace

size_t asciiPrefixLength(TLStringView text) {
  size_t i = 0;
  const size_t n = text.size();
  for (; i + 4 <= n; i += 4) {
    uint64_t block;
    std::memcpy(&block, text.data() + i, sizeof block);
    if ((block & 0xFF80FF80FF80FF80ULL) != 0) break;
  }
  while (i < n && text[i] < 0x80) ++i;
  return i;
}

size_t asciiPrefixLength(std::string_view bytes) {
  size_t i = 0;
  const size_t n = bytes.size();
  for (; i + 8 <= n; i += 8) {
    uint64_t block;
    std::memcpy(&block, bytes.data() + i, sizeof block);
    if ((block & 0x8080808080808080ULL) != 0) break;
  }
  while (i < n && static_cast<unsigned char>(bytes[i]) < 0x80) ++i;
  return i;
}

void appendUTF8(TLStringView text, std::string& out) {
  const size_t ascii = asciiPrefixLength(text);
  const size_t start = out.size();
  out.resize(start + ascii);
  std::transform(text.begin(), text.begin() + static_cast<ptrdiff_t>(ascii),
                 out.begin() + static_cast<ptrdiff_t>(start),
                 [](char16_t c) { return static_cast<char>(c); });
  if (ascii < text.size()) appendNonASCII(text.substr(ascii), out);
}

std::string toUTF8(TLStringView text) {
  std::string out;
  appendUTF8(text, out);
  return out;
}

TLString fromUTF8(std::string_view bytes) {
  const size_t ascii = asciiPrefixLength(bytes);
  TLString out(ascii, u'\0');
  std::transform(bytes.begin(), bytes.begin() + static_cast<ptrdiff_t>(ascii), out.begin(),
                 [](char c) { return static_cast<char16_t>(c); });
  bytes.remove_prefix(ascii);
  while (!bytes.empty()) {
    const size_t n = pieceLength(bytes);
    const size_t start = out.size();
    out.resize(start + n);
    int32_t written = 0;
    UErrorCode status = U_ZERO_ERROR;
    u_strFromUTF8WithSub(out.data() + start, static_cast<int32_t>(n), &written, bytes.data(),
                         static_cast<int32_t>(n), kReplacement, nullptr, &status);
    out.resize(start + (U_SUCCESS(status) ? static_cast<size_t>(written) : 0));
    bytes.remove_prefix(n);
  }
  return out;
}

bool isValidUTF8(std::string_view bytes) {
  bytes.remove_prefix(asciiPrefixLength(bytes));
  while (!bytes.empty()) {
    const size_t n = pieceLength(bytes);
    int32_t length = 0;
    UErrorCode status = U_ZERO_ERROR;
    u_strFromUTF8(nullptr, 0, &length, bytes.data(), static_cast<int32_t>(n), &status);
    if (status == U_INVALID_CHAR_FOUND) return false;
    bytes.remove_prefix(n);
  }
  return true;
}

std::vector<TLStringView> split(TLStringView text, TLStringView separator) {
  std::vector<TLStringView> pieces;
  for (;;) {
    const size_t at = text.find(separator);
    pieces.push_back(text.substr(0, at));
    if (at == TLStringView::npos) return pieces;
    text.remove_prefix(at + separator.size());
  }
}

std::string printable(const std::optional<TLString>& text) {
  return text ? toUTF8(*text) : std::string("(null)");
}

std::string printable(TLStringView text) {
  return toUTF8(text);
}

}  // namespace platform
