#include "platform/Charset.h"

#include <unicode/ucnv.h>

#include <algorithm>
#include <array>

namespace platform {

namespace {

// ICU counts bytes in 32 bits; no encoding takes more than 8 per unit.
constexpr size_t kMaxEncodedUnits = size_t{1} << 27;

struct Encoding {
  uint64_t number;
  uint32_t converter;
  const char* name;
};

// Numbers are stable; 4 and 0x8000100 are UTF-8.
constexpr std::array kEncodings = std::to_array<Encoding>({
    {1, 0x600, "US-ASCII"},
    {3, 0x920, "EUC-JP"},
    {kEncodingUTF8, 0x8000100, "UTF-8"},
    {5, 0x201, "ISO-8859-1"},
    {8, 0xA01, "Shift_JIS"},
    {9, 0x202, "ISO-8859-2"},
    {10, 0x100, "UTF-16"},
    {11, 0x502, "windows-1251"},
    {12, 0x500, "windows-1252"},
    {13, 0x503, "windows-1253"},
    {14, 0x504, "windows-1254"},
    {15, 0x501, "windows-1250"},
    {21, 0x820, "ISO-2022-JP"},
    {30, 0x1, "macintosh"},
    {0x80000203, 0x203, "ISO-8859-3"},
    {0x80000204, 0x204, "ISO-8859-4"},
    {0x80000205, 0x205, "ISO-8859-5"},
    {0x80000206, 0x206, "ISO-8859-6"},
    {0x80000207, 0x207, "ISO-8859-7"},
    {0x80000208, 0x208, "ISO-8859-8"},
    {0x80000209, 0x209, "ISO-8859-9"},
    {0x8000020D, 0x20D, "ISO-8859-13"},
    {0x8000020F, 0x20F, "ISO-8859-15"},
    {0x80000505, 0x505, "windows-1255"},
    {0x80000506, 0x506, "windows-1256"},
    {0x80000507, 0x507, "windows-1257"},
    {0x80000508, 0x508, "windows-1258"},
    {0x8000041D, 0x41D, "TIS-620"},
    {0x80000632, 0x632, "GB18030"},
    {0x80000631, 0x631, "GBK"},
    {0x80000930, 0x930, "GB2312"},
    {0x80000840, 0x840, "ISO-2022-KR"},
    {0x80000940, 0x940, "EUC-KR"},
    {0x80000A02, 0xA02, "KOI8-R"},
    {0x80000A08, 0xA08, "KOI8-U"},
    {0x80000A03, 0xA03, "Big5"},
    {0x80000A06, 0xA06, "Big5-HKSCS"},
    {0x90000100, 0x10000100, "UTF-16BE"},
    {0x94000100, 0x14000100, "UTF-16LE"},
    {0x8C000100, 0xC000100, "UTF-32"},
});

const Encoding* findEncoding(uint64_t number) {
  const auto found = std::find_if(kEncodings.begin(), kEncodings.end(),
                                  [&](const Encoding& each) { return each.number == number; });
  return found == kEncodings.end() ? nullptr : &*found;
}

// ICU's own name of an IANA name or alias; null for none.
const char* converterName(const char* name) {
  UErrorCode status = U_ZERO_ERROR;
  const char* canonical = ucnv_getCanonicalName(name, "IANA", &status);
  return U_SUCCESS(status) ? canonical : nullptr;
}

UConverter* openConverter(uint64_t number) {
  const Encoding* encoding = findEncoding(number);
  if (encoding == nullptr) return nullptr;
  UErrorCode status = U_ZERO_ERROR;
  UConverter* converter = ucnv_open(encoding->name, &status);
  if (converter == nullptr) return nullptr;
  ucnv_setToUCallBack(converter, UCNV_TO_U_CALLBACK_STOP, nullptr, nullptr, nullptr, &status);
  ucnv_setFromUCallBack(converter, UCNV_FROM_U_CALLBACK_STOP, nullptr, nullptr, nullptr, &status);
  if (U_SUCCESS(status)) return converter;
  ucnv_close(converter);
  return nullptr;
}

}  // namespace

uint32_t converterNumberForEncoding(uint64_t encoding) {
  const Encoding* found = findEncoding(encoding);
  return found == nullptr ? 0 : found->converter;
}

std::optional<uint64_t> encodingForIANAName(std::string_view name) {
  if (name.find('\0') != std::string_view::npos) return std::nullopt;
  const char* wanted = converterName(std::string(name).c_str());
  if (wanted == nullptr) return std::nullopt;
  for (const Encoding& encoding : kEncodings) {
    const char* own = converterName(encoding.name);
    if (own != nullptr && std::string_view(own) == wanted) return encoding.number;
  }
  return std::nullopt;
}

void Charset::Closer::operator()(UConverter* converter) const {
  ucnv_close(converter);
}

Charset::Charset(uint64_t encoding) : _converter(openConverter(encoding)) {}

Charset::~Charset() = default;

bool Charset::decode(std::string_view bytes, TLString& out) const {
  if (!_converter) return false;
  ucnv_resetToUnicode(_converter.get());
  const size_t start = out.size();
  const char* source = bytes.data();
  const char* const sourceEnd = source + bytes.size();
  UErrorCode status = U_BUFFER_OVERFLOW_ERROR;
  size_t used = start;
  out.resize(start + bytes.size());
  while (status == U_BUFFER_OVERFLOW_ERROR) {
    status = U_ZERO_ERROR;
    char16_t* target = out.data() + used;
    ucnv_toUnicode(_converter.get(), &target, out.data() + out.size(), &source, sourceEnd, nullptr,
                   true, &status);
    used = static_cast<size_t>(target - out.data());
    if (status == U_BUFFER_OVERFLOW_ERROR) out.resize(out.size() + bytes.size() + 16);
  }
  out.resize(U_SUCCESS(status) ? used : start);
  return U_SUCCESS(status);
}

std::optional<std::string> Charset::encode(TLStringView text) const {
  if (!_converter || text.size() > kMaxEncodedUnits) return std::nullopt;
  std::string out(static_cast<size_t>(UCNV_GET_MAX_BYTES_FOR_STRING(
                      text.size(), ucnv_getMaxCharSize(_converter.get()))),
                  '\0');
  UErrorCode status = U_ZERO_ERROR;
  const int32_t length =
      ucnv_fromUChars(_converter.get(), out.data(), static_cast<int32_t>(out.size()), text.data(),
                      static_cast<int32_t>(text.size()), &status);
  if (U_FAILURE(status)) return std::nullopt;
  out.resize(static_cast<size_t>(length));
  return out;
}

}  // namespace platform
