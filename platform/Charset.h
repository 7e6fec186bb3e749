#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Text.h"

struct UConverter;

namespace platform {

// Encodings have two numbers: the one that texts are tagged with and the one of the converter. 0
// means none in both.
inline constexpr uint64_t kEncodingUTF8 = 4;

[[nodiscard]] uint32_t converterNumberForEncoding(uint64_t encoding);

// The encoding of an IANA character set name or alias, ignoring case; nullopt for an unknown name.
[[nodiscard]] std::optional<uint64_t> encodingForIANAName(std::string_view name);

// Converts between an encoding and UTF-16, one complete text per call. One thread at a time.
class Charset {
 public:
  // With an unknown encoding every conversion fails.
  explicit Charset(uint64_t encoding);
  ~Charset();
  Charset(const Charset&) = delete;
  Charset& operator=(const Charset&) = delete;

  // Appends to `out`. False, appending nothing, for bytes that are invalid in the encoding.
  [[nodiscard]] bool decode(std::string_view bytes, TLString& out) const;

  // Nullopt for text that the encoding cannot represent.
  [[nodiscard]] std::optional<std::string> encode(TLStringView text) const;

 private:
  struct Closer {
    void operator()(UConverter* converter) const;
  };
  const std::unique_ptr<UConverter, Closer> _converter;
};

}  // namespace platform
