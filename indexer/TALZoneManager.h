#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/Mutex.h"
#include "records/TLIndexableItem.h"
#include "records/TLParameters.h"

// Knows which attributes are zones, scored fields of the text index, what each is worth, and how a
// new version of a document is folded into the old one. A zone's ID is the number of its attribute
// key.
//
// Threads: any. Scores are a setting of the manager: each search sets all of them at its start, in
// one step, and they stay until the next one does. Of two searches at once the last to start
// decides for both.
class TALZoneManager {
 public:
  // Scores start as the default parameters have them.
  TALZoneManager();

  void setupAttributeScoresWithSearchParams(const TLParameters& params);

  // Null for keys of 0 and below, and for CUSTOM without a zone of its own. Whether the attribute
  // is indexable makes no difference.
  [[nodiscard]] std::optional<int32_t> zoneIDForAttributeKey(
      int32_t key, const std::optional<TLString>& withCustomKey) const;

  // Null for no zone, and for a zone without score.
  [[nodiscard]] std::optional<float> scoreForZoneID(std::optional<int32_t> zoneID) const;

  // A null score takes the zone's score away; for no zone nothing happens.
  void overrideScoreForZoneID(std::optional<int32_t> zoneID, std::optional<float> score);

  // A new item with the attributes of the new version, and behind them those of the old one whose
  // keys the new one does not have. Attributes are shared with both. The flag tells whether the new
  // version brings an indexable attribute, so that the text has to be indexed again. A missing old
  // version has no attributes.
  [[nodiscard]] std::shared_ptr<TLIndexableItem> mergeNewDoc(const TLIndexableItem& newDoc,
                                                             const TLIndexableItem* oldDoc,
                                                             bool* shouldIndexNewDoc) const;

  // The attributes that make up a document's searchable text, in order.
  [[nodiscard]] const std::vector<TLAttributeKey>& indexableEnumKeyAttribs() const {
    return _indexableEnumKeyAttribs;
  }

 private:
  void _overrideScore(std::optional<float> score, TLAttributeKey forAttributeKey,
                      const std::optional<TLString>& withCustomKey) TL_REQUIRES(_mutex);
  void store(std::optional<int32_t> zoneID, std::optional<float> score) TL_REQUIRES(_mutex);

  // Fixed at creation.
  const std::map<TLString, int32_t> _customAttrZoneID;
  const std::shared_ptr<const TLParameters> _searchParams;
  const std::vector<TLAttributeKey> _indexableEnumKeyAttribs;
  const std::set<TLAttributeKey> _indexableEnumKeyAttribsSet;

  mutable platform::Mutex _mutex;
  std::map<int32_t, float> _attrScore TL_GUARDED_BY(_mutex);
};
