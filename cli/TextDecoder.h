#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/Text.h"

struct UConverter;

namespace cli {

// Decodes mail bodies by charset name. Invalid sequences become U+FFFD, and CR LF becomes LF. An
// unknown, missing or plain ASCII charset is decoded as UTF-8 if the bytes are valid UTF-8,
// otherwise as windows-1252, which is also used for ISO-8859-1. One thread.
class TextDecoder {
 public:
  [[nodiscard]] TLString decode(std::string_view bytes, std::string_view charset);

 private:
  struct Close {
    void operator()(UConverter* converter) const;
  };

  [[nodiscard]] UConverter* converterNamed(const std::string& name);

  // The last converter, kept because consecutive mails often have the same charset.
  std::unique_ptr<UConverter, Close> _converter;
  std::string _converterName;
};

}  // namespace cli
