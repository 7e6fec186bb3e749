#include "html/TALHTMLParsing.h"

#include <unicode/uchar.h>

#include <algorithm>
#include <utility>

#include "html/TALHTMLScanBuffer.h"

namespace {

constexpr size_t kFirstCapacity = 4096;
constexpr uint64_t kMinTitleLimit = 512;
constexpr int kMaxHalvings = 10;
constexpr const char* kTitleKey = "SysTitleDocumentAttribute";

// The number of bytes after a lead byte, by its high nibble; 0 for other bytes.
constexpr std::array<uint8_t, 16> kFollowing = {0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 1, 1, 2, 3};

// Replaces each two spaces by one.
bool halveSpaces(std::string& text) {
  std::string out;
  out.reserve(text.size());
  for (size_t i = 0; i < text.size(); ++i) {
    out += text[i];
    if (text[i] == ' ' && i + 1 < text.size() && text[i + 1] == ' ') ++i;
  }
  const bool changed = out.size() != text.size();
  text = std::move(out);
  return changed;
}

// Taken from the start of the body on purpose: the title element itself is used only as a flag.
std::string titleFromBody(TLStringView body) {
  while (!body.empty() && u_isUWhiteSpace(body.front())) body.remove_prefix(1);
  while (!body.empty() && u_isUWhiteSpace(body.back())) body.remove_suffix(1);
  std::string title = platform::toUTF8(body);
  for (char& c : title) {
    if (c == '\n' || c == '\t') c = ' ';
  }
  for (int pass = 0; pass < kMaxHalvings && halveSpaces(title); ++pass) {
  }
  return title;
}

bool hasTitleText(const TALHTMLParsing& parsing) {
  if (parsing.titleLength == 0) return false;
  TALHTMLParsing title = parsing.fresh();
  title.indexingLimit = std::max(parsing.indexingLimit, kMinTitleLimit);
  TALHTMLScanBuffer({parsing.titleStart, parsing.titleLength}, nullptr, nullptr, nullptr, title);
  return !title.uniChars.empty();
}

}  // namespace

TALHTMLParsing::TALHTMLParsing(uint64_t encoding)
    : sourceEncoding(encoding), sourceSysEncoding(platform::converterNumberForEncoding(encoding)) {
  std::optional<std::string> newLine = "\n";
  if (encoding != platform::kEncodingUTF8) {
    _charset = std::make_shared<platform::Charset>(encoding);
    newLine = _charset->encode(u"\n");
  }
  if (newLine && newLine->size() <= newLineBuffer.size()) {
    std::copy(newLine->begin(), newLine->end(), newLineBuffer.begin());
    newLineLength = newLine->size();
  }
}

TALHTMLParsing TALHTMLParsing::fresh() const {
  TALHTMLParsing other(platform::kEncodingUTF8);
  other._charset = _charset;
  other.newLineBuffer = newLineBuffer;
  other.newLineLength = newLineLength;
  other.sourceEncoding = sourceEncoding;
  other.sourceSysEncoding = sourceSysEncoding;
  other.indexingLimit = indexingLimit;
  return other;
}

void TALHTMLParsing::makeRoom(size_t units) {
  const size_t needed = uniChars.size() + units;
  if (needed <= uniChars.capacity()) return;
  size_t capacity = std::max(uniChars.capacity(), kFirstCapacity);
  while (capacity < needed) capacity *= 2;
  uniChars.reserve(capacity);
}

void TALHTMLParsing::appendText(std::string_view text) {
  if (uniChars.size() >= indexingLimit) return;
  if (uniChars.empty() && text == std::string_view(newLineBuffer.data(), newLineLength)) return;
  makeRoom(text.size());
  if (!_charset) {
    appendUTF8(text);
  } else {
    // Text that is invalid in its encoding is skipped.
    static_cast<void>(_charset->decode(text, uniChars));
  }
}

void TALHTMLParsing::appendUTF8(std::string_view text) {
  while (!text.empty()) {
    const size_t ascii = platform::asciiPrefixLength(text);
    uniChars.resize(uniChars.size() + ascii);
    std::copy_n(text.begin(), ascii, uniChars.end() - static_cast<ptrdiff_t>(ascii));
    text.remove_prefix(ascii);
    while (!text.empty() && static_cast<uint8_t>(text.front()) >= 0x80) {
      const auto lead = static_cast<uint8_t>(text.front());
      const size_t following = kFollowing[lead >> 4];
      if (following >= text.size()) return;
      // A lead byte of n bytes keeps 7 - n bits.
      uint32_t value = lead & (0x7Fu >> (following + 1));
      for (size_t i = 1; i <= following; ++i) {
        value = value << 6 | (static_cast<uint8_t>(text[i]) & 0x3Fu);
      }
      text.remove_prefix(following + 1);
      if (following == 0) continue;
      if (following == 3) {
        uniChars.push_back(static_cast<char16_t>(0xD7C0 + (value >> 10)));
        value = 0xDC00 | (value & 0x3FF);
      }
      uniChars.push_back(static_cast<char16_t>(value));
    }
  }
}

void TALHTMLParsing::appendUnichars(TLStringView units) {
  if (uniChars.size() >= indexingLimit) return;
  if (uniChars.empty() && units == u"\n") return;
  makeRoom(units.size());
  uniChars.append(units);
}

std::optional<TLString> TALPlainTextFromHTMLData(std::optional<std::string_view> data,
                                                 uint64_t limit,
                                                 std::optional<nlohmann::json>* attributes,
                                                 uint64_t encoding) {
  if (attributes != nullptr) attributes->reset();
  if (!data || data->empty()) return std::nullopt;
  TALHTMLParsing parsing(encoding);
  parsing.indexingLimit = limit;
  // Meta tags affect the document's attributes only, not its text.
  TALHTMLScanBuffer(*data, TALHTMLStartTag, TALHTMLEndTag,
                    attributes == nullptr ? nullptr : TALHTMLAttribute, parsing);
  if (attributes != nullptr && hasTitleText(parsing)) {
    parsing.attributes[kTitleKey] = titleFromBody(parsing.uniChars);
    *attributes = std::move(parsing.attributes);
  }
  if (parsing.uniChars.empty()) return std::nullopt;
  return std::move(parsing.uniChars);
}
