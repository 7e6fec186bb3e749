#include "extract/TextExtraction.h"

#include <algorithm>
#include <clocale>

#include "html/TALHTMLParsing.h"
#include "platform/Text.h"

namespace extract {

namespace {

bool isContinuation(char c) {
  return (static_cast<unsigned char>(c) & 0xC0) == 0x80;
}

Extraction textOfHTML(std::string_view bytes, size_t limit) {
  TextCollector text(limit);
  const auto plain = TALPlainTextFromHTMLData(bytes, limit, nullptr, platform::kEncodingUTF8);
  if (plain) text.append(platform::toUTF8(*plain));
  return std::move(text).finish(true);
}

}  // namespace

void TextCollector::append(std::string_view text) {
  if (_full || text.empty()) return;
  const std::string cleaned =
      platform::isValidUTF8(text) ? std::string() : platform::toUTF8(platform::fromUTF8(text));
  if (!cleaned.empty()) text = cleaned;
  const size_t room = _limit - _text.size();
  size_t size = std::min(room, text.size());
  _full = size < text.size();
  while (_full && size > 0 && isContinuation(text[size])) --size;
  _text.append(text.substr(0, size));
}

void TextCollector::endLine() {
  if (!_text.empty() && _text.back() != '\n') append("\n");
}

Extraction TextCollector::finish(bool whole) && {
  const bool blank = _text.find_first_not_of(" \t\r\n\f\v") == std::string::npos;
  if (blank) return {whole ? Outcome::empty : Outcome::damaged, {}};
  return {whole && !_full ? Outcome::extracted : Outcome::cut, std::move(_text)};
}

Extraction extractText(Kind kind, std::string_view bytes, size_t limit) {
  switch (kind) {
    case Kind::pdf:
      return textOfPDF(bytes, limit);
    case Kind::openDocument:
    case Kind::officeXML:
      return textOfOffice(kind, bytes, limit);
    case Kind::zip:
      return namesInZip(bytes, limit);
    case Kind::html:
      return textOfHTML(bytes, limit);
    case Kind::text:
    case Kind::message:
      break;
  }
  return {Outcome::damaged, {}};
}

void loadLibraries() {
  std::setlocale(LC_CTYPE, "C.UTF-8");  // names in zip files
  loadPDFLibrary();
  (void)namesInZip("PK", kMaxTextBytes);
  (void)textOfHTML("&eacute;", kMaxTextBytes);
}

}  // namespace extract
