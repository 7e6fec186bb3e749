#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/Text.h"

struct UConverter;

namespace cli {

// Turns the bytes of mail bodies into text, by the name of a character set. What is no valid
// sequence comes out as U+FFFD, and CR LF as LF. Bytes of an unknown, missing or plain ASCII
// charset are read as UTF-8 when they are valid UTF-8, else as windows-1252, which is also what
// mail that says ISO-8859-1 is written in. One thread.
class TextDecoder {
 public:
  [[nodiscard]] TLString decode(std::string_view bytes, std::string_view charset);

 private:
  struct Close {
    void operator()(UConverter* converter) const;
  };

  [[nodiscard]] UConverter* converterNamed(const std::string& name);

  // The converter used last; mail tends to come in runs of one charset.
  std::unique_ptr<UConverter, Close> _converter;
  std::string _converterName;
};

}  // namespace cli
