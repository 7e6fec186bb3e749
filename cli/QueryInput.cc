#include "cli/QueryInput.h"

#include <fmt/format.h>

#include <algorithm>

#include "parameters/TLParamsManager.h"
#include "querylang/Expressions.h"
#include "querylang/TLQueryAdditions.h"

namespace cli {

namespace {

constexpr const char* kErrorDomain = "tallow";
constexpr int kUnreadable = 1;
constexpr size_t kShownText = 60;

std::string joinedWords(const std::vector<std::string>& arguments) {
  return fmt::format("{}", fmt::join(arguments, " "));
}

std::string shown(std::string_view text) {
  if (text.size() <= kShownText) return std::string(text);
  return platform::toUTF8(platform::fromUTF8(text.substr(0, kShownText))) + "...";
}

// Parses an expression only to report what is wrong with it. Null after an error.
sq::Tree checked(const std::string& expression, std::vector<std::string>& remarks,
                 TLErrorOut error) {
  sq::Tree tree;
  size_t stop = 0;
  const bool good = sq::parse(expression.c_str(), tree, &stop);
  std::string_view rest = std::string_view(expression).substr(stop);
  if (!good) {
    const std::string place = rest.empty() ? "its end" : fmt::format("\"{}\"", shown(rest));
    platform::setError(error, {kErrorDomain, kUnreadable,
                               fmt::format("the expression cannot be read from {} on", place)});
    return nullptr;
  }
  rest.remove_prefix(std::min(rest.find_first_not_of(" \t\n)"), rest.size()));
  if (!rest.empty()) {
    remarks.push_back(
        fmt::format("the expression ends before \"{}\", the rest is ignored", shown(rest)));
  }
  for (const std::string& name : sq::unknownAttributes(*tree)) {
    remarks.push_back(fmt::format("there is no attribute {}", shown(name)));
  }
  return tree;
}

// The tree built for a valid text; null with an error if it is too high.
std::shared_ptr<TLQueryNode> builtTree(const TLQuery& query, TLErrorOut error) {
  if (query.hasRoot()) return query.root()->copyWithZone();
  platform::setError(error, {kErrorDomain, kUnreadable,
                             fmt::format("the expression nests && and || more than {} deep",
                                         TLQueryAdditions::kMaxTreeHeight - 2)});
  return nullptr;
}

bool readMain(const std::string& expression, QueryInput& input, TLErrorOut error) {
  const sq::Tree tree = checked(expression, input.remarks, error);
  if (tree == nullptr) return false;
  input.query = TLQueryAdditions::initWithBeaconQueryString(platform::fromUTF8(expression), false);
  auto before = builtTree(*input.query, error);
  if (before == nullptr) return false;
  TLQueryAdditions::optimizeQuery(*input.query);
  input.main = {expression, sq::expressionText(*tree), std::move(before), input.query->root()};
  return true;
}

// Each filter is parsed separately, so it cannot change the meaning of another.
bool readFilters(const std::vector<std::string>& filters, QueryInput& input, TLErrorOut error) {
  if (filters.empty()) return true;
  std::vector<std::string> texts;
  std::vector<TLString> strings;
  for (const std::string& filter : filters) {
    const sq::Tree tree = checked(filter, input.remarks, error);
    if (tree == nullptr) return false;
    texts.push_back(fmt::format("({})", sq::expressionText(*tree)));
    strings.push_back(platform::fromUTF8(texts.back()));
  }
  TLQueryAdditions::addFiltersToQuery(*input.query, strings, false);
  auto before = builtTree(*input.query, error);
  if (before == nullptr) return false;
  TLQueryAdditions::optimizeFiltersOfQuery(*input.query);
  input.filter = {fmt::format("{}", fmt::join(filters, " && ")),
                  fmt::format("{}", fmt::join(texts, " && ")), std::move(before),
                  input.query->root()};
  return true;
}

bool readParameters(const std::string& text, TLQuery& query, TLErrorOut error) {
  if (text.empty()) return true;
  const auto parameters = TLParamsManager::paramsFromString(platform::fromUTF8(text));
  const auto pairs = static_cast<size_t>(std::count(text.begin(), text.end(), ',')) + 1;
  if (parameters == nullptr || parameters->keyvaluesCount() != pairs) {
    platform::setError(
        error, {kErrorDomain, kUnreadable,
                fmt::format("\"{}\" is no list of parameters, KEY=VALUE,...", shown(text))});
    return false;
  }
  query.setSearchParams(parameters);
  return true;
}

// The input is not only words, so there is no expression to show.
void readTyped(QueryInput& input) {
  input.query = std::make_shared<TLQuery>();
  input.query->setRawQuery(platform::fromUTF8(input.words));
  input.query->setOriginalQuery(TLString());
  input.main = {input.words, usersyntax::printed(input.typed.root), nullptr, nullptr};
}

// Restricts the typed query to mail in one of the folders.
void limitToFolders(const std::vector<std::string>& folders, usersyntax::Query& typed) {
  usersyntax::Node places;
  places.kind = usersyntax::Kind::disjunction;
  for (const std::string& folder : folders) {
    usersyntax::Node& place = places.children.emplace_back();
    place.kind = usersyntax::Kind::text;
    place.field = usersyntax::Field::folder;
    place.text = folder;
  }
  usersyntax::Node both;
  both.children = {std::move(typed.root), std::move(places)};
  typed.root = std::move(both);
  typed.plain = false;
}

// Makes one query if the daemon can decide everything, otherwise a plan.
bool makePlan(QueryInput& input, bool typed, TLErrorOut error) {
  const TLQuery& query = *input.query;
  if (!typed && !hasCheckedConditions(query.root().get())) {
    input.plan.branches.push_back({input.query, {}, {}});
    input.plan.asTyped = true;
    return true;
  }
  auto plan = planSearch(typed ? input.typed.root : usersyntax::Node(),
                         TLString(platform::orEmpty(query.originalQuery())), query.root().get(),
                         query.searchParams().get(), error);
  if (!plan) return false;
  input.plan = std::move(*plan);
  input.remarks.insert(input.remarks.end(), input.plan.remarks.begin(), input.plan.remarks.end());
  return true;
}

}  // namespace

std::string QueryInput::markedWords() const {
  if (typed.plain) return platform::toUTF8(platform::orEmpty(query->originalQuery()));
  std::string marked;
  std::vector<const usersyntax::Node*> open{&typed.root};
  while (!open.empty()) {
    const usersyntax::Node& node = *open.back();
    open.pop_back();
    if (node.kind == usersyntax::Kind::negation) continue;
    const bool folder = node.field == usersyntax::Field::folder;
    if (node.kind == usersyntax::Kind::text && !folder) marked += node.text + ' ';
    for (auto child = node.children.rbegin(); child != node.children.rend(); ++child) {
      open.push_back(&*child);
    }
  }
  return marked;
}

std::optional<QueryInput> queryInput(const Options& options, double now, TLErrorOut error) {
  QueryInput input;
  input.words = joinedWords(options.arguments);
  if (options.query.empty()) input.typed = usersyntax::parse(input.words, now);
  input.remarks = input.typed.remarks;
  if (!options.folders.empty()) limitToFolders(options.folders, input.typed);
  const bool typed = !input.typed.plain;
  const std::string expression =
      options.query.empty() ? sq::expressionForWords(input.words) : options.query;
  if (typed) {
    readTyped(input);
  } else if (!readMain(expression, input, error)) {
    return std::nullopt;
  }
  if (!readFilters(options.filters, input, error) ||
      !readParameters(options.parameters, *input.query, error) || !makePlan(input, typed, error)) {
    return std::nullopt;
  }
  return input;
}

std::vector<std::string> argumentsOf(const std::string& line) {
  std::vector<std::string> arguments(1);
  bool quoted = false;
  for (const char c : line) {
    if (c == '"') quoted = !quoted;
    if (c == ' ' && !quoted) {
      arguments.emplace_back();
    } else {
      arguments.back().push_back(c);
    }
  }
  return arguments;
}

}  // namespace cli
