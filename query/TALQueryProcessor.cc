#include "query/TALQueryProcessor.h"

#include <algorithm>
#include <unordered_set>
#include <utility>

#include "modification/Stemmer.h"
#include "tokenizer/TLLexemonAssetManager.h"

namespace {

constexpr double kDefaultZoneScore = 0.0;  // for a zone without a score

// Scores of a matching and of a non-matching document, by kind of term.
struct TermWorth {
  double score;
  double noMatch;
};
constexpr TermWorth kPhrase{5.0, 1.0};    // a pure bonus
constexpr TermWorth kWordPair{2.0, 0.8};  // no match costs a small penalty
constexpr TermWorth kWord{1.0, 0.0};      // required
constexpr TermWorth kEqual{1.0, 0.0};     // required
constexpr TermWorth kNotEqual{0.0, 1.0};  // forbidden
constexpr size_t kWordsOfAPhrase = 3;
constexpr double kStemScore = 0.05;

TLString joinWords(const std::vector<TLString>& words) {
  TLString text;
  for (const TLString& word : words) {
    if (!text.empty()) text += u' ';
    text += word;
  }
  return text;
}

bool isOn(const TLParameters* searchParams, std::string_view key) {
  return searchParams != nullptr && searchParams->boolValueForKey(key);
}

TLAttributeKey keyAt(const TLQueryNode& node, size_t index) {
  return static_cast<TLAttributeKey>(node.keys()[index]);
}

}  // namespace

const platform::Log& TALQueryProcessor::log() {
  static const platform::Log handle(platform::kSubsystem, "TALQueryProcessor");
  return handle;
}

const std::array<TLAttributeKey, 14>& TALQueryProcessor::queryTermEnumKeyAttribs() {
  using enum TLAttributeKey;
  static constexpr std::array<TLAttributeKey, 14> keys{SUBJECT,
                                                       TEXT_CONTENT,
                                                       HTML_CONTENT_DATA,
                                                       AUTHORS,
                                                       RECIPIENTS,
                                                       ADDITIONAL_RECIPIENTS,
                                                       HIDDEN_ADDITIONAL_RECIPIENTS,
                                                       AUTHOR_EMAIL_ADDRESSES,
                                                       RECIPIENT_EMAIL_ADDRESSES,
                                                       ADDITIONAL_RECIPIENT_EMAIL_ADDRESSES,
                                                       HIDDEN_RECIPIENT_EMAIL_ADDRESSES,
                                                       X_FROM,
                                                       ATTACHMENT_NAMES,
                                                       ATTACHMENT_TYPES};
  return keys;
}

std::unique_ptr<TALQueryProcessor> TALQueryProcessor::initWithZoneManager(
    const TALZoneManager& zoneManager, const TALSynonyms* synonymModel) {
  const std::string& locale = bestLexemonLocale();
  log().info("Creating Lexemon tokenizer for locale: {}", locale);
  auto tokenizer = tokenizer::NewFastLexemonTokenizer(locale);
  if (tokenizer == nullptr) {
    log().error("Failed to create lexemon tokenizer for locale: {}", locale);
    return nullptr;
  }
  return std::unique_ptr<TALQueryProcessor>(
      new TALQueryProcessor(std::move(tokenizer), zoneManager, synonymModel));
}

std::vector<TALTerm> TALQueryProcessor::termsFromQuery(const TLQuery& query) const {
  std::vector<TALTerm> terms =
      _processQueryString(platform::orEmpty(query.originalQuery()), query.searchParams().get());
  _processQueryNode(query.root().get(), terms);
  return terms;
}

std::vector<TALTerm> TALQueryProcessor::_processQueryString(
    TLStringView queryString, const TLParameters* searchParams) const {
  std::vector<TALTerm> terms;
  if (queryString.empty()) return terms;
  Zones zones;
  for (const TLAttributeKey key : queryTermEnumKeyAttribs()) _zoneWeightsWithKey(key, zones);
  std::vector<TLString> words;
  _tokenizer->TokenizeToList(queryString, words);
  if (words.empty()) return terms;

  const bool trailing = hasTrailingSpecialChar(queryString);
  const size_t last = words.size() - 1;
  const auto append = [&](TLString token, TermWorth worth, bool wholeWord) {
    if (wholeWord) token += u' ';
    terms.emplace_back(std::vector<TLString>{std::move(token)}, std::vector<double>{worth.score},
                       worth.noMatch, zones.ids, zones.scores, false);
  };
  terms.reserve(2 * words.size());
  if (words.size() >= kWordsOfAPhrase) append(joinWords(words), kPhrase, trailing);
  for (size_t i = 1; i <= last; ++i) {
    append(words[i - 1] + u' ' + words[i], kWordPair, i != last || trailing);
  }
  for (size_t i = 0; i <= last; ++i) {
    TokenList list = wordTokens(words[i], i != last || trailing, searchParams);
    terms.emplace_back(std::move(list.tokens), std::move(list.scores), kWord.noMatch, zones.ids,
                       zones.scores, true);
  }
  return terms;
}

TALQueryProcessor::TokenList TALQueryProcessor::wordTokens(const TLString& word, bool wholeWord,
                                                           const TLParameters* searchParams) const {
  TokenList list;
  const auto append = [&list](TLString token, double score, bool whole) {
    if (whole) token += u' ';
    list.tokens.push_back(std::move(token));
    list.scores.push_back(score);
  };
  append(word, kWord.score, wholeWord);
  if (_synonymModel != nullptr &&
      isOn(searchParams, "queryModification.enableSynonymModificationFirstPass")) {
    for (const auto& [synonym, score] : _synonymModel->getSynonymsScores(platform::toUTF8(word))) {
      if (score > 0) append(platform::fromUTF8(synonym), score, wholeWord);
    }
  }
  if (isOn(searchParams, "queryModification.enableStemModificationFirstPass")) {
    TLString stem = platform::fromUTF8(TALStemWord(platform::toUTF8(word), kMaxStemmedBytes));
    if (stem != word &&
        std::find(list.tokens.begin(), list.tokens.end(), stem) == list.tokens.end()) {
      append(std::move(stem), kStemScore, false);
    }
  }
  return list;
}

// Traverses the tree with its own stack, in leaf order: AND nodes are flattened.
void TALQueryProcessor::_processQueryNode(const TLQueryNode* root,
                                          std::vector<TALTerm>& terms) const {
  if (root == nullptr) {
    log().standard("Query tree node is empty.");
    return;
  }
  std::vector<const TLQueryNode*> pending{root};
  while (!pending.empty()) {
    const TLQueryNode& node = *pending.back();
    pending.pop_back();
    switch (node.mergeOp()) {
      case TLQueryNodeMergeOp::LEAF:
        if (node.op() == TLQueryNodeOp::STRING_EQUAL ||
            node.op() == TLQueryNodeOp::STRING_NOT_EQUAL) {
          _stringRestrictTermsFromLeafNode(node, node.op(), terms);
        }
        break;
      case TLQueryNodeMergeOp::AND:
        for (auto child = node.childs().rbegin(); child != node.childs().rend(); ++child) {
          pending.push_back(child->get());
        }
        break;
      case TLQueryNodeMergeOp::OR:
        _restrictTermFromOrNode(node, terms);
        break;
      default:
        log().error("Unknown query tree node mergeOp: {}.", static_cast<int32_t>(node.mergeOp()));
    }
  }
}

void TALQueryProcessor::_stringRestrictTermsFromLeafNode(const TLQueryNode& node, TLQueryNodeOp op,
                                                         std::vector<TALTerm>& terms) const {
  const bool equal = op == TLQueryNodeOp::STRING_EQUAL;
  if (!equal && op != TLQueryNodeOp::STRING_NOT_EQUAL) {
    log().info("Cannot handle leaf node op: {}.", static_cast<int32_t>(op));
    return;
  }
  const TLString token = _extractStringFrom(node);
  if (token.empty()) return;
  for (size_t i = 0; i < node.keysCount(); ++i) {
    const TLAttributeKey key = keyAt(node, i);
    Zones zones;
    if (equal) {
      // Lists all searchable zones, so that a match in another zone counts as a match, but with
      // weight 0.
      for (const TLAttributeKey entry : _zoneManager.indexableEnumKeyAttribs()) {
        _assignWeightsWithKey(entry, entry == key ? 1.0 : 0.0, zones);
      }
    } else {
      _assignWeightsWithKey(key, 1.0, zones);
    }
    const TermWorth worth = equal ? kEqual : kNotEqual;
    terms.emplace_back(std::vector<TLString>{token}, std::vector<double>{worth.score},
                       worth.noMatch, std::move(zones.ids), std::move(zones.scores), false);
  }
}

void TALQueryProcessor::_restrictTermFromOrNode(const TLQueryNode& node,
                                                std::vector<TALTerm>& terms) const {
  std::vector<TLString> tokens;
  std::unordered_set<TLString> known;  // a verification query has thousands of tokens
  Zones zones;
  for (const auto& child : node.childs()) {
    if (child->mergeOp() != TLQueryNodeMergeOp::LEAF) {
      log().info("Cannot handle a non-leaf node under an OR node.");
      continue;
    }
    if (child->op() != TLQueryNodeOp::STRING_EQUAL) {
      log().info("Cannot handle op {} under an OR node.", static_cast<int32_t>(child->op()));
      continue;
    }
    TLString token = _extractStringFrom(*child);
    if (token.empty()) continue;
    if (known.insert(token).second) tokens.push_back(std::move(token));
    for (size_t i = 0; i < child->keysCount(); ++i)
      _assignWeightsWithKey(keyAt(*child, i), 1.0, zones);
  }
  if (tokens.empty()) return;
  std::vector<double> scores(tokens.size(), kEqual.score);
  terms.emplace_back(std::move(tokens), std::move(scores), kEqual.noMatch, std::move(zones.ids),
                     std::move(zones.scores), false);
}

TLString TALQueryProcessor::_extractStringFrom(const TLQueryNode& node) const {
  if (!node.hasStringValue()) return {};
  if (!_needsTokenization(node)) return *node.stringValue();
  std::vector<TLString> words;
  _tokenizer->TokenizeToList(*node.stringValue(), words);
  return joinWords(words);
}

bool TALQueryProcessor::_needsTokenization(const TLQueryNode& node) {
  const auto& free = queryTermEnumKeyAttribs();
  for (size_t i = 0; i < node.keysCount(); ++i) {
    if (std::find(free.begin(), free.end(), keyAt(node, i)) != free.end()) return true;
  }
  return false;
}

void TALQueryProcessor::_zoneWeightsWithKey(TLAttributeKey key, Zones& zones) const {
  const auto zone = _zoneManager.zoneIDForAttributeKey(static_cast<int32_t>(key), std::nullopt);
  if (!zone) return;
  const auto score = _zoneManager.scoreForZoneID(zone);
  zones.ids.push_back(*zone);
  zones.scores.push_back(score ? static_cast<double>(*score) : kDefaultZoneScore);
}

void TALQueryProcessor::_assignWeightsWithKey(TLAttributeKey key, double weight,
                                              Zones& zones) const {
  const auto zone = _zoneManager.zoneIDForAttributeKey(static_cast<int32_t>(key), std::nullopt);
  if (!zone || std::find(zones.ids.begin(), zones.ids.end(), *zone) != zones.ids.end()) return;
  zones.ids.push_back(*zone);
  zones.scores.push_back(weight);
}
