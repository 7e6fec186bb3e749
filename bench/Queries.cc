#include "bench/Queries.h"

#include <algorithm>
#include <fstream>
#include <sstream>
#include <stdexcept>

#include "parameters/TLParamsManager.h"

namespace bench {

namespace {

constexpr size_t kSampledMails = 2000;
constexpr size_t kSampledUnits = 20000;  // of a body, in UTF-16 units
constexpr size_t kMaxPrefix = 4;
constexpr size_t kMinWord = 2;
constexpr size_t kMinMistyped = 5;

constexpr TLStringView kAsTyped =
    u"queryModification.enableSpellModification=NO,"
    u"queryModification.enableSynonymModification=NO,"
    u"queryModification.enableStemModification=NO";

bool isLetter(char16_t unit) {
  return (unit | 0x20) >= u'a' && (unit | 0x20) <= u'z';
}

// The words of a text that consist of ASCII letters only, in order.
std::vector<std::string> lettersOf(TLStringView text) {
  std::vector<std::string> words;
  for (size_t at = 0; at < text.size();) {
    const size_t start = at;
    while (at < text.size() && isLetter(text[at])) ++at;
    if (at - start >= kMinWord) words.push_back(platform::toUTF8(text.substr(start, at - start)));
    if (at == start) ++at;
  }
  return words;
}

std::string joined(const std::vector<std::string>& words) {
  std::string text;
  for (const std::string& word : words) text += text.empty() ? word : ' ' + word;
  return text;
}

}  // namespace

void QuerySource::see(const client::EncodedItem& encoded) {
  const size_t place = _seen < kSampledMails ? _seen : below(_seen + 1);
  ++_seen;
  if (place >= kSampledMails) return;
  TLIndexableItem item;
  if (!item.initWithData(encoded.bytes)) throw std::runtime_error("an item does not parse");
  const TLStringView body = platform::orEmpty(item.stringValueForKey(TLAttributeKey::TEXT_CONTENT));
  _mails.resize(std::max(_mails.size(), place + 1));
  _mails[place] = {lettersOf(platform::orEmpty(item.stringValueForKey(TLAttributeKey::SUBJECT))),
                   lettersOf(body.substr(0, kSampledUnits))};
}

std::vector<std::string> QuerySource::phrase(size_t words) {
  constexpr size_t kMaxTries = 100000;
  for (size_t i = 0; i < kMaxTries && !_mails.empty(); ++i) {
    const auto& text = _mails[below(_mails.size())][below(2)];
    if (text.size() < words) continue;
    const auto first = text.begin() + static_cast<ptrdiff_t>(below(text.size() - words + 1));
    return {first, first + static_cast<ptrdiff_t>(words)};
  }
  throw std::runtime_error("the mail has no words to search for");
}

std::string QuerySource::draw(size_t words) {
  std::vector<std::string> parts = phrase(words);
  parts.back().resize(std::min(parts.back().size(), 1 + below(kMaxPrefix)));
  return joined(parts);
}

QuerySource::Mistyped QuerySource::drawMistyped() {
  constexpr size_t kMaxTries = 1000;
  for (size_t i = 0; i < kMaxTries; ++i) {
    std::vector<std::string> parts = phrase(kMaxWords);
    std::string& word = parts[below(kMaxWords)];
    if (word.size() < kMinMistyped) continue;
    word = mistype(word);
    return {joined(parts), word};
  }
  throw std::runtime_error("the mail has no words to mistype");
}

std::string QuerySource::mistype(std::string word) {
  const size_t at = below(word.size() - 1);
  switch (below(4)) {
    case 0:
      word[at] = static_cast<char>('a' + below(26));
      break;
    case 1:
      word.erase(at, 1);
      break;
    case 2:
      word.insert(at, 1, word[at]);
      break;
    default:
      std::swap(word[at], word[at + 1]);
  }
  return word;
}

std::vector<std::string> QuerySource::drawAll(size_t count) {
  std::vector<std::string> queries;
  for (size_t i = 0; i < count; ++i) queries.push_back(draw(1 + i % kMaxWords));
  return queries;
}

std::vector<std::string> readQueries(const std::string& path) {
  std::ifstream file(path);
  std::vector<std::string> queries;
  for (std::string line; std::getline(file, line);) {
    if (!wordsOfQuery(line).empty()) queries.push_back(line);
  }
  if (queries.empty() || file.bad()) throw std::runtime_error(path + ": no queries");
  return queries;
}

void writeQueries(const std::vector<std::string>& queries, const std::string& path) {
  std::ofstream file(path);
  for (const std::string& query : queries) file << query << '\n';
  if (!file.flush()) throw std::runtime_error(path + ": cannot be written");
}

std::vector<std::string> wordsOfQuery(const std::string& query) {
  std::istringstream stream(query);
  std::vector<std::string> words;
  for (std::string word; stream >> word;) words.push_back(word);
  return words;
}

TimedSearch timedSearch(client::SearchServiceProxy& service, const std::string& text, bool asTyped,
                        const std::string& protectionClass) {
  TLQuery query;
  query.setRawQuery(platform::fromUTF8(text));
  query.setOriginalQuery(platform::fromUTF8(text));
  if (asTyped) query.setSearchParams(TLParamsManager::paramsFromString(kAsTyped));
  std::optional<TLError> error;
  const double start = secondsNow();
  const auto items = service.searchItems(query, 0, protectionClass, kMaxResults, &error);
  const double seconds = secondsNow() - start;
  if (!items) throw std::runtime_error("search: " + platform::printable(error));
  return {seconds, items->size()};
}

}  // namespace bench
