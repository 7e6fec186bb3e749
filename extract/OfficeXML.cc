#include "extract/OfficeXML.h"

#include <string>

namespace extract {

namespace {

std::string_view withoutPrefix(std::string_view name) {
  return name.substr(name.rfind(':') + 1);
}

// What an empty element stands for; 0 for nothing.
char characterOf(std::string_view name, bool openDocument) {
  if (name == "tab") return '\t';
  if (openDocument) return name == "s" ? ' ' : name == "line-break" ? '\n' : '\0';
  return name == "br" || name == "cr" ? '\n' : '\0';
}

bool endsLine(std::string_view name, bool openDocument) {
  if (openDocument) return name == "p" || name == "h";
  return name == "p" || name == "si" || name == "is";
}

}  // namespace

OfficeXML::OfficeXML(Kind kind, TextCollector& text)
    : _openDocument(kind == Kind::openDocument), _text(text), _parser(XML_ParserCreate(nullptr)) {
  if (_parser == nullptr) return;
  XML_SetUserData(_parser.get(), this);
  XML_SetElementHandler(
      _parser.get(),
      [](void* self, const XML_Char* name, const XML_Char**) {
        static_cast<OfficeXML*>(self)->opened(withoutPrefix(name));
      },
      [](void* self, const XML_Char* name) {
        static_cast<OfficeXML*>(self)->closed(withoutPrefix(name));
      });
  XML_SetCharacterDataHandler(_parser.get(), [](void* self, const XML_Char* part, int size) {
    auto& xml = *static_cast<OfficeXML*>(self);
    if (xml._textDepth > 0 && xml._skippedDepth == 0) {
      xml._text.append({part, static_cast<size_t>(size)});
    }
  });
  XML_SetEntityDeclHandler(
      _parser.get(),
      [](void* self, const XML_Char*, int, const XML_Char*, int, const XML_Char*, const XML_Char*,
         const XML_Char*, const XML_Char*) { static_cast<OfficeXML*>(self)->stop(); });
}

bool OfficeXML::feed(std::string_view part) {
  return _parser != nullptr && !_text.done() &&
         XML_Parse(_parser.get(), part.data(), static_cast<int>(part.size()), XML_FALSE) ==
             XML_STATUS_OK;
}

bool OfficeXML::end() {
  return _parser != nullptr && XML_Parse(_parser.get(), nullptr, 0, XML_TRUE) == XML_STATUS_OK;
}

bool OfficeXML::isText(std::string_view name) const {
  return _openDocument ? name == "p" || name == "h" : name == "t";
}

bool OfficeXML::isSkipped(std::string_view name) const {
  return _openDocument ? name == "tracked-changes" : name == "rPh";
}

void OfficeXML::opened(std::string_view name) {
  if (++_depth > kMaxDepth) stop();
  if (isText(name)) ++_textDepth;
  if (isSkipped(name)) ++_skippedDepth;
  const char character = characterOf(name, _openDocument);
  const bool inside = !_openDocument || _textDepth > 0;
  if (character != '\0' && inside && _skippedDepth == 0) _text.append({&character, 1});
}

void OfficeXML::closed(std::string_view name) {
  --_depth;
  if (isText(name)) --_textDepth;
  if (isSkipped(name)) --_skippedDepth;
  if (endsLine(name, _openDocument)) _text.endLine();
}

}  // namespace extract
