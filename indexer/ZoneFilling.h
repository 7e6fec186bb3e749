#pragma once

#include "indexer/TALZoneManager.h"
#include "indexer/zone.h"
#include "records/TLIndexableItem.h"
#include "tokenizer/Tokenizer.h"

// From the attributes of an item to the zones of the text index.

// Most UTF-16 units of one text that are tokenised; the rest cannot be searched.
inline constexpr size_t kMaximumTokenizedUnits = 2097151;

// Adds the texts of `item` to `zones`, attribute by attribute in order. Without a tokenizer the
// texts that need one are left out.
void populateZones(zone::Zones& zones, const TLIndexableItem& item,
                   const TALZoneManager& zoneManager, const tokenizer::Tokenizer* tokenizer);

// Adds one text to a zone: cleaned word by word, or as it is, to be matched from its start only.
void addToZones(zone::Zones& zones, int32_t zoneNumber, TLStringView text,
                const tokenizer::Tokenizer* tokenizer, bool tokenize);

// The plain text of an HTML body as it is indexed: whole, and read as UTF-8.
[[nodiscard]] std::optional<TLString> plainTextOfHTML(std::string_view html);
