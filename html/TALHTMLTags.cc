#include <algorithm>
#include <array>
#include <charconv>

#include "html/TALDateFormatterFactory.h"
#include "html/TALHTMLScanBuffer.h"
#include "html/TALHTMLText.h"

namespace {

using htmltext::beginsWith;
using nlohmann::json;

// Builds the value of an attribute from the content of a meta tag; null for none.
using MakeValue = json (*)(const std::string& content);

json textValue(const std::string& content) {
  return content;
}

json versionValue(const std::string& content) {
  const std::string_view digits = htmltext::trim(content);
  double version = 0;
  std::from_chars(digits.data(), digits.data() + digits.size(), version);
  return version > 0 ? json(version) : json();
}

json keywordsValue(const std::string& content) {
  std::string separator;
  for (const char* candidate : {", ", ",", " "}) {
    if (content.find(candidate) == std::string::npos) continue;
    separator = candidate;
    break;
  }
  json keywords = json::array();
  size_t start = 0;
  while (!separator.empty()) {
    const size_t end = content.find(separator, start);
    if (end == std::string::npos) break;
    keywords.push_back(content.substr(start, end - start));
    start = end + separator.size();
  }
  keywords.push_back(content.substr(start));
  return keywords;
}

json dateValue(const std::string& content) {
  static const auto kFormatters = TALDateFormatterFactory::newDateTimeFormatters();
  const TLString text = platform::fromUTF8(content);
  for (const auto& formatter : kFormatters) {
    if (const auto date = formatter->dateFromString(text)) return *date;
  }
  return {};
}

json noIndexValue(const std::string& content) {
  return htmltext::find(content, "noindex") != std::string_view::npos ? json(1) : json();
}

struct MetaRow {
  std::string_view name;  // in lower case
  const char* key;
  MakeValue makeValue;
};

constexpr std::array kMetaRows = std::to_array<MetaRow>({
    {"mochaversion", "MochaRTFVersion", versionValue},
    {"generator", "SysGeneratorDocumentAttribute", textValue},
    {"keywords", "SysKeywordsDocumentAttribute", keywordsValue},
    {"author", "SysAuthorDocumentAttribute", textValue},
    {"lastauthor", "SysEditorDocumentAttribute", textValue},
    {"company", "SysCompanyDocumentAttribute", textValue},
    {"copyright", "SysCopyrightDocumentAttribute", textValue},
    {"subject", "SysSubjectDocumentAttribute", textValue},
    {"description", "SysCommentDocumentAttribute", textValue},
    {"comment", "SysCommentDocumentAttribute", textValue},
    {"creationtime", "SysCreationTimeDocumentAttribute", dateValue},
    {"modificationtime", "SysModificationTimeDocumentAttribute", dateValue},
    {"displayname", "SysDisplayNameDocumentAttribute", textValue},
    {"indextitle", "SysDisplayNameDocumentAttribute", textValue},
    {"robots", "SysNoIndexDocumentAttribute", noIndexValue},
});

void setNamedAttribute(const std::string& name, const std::string& content, json& attributes) {
  for (const MetaRow& row : kMetaRows) {
    if (!htmltext::equals(name, row.name)) continue;
    if (content.empty()) return;
    json value = row.makeValue(content);
    if (!value.is_null()) attributes[row.key] = std::move(value);
    return;
  }
}

// Sets the character set from "text/html; charset=NAME". It does not affect how the text is
// decoded.
void setCharset(const std::string& content, TALHTMLParsing& parsing) {
  constexpr std::string_view kCharset = "charset";
  const size_t found = htmltext::find(content, kCharset);
  if (found == std::string_view::npos) return;
  std::string_view rest = std::string_view(content).substr(found + kCharset.size());
  rest.remove_prefix(std::min(rest.find_first_not_of(" =\"'"), rest.size()));
  rest = htmltext::trim(rest.substr(0, rest.find_first_of("\"'")));
  if (const auto encoding = platform::encodingForIANAName(rest)) parsing.sourceEncoding = *encoding;
}

void processMeta(TALHTMLParsing& parsing) {
  if (!parsing.metaContent) return;
  const std::string content = platform::toUTF8(*parsing.metaContent);
  if (parsing.metaName) {
    setNamedAttribute(platform::toUTF8(*parsing.metaName), content, parsing.attributes);
  } else if (parsing.metaHttpEquiv &&
             htmltext::equals(platform::toUTF8(*parsing.metaHttpEquiv), "content-type")) {
    setCharset(content, parsing);
  }
}

bool beginsBlock(std::string_view name, size_t length) {
  if (length >= 4 && beginsWith(name, "div")) return true;
  if (beginsWith(name, "p")) return true;
  return length >= 3 && (beginsWith(name, "br") || beginsWith(name, "dt") ||
                         beginsWith(name, "dd") || beginsWith(name, "li"));
}

bool endsBlock(std::string_view name, size_t length) {
  if (beginsWith(name, "p")) return true;
  if (beginsWith(name, "h") && name.size() > 1 && name[1] >= '1' && name[1] <= '6') return true;
  return length >= 4 &&
         (beginsWith(name, "dt") || beginsWith(name, "td") || beginsWith(name, "li"));
}

void endTitle(std::string_view tag, TALHTMLParsing& parsing) {
  if (parsing.inTitle && tag.data() > parsing.titleStart) {
    parsing.titleLength = static_cast<uint64_t>(tag.data() - parsing.titleStart);
  }
  parsing.inTitle = false;
}

void startTagInHead(std::string_view tag, TALHTMLParsing& parsing) {
  const std::string_view name = tag.substr(1);
  if (tag.size() < 5) return;
  if (beginsWith(name, "titl")) {
    parsing.inTitle = true;
    parsing.titleStart = tag.data() + tag.size();
    parsing.titleLength = 0;
  } else if (beginsWith(name, "meta")) {
    processMeta(parsing);
  }
}

// The value decoded from its encoding; nullopt if it is invalid.
std::optional<TLString> decodedValue(std::string_view value, uint64_t encoding) {
  if (encoding == platform::kEncodingUTF8) {
    if (!platform::isValidUTF8(value)) return std::nullopt;
    return platform::fromUTF8(value);
  }
  TLString decoded;
  if (!platform::Charset(encoding).decode(value, decoded)) return std::nullopt;
  return decoded;
}

std::optional<TLString> contentText(std::string_view value, const TALHTMLParsing& parsing) {
  TALHTMLParsing content = parsing.fresh();
  TALHTMLScanBuffer(value, nullptr, nullptr, nullptr, content);
  if (content.uniChars.empty()) return std::nullopt;
  return std::move(content.uniChars);
}

}  // namespace

void TALHTMLStartTag(std::string_view tag, TALHTMLParsing& parsing) {
  const std::string_view name = tag.substr(1);
  if (tag.size() >= 7 && beginsWith(name, "script")) {
    parsing.inScript = true;
    return;
  }
  if (tag.size() >= 6 && beginsWith(name, "style")) {
    parsing.inStyle = true;
    return;
  }
  if (parsing.inHead) {
    startTagInHead(tag, parsing);
  } else if (tag.size() >= 5 && beginsWith(name, "head")) {
    parsing.inHead = true;
  } else if (beginsBlock(name, tag.size())) {
    parsing.appendNewline();
  }
  parsing.metaName.reset();
  parsing.metaHttpEquiv.reset();
  parsing.metaContent.reset();
}

void TALHTMLEndTag(std::string_view tag, TALHTMLParsing& parsing) {
  const std::string_view name = tag.substr(2);
  if (tag.size() >= 8 && beginsWith(name, "script")) {
    parsing.inScript = false;
  } else if (tag.size() >= 7 && beginsWith(name, "style")) {
    parsing.inStyle = false;
  } else if (!parsing.inHead) {
    if (endsBlock(name, tag.size())) parsing.appendNewline();
  } else if (tag.size() >= 6 && beginsWith(name, "titl")) {
    endTitle(tag, parsing);
  } else if (tag.size() >= 6 && beginsWith(name, "head")) {
    endTitle(tag, parsing);
    parsing.inHead = false;
  }
}

void TALHTMLAttribute(std::string_view name, std::string_view value, TALHTMLParsing& parsing) {
  if (value.empty()) return;
  if (htmltext::equals(name, "http-equiv")) {
    parsing.metaHttpEquiv = decodedValue(value, parsing.sourceEncoding);
  } else if (htmltext::equals(name, "name")) {
    parsing.metaName = decodedValue(value, parsing.sourceEncoding);
  } else if (htmltext::equals(name, "content")) {
    parsing.metaContent = contentText(value, parsing);
  }
}
