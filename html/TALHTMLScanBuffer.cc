#include "html/TALHTMLScanBuffer.h"

#include <algorithm>
#include <cstdlib>
#include <string>

#include "html/TALHTMLEntities.h"
#include "html/TALHTMLText.h"
#include "platform/Assert.h"

namespace {

using htmltext::isWhiteSpace;

constexpr std::string_view kCDATA = "<![CDATA[";
constexpr std::string_view kCDATAEnd = "]]>";
constexpr std::string_view kCommentEnd = "-->";

// A cursor over the bytes that only moves forward.
class Scanner {
 public:
  Scanner(std::string_view bytes, TALHTMLTagCallback startTag, TALHTMLTagCallback endTag,
          TALHTMLAttributeCallback attribute, TALHTMLParsing& parsing)
      : _bytes(bytes),
        _startTag(startTag),
        _endTag(endTag),
        _attribute(attribute),
        _parsing(parsing) {}

  void run() {
    for (;;) {
      const size_t start = _at;
      takeUntil([](char c) { return c == '<' || c == '&'; });
      appendFrom(start);
      if (atEnd()) return;
      if (current() == '&') {
        scanEntity();
      } else {
        scanMarkup();
      }
    }
  }

 private:
  [[nodiscard]] bool atEnd() const { return _at >= _bytes.size(); }
  [[nodiscard]] char current() const { return _bytes[_at]; }

  void skipWhiteSpace() {
    while (!atEnd() && isWhiteSpace(current())) ++_at;
  }

  // Advances to the first byte that stops, or to the end.
  template <typename Stops>
  std::string_view takeUntil(Stops stops) {
    const size_t start = _at;
    while (!atEnd() && !stops(current())) ++_at;
    return _bytes.substr(start, _at - start);
  }

  void appendFrom(size_t start) {
    if (_at > start && _parsing.takesText()) {
      _parsing.appendText(_bytes.substr(start, _at - start));
    }
  }

  void scanEntity() {
    const size_t start = _at;
    takeUntil([](char c) { return c == ';' || isWhiteSpace(c); });
    if (!atEnd() && current() == ';') ++_at;
    TALHTMLDecodeEntity(_bytes.substr(start, _at - start), _parsing);
  }

  void scanMarkup() {
    const size_t start = _at++;
    const char next = atEnd() ? '\0' : current();
    if (next == '/') {
      ++_at;
      scanTag(start, _endTag);
    } else if (next == '?') {
      ++_at;
      scanTag(start, nullptr);
    } else if (next == '!') {
      scanDeclaration(start);
    } else {
      scanTag(start, _startTag);
    }
  }

  void scanDeclaration(size_t start) {
    const std::string_view rest = _bytes.substr(start);
    if (rest.substr(0, kCDATA.size()) == kCDATA &&
        rest.size() >= kCDATA.size() + kCDATAEnd.size()) {
      // The ">" of the terminator is kept and becomes text.
      const size_t end = _bytes.find(kCDATAEnd, start + kCDATA.size());
      _at = end == std::string_view::npos ? _bytes.size() : end + kCDATAEnd.size() - 1;
    } else if (rest.substr(0, 4) == "<!--") {
      // The dashes that open a comment may also close it: "<!-->" is an empty one.
      const size_t end = _bytes.find(kCommentEnd, start + 2);
      _at = end == std::string_view::npos ? _bytes.size() : end + kCommentEnd.size();
    } else {
      takeUntil([](char c) { return c == '>'; });
      scanTag(start, nullptr);
    }
  }

  // Scans a tag from its name on. If it is no tag after all, it becomes text.
  void scanTag(size_t start, TALHTMLTagCallback callback) {
    takeUntil([](char c) { return c == '>' || isWhiteSpace(c); });
    while (!atEnd() && current() != '/' && current() != '>') scanAttribute();
    while (!atEnd() && (isWhiteSpace(current()) || current() == '/')) ++_at;
    if (!atEnd() && current() == '?') {
      ++_at;
      callback = nullptr;
    }
    if (atEnd() || current() != '>') return appendFrom(start);
    ++_at;
    if (callback != nullptr) callback(_bytes.substr(start, _at - start), _parsing);
  }

  void scanAttribute() {
    skipWhiteSpace();
    std::string_view name = takeUntil([](char c) { return c == '=' || c == '>'; });
    while (!name.empty() && isWhiteSpace(name.back())) name.remove_suffix(1);
    std::string_view value;
    if (!atEnd() && current() == '=') {
      ++_at;
      skipWhiteSpace();
      value = scanValue();
    }
    if (_attribute != nullptr) _attribute(name, value, _parsing);
  }

  // A ">" ends a value even inside quotes.
  std::string_view scanValue() {
    if (atEnd()) return {};
    const char quote = current();
    if (quote != '"' && quote != '\'') {
      return takeUntil([](char c) { return c == ' ' || c == '>'; });
    }
    ++_at;
    const std::string_view value = takeUntil([quote](char c) { return c == quote || c == '>'; });
    for (int closing = 0; closing < 2 && !atEnd() && current() == quote; ++closing) ++_at;
    return value;
  }

  const std::string_view _bytes;
  const TALHTMLTagCallback _startTag;
  const TALHTMLTagCallback _endTag;
  const TALHTMLAttributeCallback _attribute;
  TALHTMLParsing& _parsing;
  size_t _at = 0;
};

constexpr size_t kMaxDigits = 15;
constexpr long kMaxCode = 0xFFFF;

// The code of "#65" or "#x41", given without its "#"; 0 for none. The number ends at the first
// non-digit.
long numericCode(std::string_view number) {
  int base = 10;
  if (!number.empty() && htmltext::lower(number.front()) == 'x') {
    base = 16;
    number.remove_prefix(1);
  }
  const std::string digits(number.substr(0, kMaxDigits));
  return std::clamp(std::strtol(digits.c_str(), nullptr, base), 0L, kMaxCode);
}

long entityCode(std::string_view name) {
  if (name == "quot" || name == "QUOT") return '"';
  if (name == "amp" || name == "AMP") return '&';
  if (name == "lt" || name == "LT") return '<';
  if (name == "gt" || name == "GT") return '>';
  const long code = !name.empty() && name.front() == '#' ? numericCode(name.substr(1)) : 0;
  return code != 0 ? code : TALHTMLEntityCode(name);
}

}  // namespace

void TALHTMLScanBuffer(std::string_view bytes, TALHTMLTagCallback startTag,
                       TALHTMLTagCallback endTag, TALHTMLAttributeCallback attribute,
                       TALHTMLParsing& parsing) {
  Scanner(bytes, startTag, endTag, attribute, parsing).run();
}

void TALHTMLDecodeEntity(std::string_view entity, TALHTMLParsing& parsing) {
  TL_ASSERT(!entity.empty());
  if (!parsing.takesText()) return;
  std::string_view name = entity.substr(1);
  if (!name.empty() && name.back() == ';') name.remove_suffix(1);
  const long code = entityCode(name);
  if (code == 0) return;
  const auto unit = static_cast<char16_t>(code);
  parsing.appendUnichars({&unit, 1});
}
