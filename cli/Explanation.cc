#include "cli/Explanation.h"

#include <fmt/format.h>

#include <algorithm>
#include <nlohmann/json.hpp>

#include "modification/TALSynonyms.h"
#include "parameters/TLParamsManager.h"
#include "platform/Paths.h"
#include "query/TALQueryProcessor.h"
#include "querylang/TLQueryAdditions.h"

namespace cli {

namespace {

constexpr const char* kSynonymsInFirstPass = "queryModification.enableSynonymModificationFirstPass";

// A heading with indented text below it.
std::string section(const std::string& heading, const std::string& text, const Palette& palette) {
  std::string out = fmt::format("{}{}{}\n", palette.faint, heading, palette.end);
  for (size_t at = 0; at < text.size();) {
    const size_t end = std::min(text.find('\n', at), text.size());
    if (end > at) out += "  " + cleanForTerminal(text.substr(at, end - at)) + '\n';
    at = end + 1;
  }
  return out;
}

// The tree as in the log, but with its texts readable and indented for a terminal.
std::string treeText(const TLQueryNode* tree) {
  if (tree == nullptr) return "(nothing)";
  std::string out;
  for (const char c : TLQueryAdditions::_stringifyQueryTree(tree, 0, true)) {
    if (c == '\t') {
      out += "  ";
    } else {
      out += c;
    }
  }
  return out;
}

std::string stepsText(const Understanding& steps, const std::string& kind, const Palette& palette) {
  return section(kind + " parse tree", steps.parseTree, palette) +
         section(kind + " tree before optimization", treeText(steps.before.get()), palette) +
         section(kind + " tree after optimization", treeText(steps.after.get()), palette);
}

nlohmann::json treeJSON(const std::shared_ptr<TLQueryNode>& tree) {
  return tree == nullptr ? nlohmann::json() : tree->dictionaryRepresentation();
}

nlohmann::json stepsJSON(const Understanding& steps) {
  return {{"expression", steps.expression},
          {"parseTree", steps.parseTree},
          {"treeBeforeOptimization", treeJSON(steps.before)},
          {"treeAfterOptimization", treeJSON(steps.after)}};
}

nlohmann::json termJSON(const TALTerm& term) {
  nlohmann::json tokens = nlohmann::json::array();
  for (size_t i = 0; i < term.tokens().size(); ++i) {
    tokens.push_back(
        {{"token", platform::toUTF8(term.tokens()[i])}, {"score", term.tokenScores()[i]}});
  }
  nlohmann::json zones = nlohmann::json::array();
  for (size_t i = 0; i < term.zoneIDs().size(); ++i) {
    const int32_t zone = term.zoneIDs()[i];
    zones.push_back({{"zone", zone},
                     {"name", TLQueryNode::keysAsString(zone)},
                     {"score", term.zoneScores()[i]}});
  }
  return {{"tokens", std::move(tokens)},
          {"scoreNoMatch", term.scoreNoMatch()},
          {"zones", std::move(zones)},
          {"unigram", term.isUnigram()}};
}

}  // namespace

std::vector<TALTerm> termsOf(const TLQuery& query) {
  const auto resolved = query.copyWithZone();
  resolved->setSearchParams(query.hasSearchParams()
                                ? TLParamsManager::resolveOverrides(*query.searchParams(), true)
                                : TLParamsManager::getDefaultSearchParamsWithCaching(true));
  TALZoneManager zones;
  zones.setupAttributeScoresWithSearchParams(*resolved->searchParams());
  TALSynonyms synonyms;
  if (resolved->searchParams()->boolValueForKey(kSynonymsInFirstPass)) {
    synonyms.loadSynonymsFromFile(platform::synonymFilePath(), nullptr);
  }
  const auto processor = TALQueryProcessor::initWithZoneManager(zones, &synonyms);
  return processor == nullptr ? std::vector<TALTerm>() : processor->termsFromQuery(*resolved);
}

std::vector<TALTerm> termsOf(const SearchPlan& plan) {
  std::vector<TALTerm> all;
  for (const Branch& branch : plan.branches) {
    std::vector<TALTerm> terms = termsOf(*branch.query);
    all.insert(all.end(), terms.begin(), terms.end());
  }
  return all;
}

std::string explanationText(const QueryInput& input, const std::vector<TALTerm>& terms,
                            const Palette& palette) {
  const bool typed = !input.typed.plain;
  std::string out = typed ? section("understood as", input.main.parseTree, palette)
                          : stepsText(input.main, "query", palette);
  if (input.filter) out += stepsText(*input.filter, "filter", palette);
  if (!input.plan.asTyped) out += section("plan", planText(input.plan), palette);
  // Quoted, because a space at the end means that the last word is complete.
  const std::string text = platform::toUTF8(platform::orEmpty(input.query->originalQuery()));
  if (!typed) out += section("original query", "->" + text + "<-", palette);
  std::string lines;
  for (const TALTerm& term : terms) lines += term.description() + '\n';
  return out + section("terms", terms.empty() ? "(none)" : lines, palette);
}

nlohmann::json explanationJSON(const QueryInput& input, const std::vector<TALTerm>& terms) {
  nlohmann::json list = nlohmann::json::array();
  for (const TALTerm& term : terms) list.push_back(termJSON(term));
  nlohmann::json json{{"query", input.query->dictionaryRepresentation()},
                      {"steps", stepsJSON(input.main)},
                      {"terms", std::move(list)}};
  if (!input.typed.plain) json["understoodAs"] = input.main.parseTree;
  if (!input.plan.asTyped) json["plan"] = planText(input.plan);
  if (input.filter) json["filterSteps"] = stepsJSON(*input.filter);
  return json;
}

}  // namespace cli
