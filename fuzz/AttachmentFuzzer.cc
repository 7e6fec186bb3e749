// Takes any bytes as what the client and tallow-extract send each other, as an office document in a
// zip file, and as the XML in one. Texts must be valid UTF-8 within their limit, and headers that
// parse must be what is encoded from them.

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "extract/OfficeXML.h"
#include "extract/Protocol.h"
#include "extract/TextExtraction.h"
#include "platform/Assert.h"
#include "platform/Text.h"

namespace {

constexpr size_t kLimit = 1000;

void check(const extract::Extraction& extraction) {
  const bool hasText = extraction.outcome == extract::Outcome::extracted ||
                       extraction.outcome == extract::Outcome::cut;
  TL_ASSERT(hasText != extraction.text.empty());
  TL_ASSERT(extraction.text.size() <= kLimit);
  TL_ASSERT(platform::isValidUTF8(extraction.text));
}

void parseHeaders(std::string_view bytes) {
  const auto request = extract::parseRequest(bytes);
  TL_ASSERT(!request || encode(*request) == bytes);
  const auto reply = extract::parseReply(bytes, kLimit);
  TL_ASSERT(!reply || (encode(*reply) == bytes && reply->size <= kLimit));
}

// In two parts, so that tokens are cut.
void parseXML(extract::Kind kind, std::string_view bytes) {
  extract::TextCollector text(kLimit);
  extract::OfficeXML xml(kind, text);
  const bool fed = xml.feed(bytes.substr(0, bytes.size() / 2)) &&  //
                   xml.feed(bytes.substr(bytes.size() / 2));
  const bool whole = fed && xml.end();
  check(std::move(text).finish(whole));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);
  parseHeaders(bytes);
  for (const auto kind : {extract::Kind::openDocument, extract::Kind::officeXML}) {
    parseXML(kind, bytes);
    check(extract::extractText(kind, bytes, kLimit));
  }
  check(extract::extractText(extract::Kind::zip, bytes, kLimit));
  return 0;
}
