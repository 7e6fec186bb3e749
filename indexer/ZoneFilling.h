#pragma once

#include "records/TLIndexableItem.h"
#include "tokenizer/Tokenizer.h"
#include "zones/TALZoneManager.h"
#include "zones/zone.h"

// Fills the zones of the text index from the attributes of an item.

// Upper bound, in UTF-16 units, of the text that is tokenised; the rest of a text is not
// searchable.
inline constexpr size_t kMaxTokenizedUnits = 2097151;

// Adds the texts of `item` to `zones`, attribute by attribute in order. Without a tokenizer, texts
// that need one are skipped.
void populateZones(zone::Zones& zones, const TLIndexableItem& item,
                   const TALZoneManager& zoneManager, const tokenizer::Tokenizer* tokenizer);

// Adds one text to a zone: either cleaned word by word, or unchanged, so that only its beginning
// matches.
void addToZones(zone::Zones& zones, int32_t zoneNumber, TLStringView text,
                const tokenizer::Tokenizer* tokenizer, bool tokenize);

// The plain text of an HTML body as it is indexed: in full, decoded as UTF-8.
[[nodiscard]] std::optional<TLString> plainTextOfHTML(std::string_view html);
