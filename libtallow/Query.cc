#include "libtallow/tallow/Query.h"

#include <algorithm>
#include <set>

#include "libtallow/Errors.h"
#include "libtallow/QueryImpl.h"
#include "platform/Log.h"
#include "querylang/Expressions.h"
#include "querylang/TLQueryAdditions.h"

namespace tallow {

namespace {

constexpr size_t kShownText = 60;

std::string shown(std::string_view text) {
  return platform::toUTF8(platform::fromUTF8(text.substr(0, kShownText)));
}

// The expression in the form that the parser understands it; nullopt with an error.
std::optional<std::string> checked(std::string_view text, Error* error) {
  if (!isSendable(text, "the expression", error)) return std::nullopt;
  const std::string expression(text);
  sq::Tree tree;
  size_t stop = 0;
  const bool good = sq::parse(expression.c_str(), tree, &stop);
  if (!good || expression.find_first_not_of(" \t\n", stop) != std::string::npos) {
    failAsInvalid(error, fmt::format("the expression cannot be parsed from \"{}\" on",
                                     shown(expression.substr(stop))));
    return std::nullopt;
  }
  const std::set<std::string> unknown = sq::unknownAttributes(*tree);
  if (unknown.empty()) return sq::expressionText(*tree);
  failAsInvalid(error, fmt::format("there is no attribute {}", shown(*unknown.begin())));
  return std::nullopt;
}

// The query of a valid expression; null with an error if it nests too deep.
std::shared_ptr<TLQuery> queryOf(const std::string& expression, Error* error) {
  auto query = TLQueryAdditions::initWithBeaconQueryString(platform::fromUTF8(expression), false);
  if (query->hasRoot()) {
    TLQueryAdditions::optimizeQuery(*query);
    return query;
  }
  failAsInvalid(error, "the expression nests && and || too deep");
  return nullptr;
}

std::string withoutNUL(std::string_view text) {
  std::string words = platform::toUTF8(platform::fromUTF8(text));
  std::replace(words.begin(), words.end(), '\0', ' ');
  return words;
}

// The library is a guest in its process and writes nothing. This is its own copy of the log.
void keepQuiet() {
  static const bool done = [] {
    platform::setLogSink([](const platform::LogRecord&) {});
    return true;
  }();
  static_cast<void>(done);
}

}  // namespace

Query::Query(std::unique_ptr<Impl> impl) : _impl(std::move(impl)) {}
Query::Query(const Query& other)
    : _impl(std::make_unique<Impl>(Impl{other._impl->record->copyWithZone()})) {}
Query::Query(Query&& other) noexcept = default;
Query& Query::operator=(const Query& other) {
  *this = Query(other);
  return *this;
}
Query& Query::operator=(Query&& other) noexcept = default;
Query::~Query() = default;

Query Query::words(std::string_view text) {
  keepQuiet();
  auto query = TLQueryAdditions::initWithBeaconQueryString(
      platform::fromUTF8(sq::expressionForWords(withoutNUL(text))), true);
  return Query(std::make_unique<Impl>(Impl{std::move(query)}));
}

std::optional<Query> Query::words(std::string_view text, std::string_view filter, Error* error) {
  const auto expression = checked(filter, error);
  if (!expression) return std::nullopt;
  Query query = words(text);
  TLQuery& record = *query._impl->record;
  TLQueryAdditions::addFiltersToQuery(record, {platform::fromUTF8(*expression)}, false);
  if (!record.hasRoot()) {
    failAsInvalid(error, "the expression nests && and || too deep");
    return std::nullopt;
  }
  TLQueryAdditions::optimizeFiltersOfQuery(record);
  return query;
}

std::optional<Query> Query::expression(std::string_view text, Error* error) {
  keepQuiet();
  const auto expression = checked(text, error);
  auto query = expression ? queryOf(*expression, error) : nullptr;
  if (query == nullptr) return std::nullopt;
  return Query(std::make_unique<Impl>(Impl{std::move(query)}));
}

}  // namespace tallow
