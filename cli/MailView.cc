#include "cli/MailView.h"

#include <algorithm>

#include "cli/MessageParser.h"
#include "html/TALHTMLParsing.h"

namespace cli {

namespace {

constexpr size_t kMaxHTMLText = kMaxBodyBytes;

bool isType(GMimeObject* object, const char* type, const char* subtype) {
  GMimeContentType* const found = g_mime_object_get_content_type(object);
  return found != nullptr && g_mime_content_type_is_type(found, type, subtype);
}

bool isPlain(GMimeObject* object) {
  return g_mime_object_get_content_type(object) == nullptr || isType(object, "text", "plain");
}

bool isHTML(GMimeObject* object) {
  return isType(object, "text", "html");
}

// Trims lines and reduces several empty lines to one.
TLString tidied(TLStringView text) {
  constexpr TLStringView kBlanks = u" \t\r\u00A0";
  TLString tidy;
  while (!text.empty()) {
    const size_t end = std::min(text.find(u'\n'), text.size());
    TLStringView line = text.substr(0, end);
    line.remove_prefix(std::min(line.find_first_not_of(kBlanks), line.size()));
    line = line.substr(0, line.find_last_not_of(kBlanks) + 1);
    text.remove_prefix(std::min(end + 1, text.size()));
    if (line.empty() && (tidy.empty() || tidy.ends_with(u"\n\n"))) continue;
    tidy.append(line).push_back(u'\n');
  }
  return tidy;
}

TLString textOfHTML(const TLString& html) {
  const std::string bytes = platform::toUTF8(html);
  return tidied(TALPlainTextFromHTMLData(bytes, kMaxHTMLText, nullptr, platform::kEncodingUTF8)
                    .value_or(TLString()));
}

std::string cutField(std::string_view value) {
  TLString units = platform::fromUTF8(value);
  if (units.size() <= MailView::kMaxFieldUnits) return platform::toUTF8(units);
  units.resize(MailView::kMaxFieldUnits);
  return platform::toUTF8(units) + "…";
}

struct Field {
  const char* name;
  int addresses;  // a GMimeAddressType; -1 for a text field
};
constexpr Field kFields[] = {{"From", GMIME_ADDRESS_TYPE_FROM},
                             {"To", GMIME_ADDRESS_TYPE_TO},
                             {"Cc", GMIME_ADDRESS_TYPE_CC},
                             {"Bcc", GMIME_ADDRESS_TYPE_BCC},
                             {"Reply-To", GMIME_ADDRESS_TYPE_REPLY_TO},
                             {"Date", -1},
                             {"Subject", -1}};

// Quotes names that look like an address, because the field itself may lack the quotes.
std::string valueOf(GMimeMessage* message, const Field& field) {
  if (field.addresses >= 0) {
    InternetAddressList* const list =
        g_mime_message_get_addresses(message, static_cast<GMimeAddressType>(field.addresses));
    if (list != nullptr && internet_address_list_length(list) > 0) {
      const CString text(internet_address_list_to_string(list, nullptr, FALSE));
      return std::string(orEmpty(text.get()));
    }
  }
  return std::string(orEmpty(g_mime_object_get_header(GMIME_OBJECT(message), field.name)));
}

// A part, and whether its text is shown.
struct Pending {
  GMimeObject* object;
  bool read;
};

}  // namespace

std::unique_ptr<MailView> MailView::parse(std::string_view bytes) {
  initMIME();
  Object<GMimeMessage> message = parseMIME(bytes);
  if (message == nullptr) return nullptr;
  return std::unique_ptr<MailView>(new MailView(std::move(message)));
}

MailView::MailView(Object<GMimeMessage> message) : _message(std::move(message)) {
  std::vector<Pending> pending{{g_mime_message_get_mime_part(_message.get()), true}};
  for (size_t count = 0; !pending.empty() && count < kMaxParts; ++count) {
    const auto [object, read] = pending.back();
    pending.pop_back();
    if (object == nullptr) continue;
    if (GMIME_IS_MULTIPART(object)) {
      GMimeMultipart* const multipart = GMIME_MULTIPART(object);
      const int chosen =
          read && isType(object, "multipart", "alternative") ? chosenOf(multipart) : -1;
      const int children =
          std::min(g_mime_multipart_get_count(multipart), static_cast<int>(kMaxParts));
      for (int i = children - 1; i >= 0; --i) {
        pending.push_back(
            {g_mime_multipart_get_part(multipart, i), read && (chosen < 0 || chosen == i)});
      }
    } else if (GMIME_IS_MESSAGE_PART(object) && !isAttached(object)) {
      GMimeMessage* const inner = g_mime_message_part_get_message(GMIME_MESSAGE_PART(object));
      if (inner != nullptr) pending.push_back({g_mime_message_get_mime_part(inner), read});
    } else {
      addLeaf(object, read);
    }
  }
}

// Prefers plain text, then the last alternative that is or contains HTML, then the last one.
int MailView::chosenOf(GMimeMultipart* alternatives) {
  const int count = std::min(g_mime_multipart_get_count(alternatives), static_cast<int>(kMaxParts));
  int chosen = count - 1;
  bool holdsHTML = false;
  for (int i = count - 1; i >= 0; --i) {
    GMimeObject* const child = g_mime_multipart_get_part(alternatives, i);
    if (GMIME_IS_PART(child) && isPlain(child) && !isAttached(child)) {
      if (!isBlank(textOf(GMIME_PART(child), _decoder))) return i;
    } else if (!holdsHTML && (isHTML(child) || GMIME_IS_MULTIPART(child))) {
      holdsHTML = true;
      chosen = i;
    }
  }
  return chosen;
}

void MailView::addLeaf(GMimeObject* leaf, bool read) {
  const bool text = GMIME_IS_PART(leaf) && !isAttached(leaf) && (isPlain(leaf) || isHTML(leaf));
  if (text && read) _texts.push_back(GMIME_PART(leaf));
  const bool named = GMIME_IS_PART(leaf) && g_mime_part_get_filename(GMIME_PART(leaf)) != nullptr;
  if (!text || named) _attachments.push_back(leaf);
}

std::vector<std::pair<std::string, std::string>> MailView::fields() const {
  std::vector<std::pair<std::string, std::string>> found;
  for (const Field& field : kFields) {
    std::string value = cutField(valueOf(_message.get(), field));
    if (!value.empty()) found.emplace_back(field.name, std::move(value));
  }
  return found;
}

TLString MailView::readable(GMimePart* part) {
  TLString text = textOf(part, _decoder);
  return isHTML(GMIME_OBJECT(part)) ? textOfHTML(text) : text;
}

std::string MailView::text() {
  TLString joined;
  for (GMimePart* const part : _texts) {
    if (joined.size() > kMaxBodyBytes) {
      _complete = false;
      break;
    }
    if (!joined.empty() && joined.back() != u'\n') joined.push_back(u'\n');
    joined += readable(part);
    if (contentOf(part).size() > kMaxBodyBytes) _complete = false;
  }
  return platform::toUTF8(joined);
}

std::vector<MailView::Attachment> MailView::attachments() const {
  std::vector<Attachment> list;
  for (GMimeObject* const object : _attachments) {
    const char* const name =
        GMIME_IS_PART(object) ? g_mime_part_get_filename(GMIME_PART(object)) : nullptr;
    GMimeContentType* const type = g_mime_object_get_content_type(object);
    const CString typeText(type == nullptr ? nullptr : g_mime_content_type_get_mime_type(type));
    list.push_back({cutField(orEmpty(name)), cutField(orEmpty(typeText.get())),
                    attachment(list.size()).size()});
  }
  return list;
}

std::string MailView::attachment(size_t index) const {
  GMimeObject* const object = _attachments.at(index);
  if (GMIME_IS_PART(object)) return contentOf(GMIME_PART(object));
  const Object<GMimeStream> stream(g_mime_stream_mem_new());
  GMimeMessage* const inner = GMIME_IS_MESSAGE_PART(object)
                                  ? g_mime_message_part_get_message(GMIME_MESSAGE_PART(object))
                                  : nullptr;
  if (inner == nullptr) return {};
  g_mime_object_write_to_stream(GMIME_OBJECT(inner), nullptr, stream.get());
  return bytesIn(stream.get());
}

}  // namespace cli
