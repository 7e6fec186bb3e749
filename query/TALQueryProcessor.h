#pragma once

#include <array>
#include <memory>
#include <string>
#include <vector>

#include "modification/TALSynonyms.h"
#include "platform/Log.h"
#include "query/TALTerm.h"
#include "records/TLQuery.h"
#include "tokenizer/Tokenizer.h"
#include "zones/TALZoneManager.h"

// Turns a query into the flat list of scored terms that the text index evaluates; this determines
// the ranking.
//
// The text score of a document is the product over all terms: a document that matches a term gets
// the token score times the weights of the zones, any other gets `scoreNoMatch`. A match of the
// whole phrase scores more than a pair of neighbouring words, and a pair more than separate words.
// Every word is required, and conditions on attributes are strict filters.
//
// Threads: has no per-query state; any number of threads may call it at once. Zone weights are the
// current ones of the zone manager.
class TALQueryProcessor {
 public:
  // Null, with a log line, if there is no tokenizer for the best locale. The zone manager and the
  // synonyms (which may be null) must outlive the processor.
  [[nodiscard]] static std::unique_ptr<TALQueryProcessor> initWithZoneManager(
      const TALZoneManager& zoneManager, const TALSynonyms* synonymModel);

  // The terms of the free text (`originalQuery`), then those of the condition tree (`root`). Empty
  // for an empty query.
  [[nodiscard]] std::vector<TALTerm> termsFromQuery(const TLQuery& query) const;

  // The attribute keys that a search for free text looks in, in order.
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
  // The word itself and, if the parameters request them, its synonyms and its stem (always a
  // prefix), each with a lower score.
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
