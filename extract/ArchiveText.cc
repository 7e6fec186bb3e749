#include "extract/OfficeXML.h"
#include "extract/TextExtraction.h"
#include "extract/ZipReader.h"

namespace extract {

namespace {

// Office files of before, and encrypted ones, are no zip files; both begin like this.
constexpr std::string_view kCompoundFile = "\xD0\xCF\x11\xE0";

bool isBetween(std::string_view name, std::string_view prefix, std::string_view suffix) {
  return name.starts_with(prefix) && name.ends_with(suffix);
}

// Whether an entry of an office document holds text for its reader.
bool holdsText(Kind kind, std::string_view name) {
  if (kind == Kind::openDocument) return name == "content.xml";
  if (name == "xl/sharedStrings.xml") return true;
  for (const char* prefix :
       {"word/document", "word/header", "word/footer", "word/footnotes", "word/endnotes",
        "word/comments", "xl/worksheets/sheet", "ppt/slides/slide", "ppt/notesSlides/notesSlide"}) {
    if (isBetween(name, prefix, ".xml")) return true;
  }
  return false;
}

// False if the entry was not read to its end.
bool collect(ZipReader& zip, Kind kind, TextCollector& text) {
  OfficeXML xml(kind, text);
  for (std::string_view part = zip.read(); !part.empty(); part = zip.read()) {
    if (!xml.feed(part)) return false;
  }
  return zip.whole() && xml.end();
}

}  // namespace

Extraction textOfOffice(Kind kind, std::string_view bytes, size_t limit) {
  if (bytes.starts_with(kCompoundFile)) return {Outcome::encrypted, {}};
  TextCollector text(limit);
  ZipReader zip(bytes);
  bool whole = true;
  bool found = false;
  while (const auto entry = zip.next()) {
    if (!holdsText(kind, entry->name)) continue;
    if (entry->encrypted) return {Outcome::encrypted, {}};
    found = true;
    whole = collect(zip, kind, text) && whole;
    text.endLine();
    if (text.done()) break;
  }
  return std::move(text).finish(whole && found && zip.whole());
}

Extraction namesInZip(std::string_view bytes, size_t limit) {
  TextCollector text(limit);
  ZipReader zip(bytes);
  while (const auto entry = zip.next()) {
    text.append(entry->name);
    text.endLine();
    if (text.done()) break;
  }
  return std::move(text).finish(zip.whole());
}

}  // namespace extract
