#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Charset.h"
#include "platform/Text.h"

// The text of an HTML document, nullopt if it has none: markup is removed, entities are decoded,
// and tags that begin or end a block become line feeds. Accepts any bytes, in time linear in their
// number. `limit`, in UTF-16 units, is checked before a run of text is added, so the last run may
// exceed it. `encoding` is one of platform/Charset.h. Any thread.
//
// `attributes`, unless null, receives the contents of the meta tags in the head if the document has
// a title, and is emptied otherwise. Texts are strings, dates are seconds since 1970, keywords are
// an array of strings.
[[nodiscard]] std::optional<TLString> TALPlainTextFromHTMLData(
    std::optional<std::string_view> data, uint64_t limit, std::optional<nlohmann::json>* attributes,
    uint64_t encoding);

// The state of one scan. One thread.
struct TALHTMLParsing {
  explicit TALHTMLParsing(uint64_t encoding);

  // A new state with the encodings and the limit of this one.
  [[nodiscard]] TALHTMLParsing fresh() const;

  // Appends text in the source encoding. UTF-8 is decoded leniently: continuation bytes are not
  // checked, stray ones are skipped, and a sequence that is cut off ends the text.
  void appendText(std::string_view text);
  // Drops a line feed at the start of the whole text, as appendText does.
  void appendUnichars(TLStringView units);
  void appendNewline() { appendUnichars(u"\n"); }

  // False in the head, scripts and styles.
  [[nodiscard]] bool takesText() const { return !inHead && !inScript && !inStyle; }

  TLString uniChars;  // the text so far; its capacity doubles from 4096
  std::array<char, 8> newLineBuffer{};
  uint64_t newLineLength = 0;
  nlohmann::json attributes;  // null if empty
  std::optional<TLString> metaName;
  std::optional<TLString> metaHttpEquiv;
  std::optional<TLString> metaContent;
  uint64_t sourceEncoding;     // of attribute values; a charset in the head changes it
  uint32_t sourceSysEncoding;  // of the text
  uint64_t indexingLimit = UINT64_MAX;
  const char* titleStart = nullptr;
  uint64_t titleLength = 0;
  bool inHead = false;
  bool inTitle = false;
  bool inScript = false;
  bool inStyle = false;

 private:
  void makeRoom(size_t units);
  void appendUTF8(std::string_view text);

  std::shared_ptr<const platform::Charset> _charset;  // of the text, null for UTF-8
};
