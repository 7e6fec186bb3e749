#include "cli/MessageParts.h"

#include <algorithm>

#include "cli/MessageParser.h"
#include "cli/Mime.h"

namespace cli {

namespace {

void addLeaf(GMimePart* part, Leaves& leaves) {
  GMimeObject* const object = GMIME_OBJECT(part);
  GMimeContentType* const type = g_mime_object_get_content_type(object);
  const bool attached = isAttached(object);
  const bool text = type == nullptr || g_mime_content_type_is_type(type, "text", "*");
  const bool plain = type == nullptr || g_mime_content_type_is_type(type, "text", "plain");
  const bool html = type != nullptr && g_mime_content_type_is_type(type, "text", "html");
  const bool body = !attached && (plain || html);
  if (body) (plain ? leaves.plain : leaves.html).push_back(part);
  if (attached || !text || g_mime_part_get_filename(part) != nullptr) {
    leaves.attachments.push_back(object);
    if (!body) leaves.files.push_back(object);
  }
}

}  // namespace

Leaves leavesOf(GMimeMessage* message) {
  Leaves leaves;
  std::vector<GMimeObject*> pending{g_mime_message_get_mime_part(message)};
  for (size_t count = 0; !pending.empty() && count < kMaxParts; ++count) {
    GMimeObject* const object = pending.back();
    pending.pop_back();
    if (object == nullptr) continue;
    if (GMIME_IS_MULTIPART(object)) {
      GMimeMultipart* const multipart = GMIME_MULTIPART(object);
      const int children =
          std::min(g_mime_multipart_get_count(multipart), static_cast<int>(kMaxParts));
      for (int i = children; i > 0; --i) {
        pending.push_back(g_mime_multipart_get_part(multipart, i - 1));
      }
    } else if (GMIME_IS_MESSAGE_PART(object)) {
      GMimeMessage* const inner = g_mime_message_part_get_message(GMIME_MESSAGE_PART(object));
      if (isAttached(object)) {
        leaves.attachments.push_back(object);
        leaves.files.push_back(object);
      } else if (inner != nullptr) {
        pending.push_back(g_mime_message_get_mime_part(inner));
      }
    } else if (GMIME_IS_PART(object)) {
      addLeaf(GMIME_PART(object), leaves);
    }
  }
  return leaves;
}

TLString joinedText(const std::vector<GMimePart*>& parts, TextDecoder& decoder) {
  TLString joined;
  for (GMimePart* part : parts) {
    if (joined.size() > kMaxBodyBytes) break;
    if (!joined.empty() && joined.back() != u'\n') joined.push_back(u'\n');
    joined += textOf(part, decoder);
  }
  return joined;
}

}  // namespace cli
