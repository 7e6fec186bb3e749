#include "records/ParameterTable.h"

#include <algorithm>
#include <array>
#include <bit>

#include "platform/Text.h"

namespace {

template <typename Value>
constexpr SearchParameterMetadata row(std::string_view key, Value value) {
  return {key, std::variant<const char*, int32_t, float, bool>(std::in_place_type<Value>, value)};
}

constexpr std::array<SearchParameterMetadata, 30> kDefaults{
    row("queryModification.enableSpellModification", true),
    row("queryModification.enableSynonymModificationFirstPass", false),
    row("queryModification.enableSynonymModification", true),
    row("queryModification.enableStemModificationFirstPass", false),
    row("queryModification.enableStemModification", true),
    row("queryModification.sufficentRetrievalThreshold", 0),
    row("ranking.freshnessWeight", 0.0F),
    row("ranking.textScoreWeight", 1.0F),
    row("ranking.rankingLogsItemCap", 10),
    // One million, but as the bit pattern of a float: the effective limit is 1232348160.
    row("salt.maxTermResults", std::bit_cast<int32_t>(1000000.0F)),
    row("salt.maxTopK", 1000),
    row("salt.scoreThreshold", 0.02F),
    row("zoneScore.AccountIdentifier", 1.0F),
    row("zoneScore.AdditionalRecipientEmailAddresses", 0.1F),
    row("zoneScore.AdditionalRecipients", 0.1F),
    row("zoneScore.AuthorEmailAddresses", 0.8F),
    row("zoneScore.Authors", 1.0F),
    row("zoneScore.HiddenAdditionalRecipients", 0.0F),
    row("zoneScore.HiddenRecipientEmailAddresses", 0.0F),
    row("zoneScore.HtmlContent", 0.5F),
    row("zoneScore.MailboxIdentifiers", 1.0F),
    row("zoneScore.Mailboxes", 1.0F),
    row("zoneScore.RecipientEmailAddresses", 0.1F),
    row("zoneScore.Recipients", 0.1F),
    row("zoneScore.RelatedUniqueIdentifier", 1.0F),
    row("zoneScore.Subject", 0.9F),
    row("zoneScore.TextContent", 0.5F),
    row("zoneScore.XFrom", 0.2F),
    row("zoneScore.AttachmentName", 0.2F),
    row("zoneScore.AttachmentType", 0.2F),
};

void setValue(TLParamKeyValue& record, const char* value) {
  record.setStringValue(platform::fromUTF8(value));
}
void setValue(TLParamKeyValue& record, int32_t value) {
  record.setIntValue(value);
}
void setValue(TLParamKeyValue& record, float value) {
  record.setFloatValue(value);
}
void setValue(TLParamKeyValue& record, bool value) {
  record.setBoolValue(value);
}

}  // namespace

std::span<const SearchParameterMetadata> searchParameters() {
  return kDefaults;
}

const SearchParameterMetadata* searchParameter(std::string_view key) {
  const auto found = std::ranges::find(kDefaults, key, &SearchParameterMetadata::key);
  return found == kDefaults.end() ? nullptr : &*found;
}

std::shared_ptr<TLParamKeyValue> defaultRecord(const SearchParameterMetadata& row) {
  auto record = std::make_shared<TLParamKeyValue>();
  record->setKey(platform::fromUTF8(row.key));
  std::visit([&record](auto value) { setValue(*record, value); }, row.value);
  return record;
}
