#include "cli/SearchPlan.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <cmath>

#include "cli/TextMatch.h"
#include "parameters/TLParamsManager.h"
#include "platform/Calendar.h"
#include "querylang/TLQueryAdditions.h"
#include "tokenizer/Tokenizer.h"

namespace cli {

namespace {

using usersyntax::Field;
using usersyntax::Flag;
using usersyntax::Kind;
using usersyntax::Node;
using Key = TLAttributeKey;
using NodePointer = std::shared_ptr<TLQueryNode>;

// A low threshold, so that words that occur only in addresses, which count a tenth each, are not
// lost.
constexpr float kMinScore = 1e-37F;

constexpr std::array<const char*, 3> kModifications{"queryModification.enableSpellModification",
                                                    "queryModification.enableSynonymModification",
                                                    "queryModification.enableStemModification"};

// Every attachment has one of these types.
constexpr std::array<const char*, 11> kMediaTypes{"application", "audio", "example", "font",
                                                  "haptics",     "image", "message", "model",
                                                  "multipart",   "text",  "video"};

// A leaf of the tree, alternatives of one field, or a condition of the query language.
struct Literal {
  std::vector<Node> anyOf;
  NodePointer condition;
  TLString freeText;
  bool negated = false;
};
using Literals = std::vector<Literal>;
using Alternatives = std::vector<Literals>;

NodePointer leaf(const std::vector<Key>& keys, TLString text) {
  auto node = std::make_shared<TLQueryNode>();
  node->setMergeOp(TLQueryNodeMergeOp::LEAF);
  node->setOp(TLQueryNodeOp::STRING_EQUAL);
  for (const Key key : keys) node->addKey(key);
  node->setStringValue(std::move(text));
  return node;
}

// The daemon looks in one zone of a mail or another for one text or another. It cuts the text of a
// condition into words and drops the space that makes the last word a whole one, except where the
// attribute holds names as they stand. So a whole word is the text of such an attribute, one that
// no mail has, and the attributes that are meant come with a text that is only there where the
// first is.
void addText(TLQueryNode& group, const std::vector<Key>& keys, const Node& text) {
  if (mayGoOn(text)) {
    group.addChild(leaf(keys, platform::fromUTF8(text.text)));
    return;
  }
  const TLString words = platform::fromUTF8(indexedWords(text));
  group.addChild(leaf({Key::KEYWORDS}, words));
  group.addChild(leaf(keys, platform::fromUTF8(text.text + ' ' + text.text)));
}

NodePointer group(TLQueryNodeMergeOp op) {
  auto node = std::make_shared<TLQueryNode>();
  node->setMergeOp(op);
  return node;
}

// Folder names are compared literally, as prefixes.
NodePointer folderCondition(const Node& node) {
  NodePointer any = group(TLQueryNodeMergeOp::OR);
  for (const std::string& name : folderSpellings(node.text)) {
    any->addChild(leaf({Key::MAILBOXES, Key::MAILBOX_IDENTIFIERS}, platform::fromUTF8(name)));
  }
  return any;
}

NodePointer attachmentCondition() {
  NodePointer any = group(TLQueryNodeMergeOp::OR);
  for (const char* const type : kMediaTypes) {
    Node text;
    text.text = type;
    addText(*any, {Key::ATTACHMENT_TYPES}, text);
  }
  return any;
}

bool isSearchedText(const Node& node) {
  return node.kind == Kind::text && !zonesOf(node.field).empty();
}

// The part of a literal that the daemon can evaluate; null if none.
NodePointer conditionOf(const Literal& literal) {
  const Node& first = literal.anyOf.front();
  if (first.kind == Kind::flag && first.flag == Flag::hasAttachment) return attachmentCondition();
  if (first.kind == Kind::text && first.field == Field::folder) return folderCondition(first);
  if (!isSearchedText(first)) return nullptr;
  NodePointer any = group(TLQueryNodeMergeOp::OR);
  for (const Node& node : literal.anyOf) addText(*any, zonesOf(node.field), node);
  return any;
}

// Whether the daemon can evaluate the literal completely.
bool daemonDecides(const Literal& literal) {
  return std::all_of(literal.anyOf.begin(), literal.anyOf.end(), [](const Node& node) {
    if (node.kind == Kind::flag) return node.flag == Flag::hasAttachment;
    return isSearchedText(node) && !isCutInIndex(node);
  });
}

void addParameterRecord(TLQuery& query, std::shared_ptr<TLParamKeyValue> record) {
  if (!query.hasSearchParams()) query.setSearchParams(std::make_shared<TLParameters>());
  const std::string key = platform::toUTF8(*record->key());
  if (query.searchParams()->parameterKeyValueForKey(key) != nullptr) return;
  query.searchParams()->addKeyvalue(std::move(record));
}

// Builds the queries of one alternative.
class BranchBuilder {
 public:
  BranchBuilder(const Literals& literals, const TLParameters* parameters, bool modified)
      : _parameters(parameters) {
    for (const Literal& literal : literals) add(literal);
    if (_freeText.empty() && _conditions.empty()) {
      _conditions.push_back(leaf({Key::CONTENT_TYPE}, u"message/rfc822"));
    }
    _modified = modified && _negated.empty();
  }

  Branch build() {
    _branch.query = query(nullptr);
    _branch.modifiable = _modified;
    for (const NodePointer& condition : _negated) _branch.without.push_back(query(condition));
    return std::move(_branch);
  }

 private:
  void add(const Literal& literal) {
    if (!literal.freeText.empty()) {
      _freeText += literal.freeText;
      return;
    }
    if (literal.condition != nullptr) {
      _conditions.push_back(literal.condition);
      return;
    }
    const bool decided = daemonDecides(literal);
    if (!decided) _branch.checks.push_back({literal.anyOf.front(), literal.negated});
    NodePointer condition = conditionOf(literal);
    if (condition == nullptr) return;
    if (literal.negated) {
      if (decided) _negated.push_back(std::move(condition));
      return;
    }
    const Node& first = literal.anyOf.front();
    const bool word = isSearchedText(first) && first.field == Field::any;
    if (word && literal.anyOf.size() == 1) addFreeText(first);
    // A single word is required by the free text as well.
    const bool single = word && literal.anyOf.size() == 1 && wordCount(first) == 1;
    if (!single) _conditions.push_back(std::move(condition));
  }

  // Words that rank the results. The last word typed stays last, because it may be a prefix.
  void addFreeText(const Node& node) {
    const TLString text = platform::fromUTF8(node.text);
    if (mayGoOn(node)) {
      _openWord = text;
    } else {
      _freeText += text + u' ';
    }
  }

  std::shared_ptr<TLQuery> query(const NodePointer& further) {
    auto query = std::make_shared<TLQuery>();
    query->setOriginalQuery(_freeText + _openWord);
    query->setRawQuery(query->originalQuery());
    NodePointer root = group(TLQueryNodeMergeOp::AND);
    for (const NodePointer& condition : _conditions) root->addChild(condition);
    if (further != nullptr) root->addChild(further);
    if (root->childsCount() > 0) query->setRoot(root);
    if (_parameters != nullptr) query->setSearchParams(_parameters->copyWithZone());
    addParameterRecord(*query, TLParamsManager::tlParamKeyValueWithKeyFloatValue(
                                   u"salt.scoreThreshold", kMinScore));
    for (const char* const key : kModifications) {
      if (_modified) break;
      addParameterRecord(
          *query, TLParamsManager::tlParamKeyValueWithKeyBoolValue(platform::fromUTF8(key), false));
    }
    return query;
  }

  const TLParameters* const _parameters;
  Branch _branch;
  TLString _freeText;
  TLString _openWord;
  std::vector<NodePointer> _conditions;
  std::vector<NodePointer> _negated;
  bool _modified = false;
};

// Expands a tree into alternatives of literals. Recursion depth at most 3 * kMaxDepth. Nullopt if
// there are too many alternatives.
class Expansion {
 public:
  std::optional<Alternatives> of(const Node& node, bool negated, bool inside) {
    switch (node.kind) {
      case Kind::negation:
        return of(node.children.front(), !negated, inside);
      case Kind::conjunction:
      case Kind::disjunction:
        if ((node.kind == Kind::conjunction) != negated) return product(node, negated);
        return inside && !negated && isOneField(node) ? oneLiteral(node.children)
                                                      : sum(node, negated, inside);
      default:
        return Alternatives{{{{node}, nullptr, {}, negated}}};
    }
  }

  // The same for conditions of the query language. Recursion depth at most kMaxRecordDepth.
  std::optional<Alternatives> of(const TLQueryNode& node) {
    if (node.mergeOp() == TLQueryNodeMergeOp::LEAF) return ofLeaf(node);
    const bool isAnd = node.mergeOp() == TLQueryNodeMergeOp::AND;
    Alternatives result;
    if (isAnd) result.emplace_back();
    for (const auto& child : node.childs()) {
      auto alternatives = of(*child);
      if (!alternatives) return std::nullopt;
      if (isAnd) {
        auto crossed = cross(result, *alternatives);
        if (!crossed) return std::nullopt;
        result = std::move(*crossed);
      } else {
        result.insert(result.end(), alternatives->begin(), alternatives->end());
      }
    }
    return bounded(std::move(result));
  }

  static std::optional<Alternatives> cross(const Alternatives& left, const Alternatives& right) {
    if (left.size() * right.size() > kMaxBranches) return std::nullopt;
    Alternatives result;
    for (const Literals& a : left) {
      for (const Literals& b : right) {
        result.push_back(a);
        result.back().insert(result.back().end(), b.begin(), b.end());
      }
    }
    return result;
  }

  [[nodiscard]] std::vector<std::string>& remarks() { return _remarks; }

 private:
  static std::optional<Alternatives> bounded(Alternatives alternatives) {
    if (alternatives.size() > kMaxBranches) return std::nullopt;
    return alternatives;
  }

  static bool isOneField(const Node& node) {
    const Field field = node.children.front().field;
    return std::all_of(node.children.begin(), node.children.end(), [field](const Node& child) {
      return isSearchedText(child) && child.field == field && !isCutInIndex(child);
    });
  }

  static Alternatives oneLiteral(const std::vector<Node>& nodes) {
    return {{{nodes, nullptr, {}, false}}};
  }

  std::optional<Alternatives> product(const Node& node, bool negated) {
    Alternatives result{{}};
    for (const Node& child : node.children) {
      const auto alternatives = of(child, negated, true);
      if (!alternatives) return std::nullopt;
      auto crossed = cross(result, *alternatives);
      if (!crossed) return std::nullopt;
      result = std::move(*crossed);
    }
    return result;
  }

  std::optional<Alternatives> sum(const Node& node, bool negated, bool inside) {
    Alternatives result;
    for (const Node& child : node.children) {
      auto alternatives = of(child, negated, inside);
      if (!alternatives) return std::nullopt;
      result.insert(result.end(), alternatives->begin(), alternatives->end());
    }
    return bounded(std::move(result));
  }

  Alternatives ofLeaf(const TLQueryNode& node) {
    if (node.op() == TLQueryNodeOp::BOOL_CONSTANT) {
      return node.boolValue() ? Alternatives{{}} : Alternatives{};
    }
    if (node.hasDoubleValue()) return dateLiteral(node);
    if (node.op() == TLQueryNodeOp::INT_EQUAL) return numberLiteral(node);
    return {{{{}, node.copyWithZone(), {}, false}}};
  }

  // Times in a tree are relative to the reference date.
  static Alternatives dateLiteral(const TLQueryNode& node) {
    Node date;
    date.kind = Kind::date;
    const double time = node.doubleValue() + platform::kReferenceDate;
    const double after = std::nextafter(time, HUGE_VAL);
    bool negated = false;
    switch (node.op()) {
      case TLQueryNodeOp::FLOAT_LESS:
        date.dates.until = time;
        break;
      case TLQueryNodeOp::FLOAT_LESS_EQUAL:
        date.dates.until = after;
        break;
      case TLQueryNodeOp::FLOAT_GREATER:
        date.dates.from = after;
        break;
      case TLQueryNodeOp::FLOAT_GREATER_EQUAL:
        date.dates.from = time;
        break;
      default:
        date.dates = {time, after};
        negated = node.op() == TLQueryNodeOp::STRING_NOT_EQUAL;
    }
    return {{{{date}, nullptr, {}, negated}}};
  }

  Alternatives numberLiteral(const TLQueryNode& node) {
    const auto key = static_cast<Key>(node.keyAtIndex(0));
    if (key != Key::READ && key != Key::FLAGGED) {
      _remarks.emplace_back("colours of flags and priorities are not known here, no mail has one");
      return {};
    }
    Node flag;
    flag.kind = Kind::flag;
    flag.flag = key == Key::READ ? Flag::read : Flag::flagged;
    if (node.intValue() != 0 && node.intValue() != 1) return {};
    return {{{{flag}, nullptr, {}, node.intValue() == 0}}};
  }

  std::vector<std::string> _remarks;
};

std::string checkText(const Check& check) {
  return fmt::format("{}{}", check.negated ? "not " : "", usersyntax::printed(check.node));
}

std::string queryText(const TLQuery& query) {
  std::string text =
      fmt::format("words ->{}<-", platform::toUTF8(platform::orEmpty(query.originalQuery())));
  text += TLQueryAdditions::_stringifyQueryTree(query.root().get(), 1, true);
  std::replace(text.begin(), text.end(), '\t', ' ');
  return text;
}

}  // namespace

bool hasCheckedConditions(const TLQueryNode* tree) {
  std::vector<const TLQueryNode*> open;
  if (tree != nullptr) open.push_back(tree);
  while (!open.empty()) {
    const TLQueryNode& node = *open.back();
    open.pop_back();
    for (const auto& child : node.childs()) open.push_back(child.get());
    if (node.mergeOp() != TLQueryNodeMergeOp::LEAF) continue;
    if (node.hasDoubleValue() || node.op() == TLQueryNodeOp::INT_EQUAL) return true;
  }
  return false;
}

std::optional<SearchPlan> planSearch(const usersyntax::Node& tree, const TLString& freeText,
                                     const TLQueryNode* conditions, const TLParameters* parameters,
                                     TLErrorOut error) {
  Expansion expansion;
  const std::optional<Node> kept = withoutWordless(tree);
  std::optional<Alternatives> all =
      kept ? expansion.of(*kept, false, false) : std::optional<Alternatives>(std::in_place);
  if (all && conditions != nullptr) {
    const auto further = expansion.of(*conditions);
    all = further ? Expansion::cross(*all, *further) : std::nullopt;
  }
  if (!all) {
    platform::setError(
        error,
        {"tallow", 1,
         fmt::format("the search has more than {} combinations of alternatives", kMaxBranches)});
    return std::nullopt;
  }
  SearchPlan plan;
  plan.remarks = std::move(expansion.remarks());
  for (const Node& node : wordlessNodes(tree)) {
    plan.remarks.push_back(fmt::format("\"{}\" holds no word and is passed over", node.text));
  }
  for (Literals& literals : *all) {
    if (!freeText.empty()) literals.push_back({{}, nullptr, freeText, false});
    plan.branches.push_back(BranchBuilder(literals, parameters, all->size() == 1).build());
  }
  return plan;
}

std::string planText(const SearchPlan& plan) {
  std::string text;
  for (const Branch& branch : plan.branches) {
    text += "search for " + queryText(*branch.query) + '\n';
    for (const auto& query : branch.without) {
      text += "leave out what is found by " + queryText(*query) + '\n';
    }
    for (const Check& check : branch.checks) text += "check " + checkText(check) + '\n';
  }
  return text.empty() ? "nothing can be found\n" : text;
}

void addParameter(TLQuery& query, const char* key, int32_t value) {
  addParameterRecord(
      query, TLParamsManager::tlParamKeyValueWithKeyIntValue(platform::fromUTF8(key), value));
}

}  // namespace cli
