#include <cstddef>
#include <cstdint>

#include "platform/Assert.h"
#include "tokenizer/Tokenizer.h"

namespace {

void checkForm(const std::string& text, const std::vector<uint32_t>& offsets) {
  TL_ASSERT(platform::isValidUTF8(text));
  TL_ASSERT(text.find('\0') == std::string::npos);
  size_t start = 0;
  for (const uint32_t offset : offsets) {
    TL_ASSERT(offset == start);
    const size_t blank = text.find(' ', start);
    TL_ASSERT(blank != std::string::npos && blank > start);
    start = blank + 1;
  }
  TL_ASSERT(start == text.size());
}

}  // namespace

// The first byte selects UTF-8 or UTF-16 (native byte order) for the rest. Compares the fast
// tokenizer with the one that applies the Unicode rules to all text, and checks both against the
// contract of the text form.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const auto fast = tokenizer::NewFastLexemonTokenizer("en_US");
  static const auto chain = tokenizer::NewLexemonTokenizer("en_US");
  if (size == 0) return 0;
  const std::string_view bytes(reinterpret_cast<const char*>(data) + 1, size - 1);
  TLString text;
  if (data[0] % 2 == 0) {
    text = platform::fromUTF8(bytes);
  } else {
    text.resize(bytes.size() / 2);
    for (size_t i = 0; i < text.size(); ++i) {
      text[i] = static_cast<char16_t>(static_cast<uint8_t>(bytes[2 * i]) |
                                      static_cast<uint8_t>(bytes[2 * i + 1]) << 8);
    }
  }
  std::string out;
  std::string reference;
  std::vector<uint32_t> offsets;
  std::vector<uint32_t> referenceOffsets;
  fast->TokenizeToText(text, out, offsets);
  chain->TokenizeToText(text, reference, referenceOffsets);
  checkForm(out, offsets);
  TL_ASSERT(out == reference && offsets == referenceOffsets);
  return 0;
}
