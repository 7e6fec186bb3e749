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

// Knows which attributes are zones (scored fields of the text index) and their scores, and merges a
// new version of a document into the old one. A zone's ID is the number of its attribute key.
//
// Threads: any. Scores belong to the manager: each search sets all of them atomically at its start,
// and they stay until the next search. Of two concurrent searches, the last to start decides for
// both.
class TALZoneManager {
 public:
  // Scores start at the default parameters.
  TALZoneManager();

  void setupAttributeScoresWithSearchParams(const TLParameters& params);

  // Nullopt for keys of 0 and below, and for CUSTOM without its own zone. Does not depend on
  // whether the attribute is indexable.
  [[nodiscard]] std::optional<int32_t> zoneIDForAttributeKey(
      int32_t key, const std::optional<TLString>& withCustomKey) const;

  // Nullopt without a zone, and for a zone without a score.
  [[nodiscard]] std::optional<float> scoreForZoneID(std::optional<int32_t> zoneID) const;

  // Nullopt as the score removes the zone's score; nullopt as the zone does nothing.
  void overrideScoreForZoneID(std::optional<int32_t> zoneID, std::optional<float> score);

  // A new item with the attributes of the new version, followed by those attributes of the old
  // version whose keys the new one lacks. Attributes are shared with both. The flag tells whether
  // the new version has an indexable attribute, so that the text must be indexed again. A missing
  // old version has no attributes.
  [[nodiscard]] std::shared_ptr<TLIndexableItem> mergeNewDoc(const TLIndexableItem& newDoc,
                                                             const TLIndexableItem* oldDoc,
                                                             bool* shouldIndexNewDoc) const;

  // The attributes that form a document's searchable text, in order.
  [[nodiscard]] const std::vector<TLAttributeKey>& indexableEnumKeyAttribs() const {
    return _indexableEnumKeyAttribs;
  }

 private:
  void _overrideScore(std::optional<float> score, TLAttributeKey forAttributeKey,
                      const std::optional<TLString>& withCustomKey) TL_REQUIRES(_mutex);
  void store(std::optional<int32_t> zoneID, std::optional<float> score) TL_REQUIRES(_mutex);

  // Fixed after construction.
  const std::map<TLString, int32_t> _customAttrZoneID;
  const std::shared_ptr<const TLParameters> _searchParams;
  const std::vector<TLAttributeKey> _indexableEnumKeyAttribs;
  const std::set<TLAttributeKey> _indexableEnumKeyAttribsSet;

  mutable platform::Mutex _mutex;
  std::map<int32_t, float> _attrScore TL_GUARDED_BY(_mutex);
};
