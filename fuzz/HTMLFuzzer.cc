#include <cstddef>
#include <cstdint>

#include "html/TALHTMLParsing.h"
#include "platform/Assert.h"

// The first byte selects the encoding, the rest is the document. The text must not be longer than
// its bytes, and must be the same whether attributes are requested or not.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  constexpr uint64_t kEncodings[] = {platform::kEncodingUTF8, 5, 8, 21, 10};
  if (size == 0) return 0;
  const uint64_t encoding = kEncodings[data[0] % std::size(kEncodings)];
  const std::string_view html(reinterpret_cast<const char*>(data) + 1, size - 1);
  std::optional<nlohmann::json> attributes;
  const auto text = TALPlainTextFromHTMLData(html, 2147483647, nullptr, encoding);
  TL_ASSERT(TALPlainTextFromHTMLData(html, 2147483647, &attributes, encoding) == text);
  TL_ASSERT(!text || (!text->empty() && text->size() <= html.size()));
  return 0;
}
