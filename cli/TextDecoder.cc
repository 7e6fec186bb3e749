#include "cli/TextDecoder.h"

#include <unicode/ucnv.h>

#include <algorithm>
#include <array>
#include <utility>

namespace cli {

namespace {

constexpr const char* kWestern = "windows-1252";

// Charset names that mail often uses for another charset, mostly a superset.
constexpr std::array<std::pair<std::string_view, const char*>, 6> kMeant{{
    {"iso-8859-1", kWestern},
    {"latin1", kWestern},
    {"gb2312", "gb18030"},
    {"ks_c_5601-1987", "windows-949"},
    {"iso-8859-8-i", "iso-8859-8"},
    {"shift_jis", "windows-31j"},
}};

constexpr std::array<std::string_view, 6> kUnsaid{"",        "us-ascii",     "ascii",
                                                  "default", "unknown-8bit", "x-unknown"};

std::string lowercase(std::string_view text) {
  std::string result(text);
  std::transform(result.begin(), result.end(), result.begin(),
                 [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; });
  return result;
}

void normalizeLineEnds(TLString& text) {
  size_t out = 0;
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == u'\r' && i + 1 < text.size() && text[i + 1] == u'\n') continue;
    text[out++] = text[i];
  }
  text.resize(out);
}

TLString convert(UConverter* converter, std::string_view bytes) {
  ucnv_reset(converter);
  TLString text(bytes.size() * 2 + 16, u'\0');  // ICU's bound for any converter
  UErrorCode status = U_ZERO_ERROR;
  const int32_t length = ucnv_toUChars(converter, text.data(), static_cast<int32_t>(text.size()),
                                       bytes.data(), static_cast<int32_t>(bytes.size()), &status);
  if (U_FAILURE(status)) return platform::fromUTF8(bytes);
  text.resize(static_cast<size_t>(length));
  return text;
}

}  // namespace

void TextDecoder::Close::operator()(UConverter* converter) const {
  ucnv_close(converter);
}

UConverter* TextDecoder::converterNamed(const std::string& name) {
  if (_converter == nullptr || _converterName != name) {
    UErrorCode status = U_ZERO_ERROR;
    _converter.reset(ucnv_open(name.c_str(), &status));
    if (U_FAILURE(status)) _converter.reset();
    _converterName = name;
  }
  return _converter.get();
}

TLString TextDecoder::decode(std::string_view bytes, std::string_view charset) {
  std::string name = lowercase(charset);
  const auto meant = std::find_if(kMeant.begin(), kMeant.end(),
                                  [&](const auto& entry) { return entry.first == name; });
  if (meant != kMeant.end()) name = meant->second;
  const bool unsaid = std::find(kUnsaid.begin(), kUnsaid.end(), name) != kUnsaid.end();

  TLString text;
  if (platform::asciiPrefixLength(bytes) == bytes.size() && (unsaid || name == kWestern)) {
    text = platform::fromUTF8(bytes);
  } else if (name == "utf-8" || name == "utf8") {
    text = platform::fromUTF8(bytes);
  } else {
    UConverter* converter = unsaid ? nullptr : converterNamed(name);
    if (converter == nullptr && !platform::isValidUTF8(bytes)) converter = converterNamed(kWestern);
    text = converter == nullptr ? platform::fromUTF8(bytes) : convert(converter, bytes);
  }
  normalizeLineEnds(text);
  return text;
}

}  // namespace cli
