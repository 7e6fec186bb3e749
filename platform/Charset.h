#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Text.h"

struct UConverter;

namespace platform {

// Encodings go by two numbers, those that texts are tagged with and those of the converter. 0
// stands for none in both.
inline constexpr uint64_t kEncodingUTF8 = 4;

[[nodiscard]] uint32_t converterNumberForEncoding(uint64_t encoding);

// The encoding that an IANA character set name or alias in any case stands for; none for a name
// that is not known.
[[nodiscard]] std::optional<uint64_t> encodingForIANAName(std::string_view name);

// Converts between an encoding and UTF-16, each call a text of its own. One thread at a time.
class Charset {
 public:
  // Of an encoding that is not known each conversion fails.
  explicit Charset(uint64_t encoding);
  ~Charset();
  Charset(const Charset&) = delete;
  Charset& operator=(const Charset&) = delete;

  // Appends to `out`. False, and nothing appended, for bytes that are not valid in the encoding.
  [[nodiscard]] bool decode(std::string_view bytes, TLString& out) const;

  // None for text that the encoding cannot hold.
  [[nodiscard]] std::optional<std::string> encode(TLStringView text) const;

 private:
  struct Closer {
    void operator()(UConverter* converter) const;
  };
  const std::unique_ptr<UConverter, Closer> _converter;
};

}  // namespace platform
