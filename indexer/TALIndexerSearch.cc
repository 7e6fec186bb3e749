#include <algorithm>
#include <cmath>
#include <ctime>
#include <unordered_set>
#include <utility>

#include "indexer/TALIndexer.h"
#include "parameters/TLParamsManager.h"
#include "platform/Clock.h"
#include "platform/Redaction.h"
#include "platform/Signpost.h"

using platform::MutexLock;
using platform::Signpost;

namespace {

constexpr double kSecondsPerDay = 86400.0;
// log2(age in days) + 1 at which the freshness penalty reaches its limit.
constexpr double kFreshnessSpan = 7.52;

const platform::Log& rankingLog() {
  static const platform::Log handle("com.quill.tallow.ranking", "TALIndexer");
  return handle;
}

std::string _stringFromTLPersons(const std::vector<std::shared_ptr<TLPerson>>* persons) {
  std::string text;
  if (persons == nullptr) return text;
  for (const auto& person : *persons) {
    text += fmt::format("{} (Email: {})\t", platform::redacted(person->name()),
                        platform::redacted(person->emailAddress()));
  }
  return text;
}

// How many top items to log, 0 when logging of the ranking is off.
size_t itemsToLog(const TLParameters& params) {
  if (!rankingLog().enabled(platform::LogLevel::info)) return 0;
  return static_cast<size_t>(
      std::max(params.intValueForKey("ranking.rankingLogsItemCap"), int64_t{0}));
}

std::string dateText(double secondsSince1970) {
  constexpr double kMaxTime = 253402300799.0;  // the last second of year 9999
  if (!(secondsSince1970 >= 0 && secondsSince1970 <= kMaxTime)) return "(none)";
  const auto seconds = static_cast<time_t>(secondsSince1970);
  tm utc{};
  gmtime_r(&seconds, &utc);
  char text[32];
  strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S +0000", &utc);
  return text;
}

std::string rankingEntry(const TLIndexableItem& item) {
  using enum TLAttributeKey;
  const TLCard& card = *item.card();
  return fmt::format(
      "Mailid: {}\tScores: {{ Text: {:f}.\tFreshness : {:f}.\tLight : {:f}.\tFull : {:f}. "
      "}}\nSubject: "
      "{}.\nBody: {}.\ndateReceived: {}. \nAuthor(s): {}.\nX-From: {}.",
      platform::printable(item.identifier()), card.textScore(), card.freshness(), card.lightScore(),
      card.fullScore(), platform::redacted(item.stringValueForKey(SUBJECT)),
      platform::redacted(item.stringValueForKey(TEXT_CONTENT)),
      dateText(item.doubleValueForKey(MAIL_DATE_RECEIVED)),
      _stringFromTLPersons(item.personValuesForKey(AUTHORS)),
      platform::redacted(item.stringValueForKey(X_FROM)));
}

}  // namespace

struct TALIndexer::RankParams {
  RankParams(const TLParameters& params, double now)
      : queryTime(now),
        textScoreWeight(params.floatValueForKey("ranking.textScoreWeight").value_or(0.0F)),
        freshnessWeight(params.floatValueForKey("ranking.freshnessWeight").value_or(0.0F)) {}

  // The text score is rounded to float, the sum is computed in double and rounded to float again:
  // this sequence is part of the result.
  [[nodiscard]] float lightScore(float textScore, double freshness) const {
    const float text = textScoreWeight * textScore;
    return static_cast<float>(freshness * static_cast<double>(freshnessWeight) +
                              static_cast<double>(text));
  }

  double queryTime;
  float textScoreWeight;
  float freshnessWeight;
};

// One result and what its rank depends on. The item is set once it is needed.
struct TALIndexer::RankKey {
  // By scores and date only; ranksBefore decides ties by identifier.
  static bool scoresBefore(const RankKey& a, const RankKey& b) {
    if (const int order = _floatCompare(b.lightScore, a.lightScore)) return order < 0;
    return _floatCompare(b.mailDateReceived, a.mailDateReceived) < 0;
  }

  static bool ranksBefore(const RankKey& a, const RankKey& b) {
    if (scoresBefore(a, b)) return true;
    if (scoresBefore(b, a)) return false;
    return platform::orEmpty(b.item->identifier()) < platform::orEmpty(a.item->identifier());
  }

  void setDate(double date, const RankParams& params) {
    mailDateReceived = static_cast<float>(date);
    lightScore = params.lightScore(static_cast<float>(result->score),
                                   _computeFreshnessPenalty(date, params.queryTime));
  }

  const saltsearch::DocResult* result = nullptr;
  std::shared_ptr<TLIndexableItem> item = nullptr;
  float lightScore = 0;
  float mailDateReceived = 0;  // narrowed to float: dates within about two minutes tie
};

TALIndexer::Items TALIndexer::search(TLQuery& query, TLErrorOut error, size_t maxItems,
                                     size_t* count, WordReplacements* replaced) {
  if (count != nullptr) *count = 0;
  if (replaced != nullptr) replaced->clear();
  query.setSearchParams(query.hasSearchParams()
                            ? TLParamsManager::resolveOverrides(*query.searchParams(), true)
                            : TLParamsManager::getDefaultSearchParamsWithCaching(true));
  _zoneManager.setupAttributeScoresWithSearchParams(*query.searchParams());
  const auto failWith = [error](const char* message) {
    log().error("{}", message);
    _errorWithCode(TALIndexerError::query, message, error);
    return Items();
  };
  if (_queryProcessor == nullptr) return failWith("Query processor is not initialized");
  const std::vector<TALTerm> terms = _queryProcessor->termsFromQuery(query);
  if (terms.empty()) return failWith("Query processor failed to generate query terms");
  std::vector<saltsearch::Term> saltQueryTerms = _populateQueryTerms(terms);
  if (saltQueryTerms.empty()) return failWith("Failed to populate salt query terms");

  std::optional<TLError> failure;
  Found found;
  {
    MutexLock lock(_indexMutex);
    found = searchOnce(query, saltQueryTerms, maxItems, &failure);
  }
  if (failure) {
    log().error("Failed to search query in salt due to error: {}", platform::printable(failure));
    platform::setError(error, *failure);
    return {};
  }
  const int64_t threshold =
      query.searchParams()->intValueForKey("queryModification.sufficentRetrievalThreshold");
  if (_shouldRunQueryModification(found.count, threshold)) {
    found = searchModified(query, saltQueryTerms, std::move(found), maxItems, error, replaced);
  }
  if (count != nullptr) *count = found.count;
  return std::move(found.items);
}

std::vector<saltsearch::Term> TALIndexer::_populateQueryTerms(const std::vector<TALTerm>& terms) {
  std::vector<saltsearch::Term> out(terms.size());
  for (size_t i = 0; i < terms.size(); ++i) {
    const TALTerm& from = terms[i];
    saltsearch::Term& to = out[i];
    to.tokens.reserve(from.tokens().size());
    for (const TLString& token : from.tokens()) to.tokens.push_back(platform::toUTF8(token));
    to.tokenScores = from.tokenScores();
    to.zones.reserve(from.zoneIDs().size());
    for (const int32_t zone : from.zoneIDs()) to.zones.push_back(static_cast<uint16_t>(zone));
    to.zoneScores = from.zoneScores();
    to.defaultScore = from.scoreNoMatch();
    to.isUnigram = from.isUnigram();
  }
  return out;
}

TALIndexer::Found TALIndexer::searchOnce(const TLQuery& query,
                                         std::vector<saltsearch::Term>& saltQueryTerms,
                                         size_t maxItems, TLErrorOut error) {
  const auto text = _text.get();
  if (_shutdown || text == nullptr) {
    platform::setError(error, noIndexError());
    return {};
  }
  const TLParameters& params = *query.searchParams();
  const double queryTime = platform::secondsSince1970();
  const uint64_t signpost = Signpost::identifierForObject(&query);
  Signpost::begin(signpost, "Search index", "query: {}", platform::printable(query.rawQuery()));
  saltsearch::Options options;
  options.maxResults = static_cast<size_t>(params.intValueForKey("salt.maxTopK"));
  options.maxSuffixes = static_cast<size_t>(params.intValueForKey("salt.maxTermResults"));
  options.threshold = params.floatValueForKey("salt.scoreThreshold").value_or(0.0F);
  const auto results = saltsearch::Search(*text->index, saltQueryTerms, options);
  Signpost::end(signpost, "Search index", "found {} items", results.size());
  log().standard("Got {} results", results.size());
  if (results.empty()) return {};

  const RankParams ranking(params, queryTime);
  const size_t read = std::max(maxItems, itemsToLog(params));
  Signpost::begin(signpost, "retrieve items", "retrieving {} items", results.size());
  std::vector<RankKey> keys = rankKeys(results, ranking, read, error);
  Signpost::end(signpost, "retrieve items", "retrieved {} items", keys.size());
  Signpost::begin(signpost, "ranking items", "ranking {} items", keys.size());
  Found found = bestItems(keys, ranking, read, error);
  Signpost::end(signpost, "ranking items", "ranked {} items", found.count);
  logRanking(query, found);
  if (found.items.size() > maxItems) found.items.resize(maxItems);
  return found;
}

std::vector<TALIndexer::RankKey> TALIndexer::rankKeys(
    const std::vector<saltsearch::DocResult>& results, const RankParams& params, size_t maxItems,
    TLErrorOut error) {
  std::vector<RankKey> keys;
  std::vector<RankKey*> unknown;
  keys.reserve(results.size());
  for (const auto& result : results) {
    if (result.docID == 0) log().error("Invalid doc id: {}", result.docID);
    RankKey& key = keys.emplace_back(RankKey{&result});
    const auto date = results.size() > maxItems ? _docDates.find(result.docID) : std::nullopt;
    if (date) {
      key.setDate(*date, params);
    } else {
      unknown.push_back(&key);
    }
  }
  if (!retrieveItems(unknown, params, error)) return {};
  std::erase_if(keys, [](const RankKey& key) { return key.result == nullptr; });
  return keys;
}

// Reads the items of `keys`. Sets the result of a key to null if its document is not in the store.
// False, with the error, if the store failed.
bool TALIndexer::retrieveItems(const std::vector<RankKey*>& keys, const RankParams& params,
                               TLErrorOut error) {
  std::vector<uint32_t> ids;
  ids.reserve(keys.size());
  for (const RankKey* key : keys) {
    if (key->result->docID != 0) ids.push_back(key->result->docID);
  }
  std::optional<TLError> failure;
  const auto documents = docStore()->documentsWithIDs(ids, &failure);
  if (failure) {
    log().error("Internal docid {} not found in docstore, got error: {}", fmt::join(ids, ","),
                platform::printable(failure));
    platform::setError(error, *failure);
    return false;
  }
  for (RankKey* key : keys) {
    const uint32_t docID = key->result->docID;
    const auto document = documents.find(docID);
    if (document == documents.end()) {
      log().error("Internal docid {} not found in docstore. Text score: {:f}.", docID,
                  key->result->score);
      _docDates.forget(docID);
      key->result = nullptr;
      continue;
    }
    key->item = document->second;
    _fillScores(*key->item, *key->result, params);
    _docDates.set(docID, key->item->card()->mailDateReceived());
    key->setDate(key->item->card()->mailDateReceived(), params);
  }
  return true;
}

// Reads only the items that may be among the best `maxItems`: these and the ones tied with the
// last.
TALIndexer::Found TALIndexer::bestItems(std::vector<RankKey>& keys, const RankParams& params,
                                        size_t maxItems, TLErrorOut error) {
  std::stable_sort(keys.begin(), keys.end(), RankKey::scoresBefore);
  size_t end = 0;
  for (std::vector<RankKey*> unread;;) {
    end = std::min(maxItems, keys.size());
    while (end != 0 && end < keys.size() && !RankKey::scoresBefore(keys[end - 1], keys[end])) ++end;
    unread.clear();
    for (size_t i = 0; i < end; ++i) {
      if (keys[i].item == nullptr) unread.push_back(&keys[i]);
    }
    if (unread.empty()) break;
    if (!retrieveItems(unread, params, error)) return {};
    std::erase_if(keys, [](const RankKey& key) { return key.result == nullptr; });
  }
  std::stable_sort(keys.begin(), keys.begin() + static_cast<ptrdiff_t>(end), RankKey::ranksBefore);
  Found found{{}, keys.size()};
  found.items.reserve(std::min(maxItems, end));
  for (size_t i = 0; i < std::min(maxItems, end); ++i)
    found.items.push_back(std::move(keys[i].item));
  return found;
}

void TALIndexer::_fillScores(TLIndexableItem& item, const saltsearch::DocResult& indexerResult,
                             const RankParams& params) {
  item.setCard(std::make_shared<TLCard>());
  item.card()->setTextScore(static_cast<float>(indexerResult.score));
  item.card()->setLightScore(_lightWeightScoring(item, params));
}

float TALIndexer::_lightWeightScoring(const TLIndexableItem& item, const RankParams& params) {
  TLCard& card = *item.card();
  card.setMailDateReceived(item.doubleValueForKey(TLAttributeKey::MAIL_DATE_RECEIVED));
  card.setFreshness(_computeFreshnessPenalty(card.mailDateReceived(), params.queryTime));
  return params.lightScore(card.textScore(), card.freshness());
}

double TALIndexer::_computeFreshnessPenalty(double documentTime, double queryTime) {
  const double age = std::trunc(std::fmax(queryTime - documentTime, 0.0));
  const double r = std::fmax(std::log2(age / kSecondsPerDay + 1.0) - 1.0, 0.0);
  return std::fmax(r / -kFreshnessSpan, -1.0);
}

int TALIndexer::_floatCompare(float a, float b) {
  if (a == b) return 0;
  return a < b ? -1 : 1;
}

void TALIndexer::logRanking(const TLQuery& query, const Found& found) {
  if (!rankingLog().enabled(platform::LogLevel::info)) return;
  rankingLog().info("\n\nQuery: {} | Ranked {} items\n", platform::redacted(query.originalQuery()),
                    found.count);
  const size_t shown = std::min(found.items.size(), itemsToLog(*query.searchParams()));
  for (size_t i = 0; i < shown; ++i) {
    rankingLog().info("Result {} of top {}: \n{}", i + 1, shown, rankingEntry(*found.items[i]));
  }
}

std::optional<TALIndexer::Items> TALIndexer::iterateAllDocsToFindMatchingSubjects(
    const Strings& subjects, TLErrorOut error) {
  const std::unordered_set<TLString> wanted(subjects.begin(), subjects.end());
  std::unordered_set<TLString> unmatched = wanted;
  Items results;
  std::optional<TLError> failure;
  const auto store = docStore();
  const bool readAll =
      store != nullptr &&
      store->enumerateDocIDs(
          &failure, [&](int64_t, uint32_t docID, const TLURL& url, bool*, TLErrorOut) {
            std::optional<TLError> fetchError;
            const auto doc = store->documentWithID(docID, &fetchError);
            if (doc == nullptr || fetchError) {
              log().error("Error in retrieving document with docURL: {} from docstore: {}",
                          url.absoluteString(), platform::printable(fetchError));
              return;
            }
            const auto& subject = doc->stringValueForKey(TLAttributeKey::SUBJECT);
            if (!subject || !wanted.contains(*subject)) return;
            results.push_back(doc);
            unmatched.erase(*subject);
          });
  if (!readAll || failure) {
    log().error("Error in retriving via DocStore: {}", platform::printable(failure));
    if (!failure) _errorWithCode(TALIndexerError::shuttingDown, "shutting down", &failure);
    platform::setError(error, *failure);
    return std::nullopt;
  }
  for (const TLString& subject : unmatched) {
    log().standard("[Linear Search] Subject with No Doc Match: <{}>", platform::redacted(subject));
  }
  log().standard("[Linear Search] Total {} subjects received and {} found no match",
                 subjects.size(), unmatched.size());
  if (unmatched.empty()) {
    log().standard("Verification Query Successful");
  } else {
    log().fault("Verification Query Failed");
  }
  return results;
}
