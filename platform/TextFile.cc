#include "platform/TextFile.h"

#include <unicode/ucnv.h>
#include <unicode/ucsdet.h>
#include <unicode/unistr.h>

#include <cstdint>
#include <memory>

#include "platform/Files.h"

namespace platform {

namespace {

// Out of 100. Below this, the statistics match random bytes.
constexpr int32_t kMinConfidence = 20;

TLString decode(std::string_view bytes, const char* encoding) {
  const icu::UnicodeString text(bytes.data(), static_cast<int32_t>(bytes.size()), encoding);
  return {text.getBuffer(), static_cast<size_t>(text.length())};
}

// ICU's name of the most likely encoding; empty if none is likely.
std::string likeliestEncoding(std::string_view bytes) {
  UErrorCode status = U_ZERO_ERROR;
  const std::unique_ptr<UCharsetDetector, decltype(&ucsdet_close)> detector(ucsdet_open(&status),
                                                                            &ucsdet_close);
  ucsdet_setText(detector.get(), bytes.data(), static_cast<int32_t>(bytes.size()), &status);
  const UCharsetMatch* match = ucsdet_detect(detector.get(), &status);
  if (U_FAILURE(status) || match == nullptr ||
      ucsdet_getConfidence(match, &status) < kMinConfidence) {
    return {};
  }
  return ucsdet_getName(match, &status);
}

}  // namespace

TLString decodeText(std::string_view bytes) {
  if (bytes.empty()) return {};
  UErrorCode status = U_ZERO_ERROR;
  int32_t markLength = 0;
  const char* marked = ucnv_detectUnicodeSignature(bytes.data(), static_cast<int32_t>(bytes.size()),
                                                   &markLength, &status);
  if (marked != nullptr) return decode(bytes.substr(static_cast<size_t>(markLength)), marked);
  if (bytes.find('\0') == std::string_view::npos && isValidUTF8(bytes)) return fromUTF8(bytes);
  const std::string likeliest = likeliestEncoding(bytes);
  return decode(bytes, likeliest.empty() ? "ISO-8859-1" : likeliest.c_str());
}

std::optional<TLString> readTextFile(const std::string& path, size_t maximum, TLErrorOut error) {
  const auto bytes = readFile(path, maximum, error);
  if (!bytes) return std::nullopt;
  return decodeText(*bytes);
}

}  // namespace platform
