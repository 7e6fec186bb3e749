#include "indexer/ZoneFilling.h"

#include <array>

#include "html/TALHTMLParsing.h"

namespace {

// The value of an attribute that goes into its zone.
enum class Source { string, strings, html, persons };

struct Row {
  TLAttributeKey key;
  Source source;
  bool tokenize;
  TLAttributeKey emailZone = TLAttributeKey::UNKNOWN;  // for persons: the zone of their addresses
};

using enum TLAttributeKey;
constexpr std::array<Row, 16> kRows{{
    {SUBJECT, Source::string, true},
    {X_FROM, Source::string, true},
    {TEXT_CONTENT, Source::string, true},
    {CONTENT_TYPE, Source::string, false},
    {ACCOUNT_IDENTIFIER, Source::string, false},
    {RELATED_UNIQUE_IDENTIFIER, Source::string, false},
    {ACCOUNT_HANDLES, Source::strings, false},
    {MAILBOXES, Source::strings, false},
    {MAILBOX_IDENTIFIERS, Source::strings, false},
    {ATTACHMENT_TYPES, Source::strings, true},
    {ATTACHMENT_NAMES, Source::strings, true},
    {HTML_CONTENT_DATA, Source::html, true},
    {AUTHORS, Source::persons, true, AUTHOR_EMAIL_ADDRESSES},
    {RECIPIENTS, Source::persons, true, RECIPIENT_EMAIL_ADDRESSES},
    {ADDITIONAL_RECIPIENTS, Source::persons, true, ADDITIONAL_RECIPIENT_EMAIL_ADDRESSES},
    {HIDDEN_ADDITIONAL_RECIPIENTS, Source::persons, true, HIDDEN_RECIPIENT_EMAIL_ADDRESSES},
}};

const Row* rowForKey(TLAttributeKey key) {
  for (const Row& row : kRows) {
    if (row.key == key) return &row;
  }
  return nullptr;
}

void addHTML(zone::Zones& zones, int32_t zone, const TLAttribute& attribute,
             const tokenizer::Tokenizer* tokenizer) {
  if (attribute.hasStringValue() && !attribute.stringValue()->empty()) {
    addToZones(zones, zone, *attribute.stringValue(), tokenizer, true);
  } else if (attribute.hasBytesValue()) {
    const auto text = plainTextOfHTML(*attribute.bytesValue());
    addToZones(zones, zone, platform::orEmpty(text), tokenizer, true);
  }
}

}  // namespace

void populateZones(zone::Zones& zones, const TLIndexableItem& item,
                   const TALZoneManager& zoneManager, const tokenizer::Tokenizer* tokenizer) {
  for (const auto& attribute : item.attributes()) {
    const auto zone = zoneManager.zoneIDForAttributeKey(static_cast<int32_t>(attribute->key()),
                                                        attribute->customKey());
    const Row* row = rowForKey(attribute->key());
    if (!zone || row == nullptr) continue;
    switch (row->source) {
      case Source::string:
        addToZones(zones, *zone, platform::orEmpty(attribute->stringValue()), tokenizer,
                   row->tokenize);
        break;
      case Source::strings:
        for (const TLString& text : attribute->stringValues()) {
          addToZones(zones, *zone, text, tokenizer, row->tokenize);
        }
        break;
      case Source::html:
        addHTML(zones, *zone, *attribute, tokenizer);
        break;
      case Source::persons:
        for (const auto& person : attribute->personValues()) {
          addToZones(zones, *zone, platform::orEmpty(person->name()), tokenizer, true);
          addToZones(zones, static_cast<int32_t>(row->emailZone),
                     platform::orEmpty(person->emailAddress()), tokenizer, true);
        }
        break;
    }
  }
}

void addToZones(zone::Zones& zones, int32_t zoneNumber, TLStringView text,
                const tokenizer::Tokenizer* tokenizer, bool tokenize) {
  if (text.empty()) return;
  zone::Zone& zone = zones.GetZone(static_cast<uint16_t>(zoneNumber));
  if (!tokenize) {
    zone.AddTextAsIs(platform::toUTF8(text));
  } else if (tokenizer != nullptr) {
    zone.AddText(text.substr(0, kMaxTokenizedUnits), *tokenizer);
  }
}

std::optional<TLString> plainTextOfHTML(std::string_view html) {
  constexpr uint64_t kNoLimit = 2147483647;
  return TALPlainTextFromHTMLData(html, kNoLimit, nullptr, platform::kEncodingUTF8);
}
