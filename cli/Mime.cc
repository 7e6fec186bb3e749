#include "cli/Mime.h"

#include <algorithm>
#include <mutex>
#include <string>

#include "cli/FlowedText.h"
#include "cli/MessageParser.h"

namespace cli {

void initMIME() {
  static std::once_flag once;
  std::call_once(once, g_mime_init);
}

std::string_view orEmpty(const char* text) {
  return text == nullptr ? std::string_view() : text;
}

bool equalIgnoringCase(std::string_view a, std::string_view b) {
  return a.size() == b.size() && g_ascii_strncasecmp(a.data(), b.data(), a.size()) == 0;
}

bool isBlank(TLStringView text) {
  return text.find_first_not_of(u" \t\r\n\u00A0") == TLStringView::npos;
}

Object<GMimeMessage> parseMIME(std::string_view bytes) {
  const Object<GMimeStream> stream(g_mime_stream_mem_new_with_buffer(bytes.data(), bytes.size()));
  const Object<GMimeParser> parser(g_mime_parser_new_with_stream(stream.get()));
  g_mime_parser_set_format(parser.get(), GMIME_FORMAT_MESSAGE);
  // Parts refer to the stream and are not copied.
  g_mime_parser_set_persist_stream(parser.get(), TRUE);
  return Object<GMimeMessage>(g_mime_parser_construct_message(parser.get(), nullptr));
}

bool isAttached(GMimeObject* object) {
  return equalIgnoringCase(orEmpty(g_mime_object_get_disposition(object)), "attachment");
}

std::string bytesIn(GMimeStream* memory) {
  const GByteArray* const bytes = g_mime_stream_mem_get_byte_array(GMIME_STREAM_MEM(memory));
  return {reinterpret_cast<const char*>(bytes->data), bytes->len};
}

std::string contentOf(GMimePart* part) {
  GMimeDataWrapper* const content = g_mime_part_get_content(part);
  if (content == nullptr) return {};
  const Object<GMimeStream> stream(g_mime_stream_mem_new());
  g_mime_data_wrapper_write_to_stream(content, stream.get());
  return bytesIn(stream.get());
}

TLString textOf(GMimePart* part, TextDecoder& decoder) {
  const std::string content = contentOf(part);
  const auto parameter = [&](const char* name) {
    return orEmpty(g_mime_object_get_content_type_parameter(GMIME_OBJECT(part), name));
  };
  TLString text =
      decoder.decode(std::string_view(content).substr(0, kMaxBodyBytes), parameter("charset"));
  if (!equalIgnoringCase(parameter("format"), "flowed")) return text;
  return unflow(text, equalIgnoringCase(parameter("delsp"), "yes"));
}

}  // namespace cli
