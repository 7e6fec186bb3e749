#include "querylang/TLQueryAdditions.h"

#include "platform/Redaction.h"

namespace {

using platform::LogLevel;

TLString join(const std::vector<TLString>& texts, TLStringView separator) {
  TLString out;
  for (const TLString& text : texts) {
    if (&text != &texts.front()) out += separator;
    out += text;
  }
  return out;
}

void printResult(const TLQuery& query) {
  TLQueryAdditions::_printQueryTree(query.root().get());
  TLQueryAdditions::log().info("original query:->{}<-", platform::redacted(query.originalQuery()));
}

}  // namespace

const platform::Log& TLQueryAdditions::log() {
  static const platform::Log handle(platform::kSubsystem, "TLQueryParsing");
  return handle;
}

std::shared_ptr<TLQuery> TLQueryAdditions::initWithQueryString(const TLString& string) {
  auto query = std::make_shared<TLQuery>();
  query->setRawQuery(string);
  query->setOriginalQuery(string);
  return query;
}

std::shared_ptr<TLQuery> TLQueryAdditions::initWithBeaconQueryString(const TLString& string,
                                                                     bool optimize) {
  auto query = std::make_shared<TLQuery>();
  query->setRawQuery(string);
  query->setRoot(_parse(string));
  query->setOriginalQuery(TLString());
  log().info("query tree before optimization");
  _printQueryTree(query->root().get());
  if (optimize) optimizeQuery(*query);
  return query;
}

void TLQueryAdditions::optimizeQuery(TLQuery& query) {
  Parts parts;
  query.setRoot(optimizeQuery(query.root(), parts));
  query.setOriginalQuery(join(parts, u" "));
  log().info("query tree after optimization");
  printResult(query);
}

void TLQueryAdditions::addFiltersToQuery(TLQuery& query, const std::vector<TLString>& filters,
                                         bool optimize) {
  if (filters.empty()) return;
  query.setRoot(_parse(join(filters, u" && ")));
  log().info("FilterQuery tree before optimization");
  _printQueryTree(query.root().get());
  if (optimize) optimizeFiltersOfQuery(query);
}

void TLQueryAdditions::optimizeFiltersOfQuery(TLQuery& query) {
  Parts dropped;
  query.setRoot(optimizeQuery(query.root(), dropped));
  log().info("FilterQuery tree after optimization");
  printResult(query);
}

TLQueryAdditions::Node TLQueryAdditions::_parse(const TLString& string) {
  const std::string bytes = platform::toUTF8(string);
  if (log().enabled(LogLevel::info)) log().info("Input query: {}", platform::redacted(string));
  sq::Tree tree;
  if (sq::parse(bytes.c_str(), tree)) {
    auto root = std::make_shared<TLQueryNode>();
    root->setMergeOp(TLQueryNodeMergeOp::AND);
    Stack stack{std::move(root)};
    if (_build(tree.get(), stack)) return stack.back();
  }
  log().fault("Failed to parse query: {}", platform::redacted(string));
  return nullptr;
}
