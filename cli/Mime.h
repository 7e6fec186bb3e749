#pragma once

#include <gmime/gmime.h>

#include <memory>
#include <string>
#include <string_view>

#include "cli/TextDecoder.h"
#include "platform/Text.h"

// GMime helpers for all code that parses mail.
namespace cli {

struct Unref {
  void operator()(gpointer object) const { g_object_unref(object); }
};
template <typename T>
using Object = std::unique_ptr<T, Unref>;

struct Free {
  void operator()(gpointer memory) const { g_free(memory); }
};
using CString = std::unique_ptr<char, Free>;

// Call before any other GMime function. Any thread; may be called repeatedly.
void initMIME();

[[nodiscard]] std::string_view orEmpty(const char* text);
[[nodiscard]] bool equalIgnoringCase(std::string_view a, std::string_view b);
// Whether a text is only white space.
[[nodiscard]] bool isBlank(TLStringView text);

// Null if the bytes are not a message. GMime nests parts at most 1024 deep.
[[nodiscard]] Object<GMimeMessage> parseMIME(std::string_view bytes);

[[nodiscard]] bool isAttached(GMimeObject* object);

// The bytes written to a memory stream.
[[nodiscard]] std::string bytesIn(GMimeStream* memory);

// The content of a part without its transfer encoding.
[[nodiscard]] std::string contentOf(GMimePart* part);

// The text of a part. Decodes at most kMaxBodyBytes.
[[nodiscard]] TLString textOf(GMimePart* part, TextDecoder& decoder);

}  // namespace cli
