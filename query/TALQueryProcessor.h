#pragma once

#include <array>
#include <memory>
#include <string>
#include <vector>

#include "indexer/TALZoneManager.h"
#include "modification/TALSynonyms.h"
#include "platform/Log.h"
#include "query/TALTerm.h"
#include "records/TLQuery.h"
#include "tokenizer/Tokenizer.h"

// Turns a query into the flat list of scored terms that the text index evaluates; the shape of
// ranking is decided here.
//
// A document's text score is the product over all terms: a matched document gets the token score
// times the weights of the zones, any other `scoreNoMatch`. A whole phrase is worth more than a
// pair of neighbouring words, a pair more than words far apart; every word is required, and
// conditions on attributes are hard restrictions.
//
// Threads: holds no state of a query and may be called from any thread, at once. Zone weights are
// those that the zone manager has at the time.
class TALQueryProcessor {
 public:
  // Null, with a line in the log, when there is no tokenizer for the best locale. The zone manager
  // and the synonyms, which may be null, must outlive the processor.
  [[nodiscard]] static std::unique_ptr<TALQueryProcessor> initWithZoneManager(
      const TALZoneManager& zoneManager, const TALSynonyms* synonymModel);

  // The terms of the free text (`originalQuery`), then those of the condition tree (`root`). Empty
  // for a query that asks for nothing.
  [[nodiscard]] std::vector<TALTerm> termsFromQuery(const TLQuery& query) const;

  // The attribute keys that free text is searched in, in order.
  [[nodiscard]] static const std::array<TLAttributeKey, 14>& queryTermEnumKeyAttribs();

  static const platform::Log& log();

 private:
  TALQueryProcessor(std::unique_ptr<tokenizer::Tokenizer> tokenizer,
                    const TALZoneManager& zoneManager, const TALSynonyms* synonymModel)
      : _tokenizer(std::move(tokenizer)), _zoneManager(zoneManager), _synonymModel(synonymModel) {}

  struct Zones {
    std::vector<int32_t> ids;
    std::vector<double> scores;
  };
  struct TokenList {
    std::vector<TLString> tokens;
    std::vector<double> scores;
  };

  [[nodiscard]] std::vector<TALTerm> _processQueryString(TLStringView queryString,
                                                         const TLParameters* searchParams) const;
  // The word itself and, where the parameters ask for them, its synonyms and its stem, which always
  // is a prefix, each at less worth.
  [[nodiscard]] TokenList wordTokens(const TLString& word, bool wholeWord,
                                     const TLParameters* searchParams) const;
  void _processQueryNode(const TLQueryNode* node, std::vector<TALTerm>& terms) const;
  void _stringRestrictTermsFromLeafNode(const TLQueryNode& node, TLQueryNodeOp op,
                                        std::vector<TALTerm>& terms) const;
  void _restrictTermFromOrNode(const TLQueryNode& node, std::vector<TALTerm>& terms) const;
  [[nodiscard]] TLString _extractStringFrom(const TLQueryNode& node) const;
  [[nodiscard]] static bool _needsTokenization(const TLQueryNode& node);
  void _zoneWeightsWithKey(TLAttributeKey key, Zones& zones) const;
  void _assignWeightsWithKey(TLAttributeKey key, double weight, Zones& zones) const;

  const std::unique_ptr<tokenizer::Tokenizer> _tokenizer;
  const TALZoneManager& _zoneManager;
  const TALSynonyms* const _synonymModel;
};
