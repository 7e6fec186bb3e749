#include "zones/TALZoneManager.h"

#include <algorithm>
#include <array>
#include <string_view>

#include "parameters/TLParamsManager.h"

namespace {

struct ZoneRow {
  TLAttributeKey key;
  std::string_view parameter;  // with the score; empty for none
};

using enum TLAttributeKey;

constexpr std::array kZoneRows = std::to_array<ZoneRow>({
    {SUBJECT, "zoneScore.Subject"},
    {TEXT_CONTENT, "zoneScore.TextContent"},
    {HTML_CONTENT_DATA, "zoneScore.HtmlContent"},
    {AUTHORS, "zoneScore.Authors"},
    {RECIPIENTS, "zoneScore.Recipients"},
    {ADDITIONAL_RECIPIENTS, "zoneScore.AdditionalRecipients"},
    {HIDDEN_ADDITIONAL_RECIPIENTS, "zoneScore.HiddenAdditionalRecipients"},
    {AUTHOR_EMAIL_ADDRESSES, "zoneScore.AuthorEmailAddresses"},
    {RECIPIENT_EMAIL_ADDRESSES, "zoneScore.RecipientEmailAddresses"},
    {ADDITIONAL_RECIPIENT_EMAIL_ADDRESSES, "zoneScore.AdditionalRecipientEmailAddresses"},
    {HIDDEN_RECIPIENT_EMAIL_ADDRESSES, "zoneScore.HiddenRecipientEmailAddresses"},
    {CONTENT_TYPE, ""},
    {MAILBOXES, "zoneScore.Mailboxes"},
    {MAILBOX_IDENTIFIERS, "zoneScore.MailboxIdentifiers"},
    {ACCOUNT_IDENTIFIER, "zoneScore.AccountIdentifier"},
    {RELATED_UNIQUE_IDENTIFIER, "zoneScore.RelatedUniqueIdentifier"},
    {X_FROM, "zoneScore.XFrom"},
    {ATTACHMENT_NAMES, "zoneScore.AttachmentName"},
    {ATTACHMENT_TYPES, "zoneScore.AttachmentType"},
});

std::vector<TLAttributeKey> zoneKeys() {
  std::vector<TLAttributeKey> keys;
  for (const ZoneRow& row : kZoneRows) keys.push_back(row.key);
  return keys;
}

// The keys for which a document has attributes.
struct AttributeKeys {
  explicit AttributeKeys(const TLIndexableItem& item) {
    for (const auto& attribute : item.attributes()) {
      keys.insert(attribute->key());
      if (attribute->key() == CUSTOM && attribute->customKey()) {
        customKeys.insert(*attribute->customKey());
      }
    }
  }

  [[nodiscard]] bool has(const TLAttribute& attribute) const {
    if (attribute.key() != CUSTOM) return keys.count(attribute.key()) != 0;
    return attribute.customKey() && customKeys.count(*attribute.customKey()) != 0;
  }

  std::set<TLAttributeKey> keys;
  std::set<TLString> customKeys;
};

}  // namespace

TALZoneManager::TALZoneManager()
    : _searchParams(TLParamsManager::getDefaultSearchParamsWithCaching(true)),
      _indexableEnumKeyAttribs(zoneKeys()),
      _indexableEnumKeyAttribsSet(_indexableEnumKeyAttribs.begin(),
                                  _indexableEnumKeyAttribs.end()) {
  setupAttributeScoresWithSearchParams(*_searchParams);
}

void TALZoneManager::setupAttributeScoresWithSearchParams(const TLParameters& params) {
  std::array<std::optional<float>, kZoneRows.size()> scores;
  for (size_t i = 0; i < kZoneRows.size(); ++i) {
    if (!kZoneRows[i].parameter.empty()) {
      scores[i] = params.floatValueForKey(kZoneRows[i].parameter);
    }
  }
  platform::MutexLock lock(_mutex);
  for (size_t i = 0; i < kZoneRows.size(); ++i) {
    if (!kZoneRows[i].parameter.empty()) {
      _overrideScore(scores[i], kZoneRows[i].key, std::nullopt);
    }
  }
}

std::optional<int32_t> TALZoneManager::zoneIDForAttributeKey(
    int32_t key, const std::optional<TLString>& withCustomKey) const {
  if (key <= 0) return std::nullopt;
  if (key != static_cast<int32_t>(CUSTOM)) return key;
  if (!withCustomKey || withCustomKey->empty()) return std::nullopt;
  const auto found = _customAttrZoneID.find(*withCustomKey);
  if (found == _customAttrZoneID.end()) return std::nullopt;
  return found->second;
}

std::optional<float> TALZoneManager::scoreForZoneID(std::optional<int32_t> zoneID) const {
  if (!zoneID) return std::nullopt;
  platform::MutexLock lock(_mutex);
  const auto found = _attrScore.find(*zoneID);
  if (found == _attrScore.end()) return std::nullopt;
  return found->second;
}

void TALZoneManager::overrideScoreForZoneID(std::optional<int32_t> zoneID,
                                            std::optional<float> score) {
  platform::MutexLock lock(_mutex);
  store(zoneID, score);
}

void TALZoneManager::_overrideScore(std::optional<float> score, TLAttributeKey forAttributeKey,
                                    const std::optional<TLString>& withCustomKey) {
  store(zoneIDForAttributeKey(static_cast<int32_t>(forAttributeKey), withCustomKey), score);
}

void TALZoneManager::store(std::optional<int32_t> zoneID, std::optional<float> score) {
  if (!zoneID) return;
  if (score) {
    _attrScore.insert_or_assign(*zoneID, *score);
  } else {
    _attrScore.erase(*zoneID);
  }
}

std::shared_ptr<TLIndexableItem> TALZoneManager::mergeNewDoc(const TLIndexableItem& newDoc,
                                                             const TLIndexableItem* oldDoc,
                                                             bool* shouldIndexNewDoc) const {
  const AttributeKeys brought(newDoc);
  auto merged = std::make_shared<TLIndexableItem>();
  newDoc.copyTo(*merged);
  if (oldDoc != nullptr) {
    for (const auto& attribute : oldDoc->attributes()) {
      if (!brought.has(*attribute)) merged->addAttributes(attribute);
    }
  }
  *shouldIndexNewDoc = std::any_of(
      brought.keys.begin(), brought.keys.end(),
      [this](TLAttributeKey key) { return _indexableEnumKeyAttribsSet.count(key) != 0; });
  return merged;
}
