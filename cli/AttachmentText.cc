#include "cli/AttachmentText.h"

#include <algorithm>
#include <array>
#include <utility>

#include "cli/MessageParts.h"

namespace cli {

namespace {

using extract::Kind;
using extract::Outcome;

struct Row {
  std::string_view name;
  Kind kind;
};

constexpr std::array<Row, 9> kTypes{{
    {"application/pdf", Kind::pdf},
    {"application/x-pdf", Kind::pdf},
    {"application/zip", Kind::zip},
    {"application/x-zip-compressed", Kind::zip},
    {"application/vnd.ms-word.document.macroenabled.12", Kind::officeXML},
    {"application/vnd.ms-excel.sheet.macroenabled.12", Kind::officeXML},
    {"application/vnd.ms-powerpoint.presentation.macroenabled.12", Kind::officeXML},
    {"application/xhtml+xml", Kind::html},
    {"text/html", Kind::html},
}};

constexpr std::array<Row, 3> kTypePrefixes{{
    {"application/vnd.oasis.opendocument.", Kind::openDocument},
    {"application/vnd.openxmlformats-officedocument.", Kind::officeXML},
    {"text/", Kind::text},
}};

// Ends of names, for types that are given to any file.
constexpr std::array<Row, 18> kNameEnds{{
    {".pdf", Kind::pdf},
    {".odt", Kind::openDocument},
    {".ods", Kind::openDocument},
    {".odp", Kind::openDocument},
    {".odg", Kind::openDocument},
    {".docx", Kind::officeXML},
    {".docm", Kind::officeXML},
    {".xlsx", Kind::officeXML},
    {".xlsm", Kind::officeXML},
    {".pptx", Kind::officeXML},
    {".pptm", Kind::officeXML},
    {".zip", Kind::zip},
    {".html", Kind::html},
    {".htm", Kind::html},
    {".txt", Kind::text},
    {".csv", Kind::text},
    {".md", Kind::text},
    {".log", Kind::text},
}};

std::string lowered(std::string_view text) {
  const CString low(g_ascii_strdown(text.data(), static_cast<gssize>(text.size())));
  return low.get();
}

template <size_t N, typename Matches>
std::optional<Kind> firstOf(const std::array<Row, N>& rows, const Matches& matches) {
  const auto row =
      std::find_if(rows.begin(), rows.end(), [&](const Row& one) { return matches(one.name); });
  return row == rows.end() ? std::nullopt : std::optional(row->kind);
}

std::string typeOf(GMimeObject* object) {
  GMimeContentType* const type = g_mime_object_get_content_type(object);
  if (type == nullptr) return "text/plain";
  const CString text(g_mime_content_type_get_mime_type(type));
  return lowered(orEmpty(text.get()));
}

bool hasText(Outcome outcome) {
  return outcome == Outcome::extracted || outcome == Outcome::cut;
}

}  // namespace

std::optional<Kind> kindOf(GMimeObject* attachment) {
  if (GMIME_IS_MESSAGE_PART(attachment)) return Kind::message;
  if (!GMIME_IS_PART(attachment)) return std::nullopt;
  const std::string type = typeOf(attachment);
  if (const auto kind = firstOf(kTypes, [&](auto name) { return type == name; })) return kind;
  if (const auto kind = firstOf(kTypePrefixes, [&](auto name) { return type.starts_with(name); })) {
    return kind;
  }
  if (!type.starts_with("application/")) return std::nullopt;
  const std::string file = lowered(orEmpty(g_mime_part_get_filename(GMIME_PART(attachment))));
  return firstOf(kNameEnds, [&](auto end) { return file.ends_with(end); });
}

TLString AttachmentText::of(const std::vector<GMimeObject*>& attachments) {
  _pending.assign(attachments.begin(), attachments.end());
  while (!_pending.empty()) {
    GMimeObject* const attachment = _pending.front();
    _pending.pop_front();
    if (const auto kind = kindOf(attachment)) {
      _counts.add(*kind, hasRoom() ? add(*kind, attachment) : Outcome::noRoom);
    }
  }
  return std::move(_text);
}

bool AttachmentText::hasRoom() const {
  constexpr size_t kMinBytes = 16;
  return _read < kMaxAttachments && _budget.left() >= kMinBytes && Clock::now() < _until;
}

Outcome AttachmentText::add(Kind kind, GMimeObject* attachment) {
  ++_read;
  if (kind == Kind::message) {
    return addMessage(g_mime_message_part_get_message(GMIME_MESSAGE_PART(attachment)));
  }
  GMimePart* const part = GMIME_PART(attachment);
  if (kind == Kind::text) return addText(textOf(part, _decoder));
  if (kind == Kind::html) return addFile(kind, platform::toUTF8(textOf(part, _decoder)));
  return addFile(kind, contentOf(part));
}

Outcome AttachmentText::addFile(Kind kind, std::string_view bytes) {
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(_until - Clock::now());
  const auto result =
      _process.text(kind, bytes, _budget.left(), std::max(left, std::chrono::milliseconds(1)));
  if (!hasText(result.outcome)) return result.outcome;
  return addText(platform::fromUTF8(result.text), result.outcome == Outcome::extracted);
}

// Subject and text; its attachments come after those that are known.
Outcome AttachmentText::addMessage(GMimeMessage* message) {
  if (message == nullptr) return Outcome::damaged;
  const Leaves leaves = leavesOf(message);
  _pending.insert(_pending.end(), leaves.files.begin(), leaves.files.end());
  TLString text = platform::fromUTF8(orEmpty(g_mime_message_get_subject(message)));
  text.push_back(u'\n');
  const TLString plain = joinedText(leaves.plain, _decoder);
  const Outcome outcome = addText(text + plain);
  if (leaves.html.empty() || !isBlank(plain)) return outcome;
  const Outcome ofHTML = addFile(Kind::html, platform::toUTF8(joinedText(leaves.html, _decoder)));
  return ofHTML == Outcome::empty ? outcome : ofHTML;
}

Outcome AttachmentText::addText(TLStringView text, bool whole) {
  if (isBlank(text)) return Outcome::empty;
  if (!_text.empty() && _text.back() != u'\n') _text.push_back(u'\n');
  const TLStringView taken = _budget.take(text);
  _text += taken;
  return whole && taken.size() == text.size() ? Outcome::extracted : Outcome::cut;
}

}  // namespace cli
