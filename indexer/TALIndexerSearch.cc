#include <algorithm>
#include <cmath>
#include <ctime>
#include <unordered_set>
#include <utility>

#include "indexer/TALIndexer.h"
#include "platform/Clock.h"
#include "platform/Redaction.h"
#include "platform/Signpost.h"
#include "records/TLParamsManager.h"

using platform::MutexLock;
using platform::Signpost;

namespace {

constexpr double kSecondsPerDay = 86400.0;
// log2 of the age in days, plus 1, at which the freshness penalty is at its end.
constexpr double kFreshnessSpan = 7.52;

const platform::Log& rankingLog() {
  static const platform::Log handle("com.quill.tallow.ranking", "TALIndexer");
  return handle;
}

// What the order of results depends on, read from an item once.
struct RankKey {
  float lightScore;
  float mailDateReceived;  // narrowed: dates within about two minutes tie
  std::shared_ptr<TLIndexableItem> item;
};

bool ranksBefore(const RankKey& a, const RankKey& b) {
  if (const int order = TALIndexer::_floatCompare(b.lightScore, a.lightScore)) return order < 0;
  if (const int order = TALIndexer::_floatCompare(b.mailDateReceived, a.mailDateReceived)) {
    return order < 0;
  }
  return platform::orEmpty(b.item->identifier()) < platform::orEmpty(a.item->identifier());
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

std::string dateText(double secondsSince1970) {
  constexpr double kLatest = 253402300799.0;  // the last second of year 9999
  if (!(secondsSince1970 >= 0 && secondsSince1970 <= kLatest)) return "(none)";
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

TALIndexer::Items TALIndexer::search(TLQuery& query, TLErrorOut error) {
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
  Items items;
  {
    MutexLock lock(_indexMutex);
    items = searchOnce(query, saltQueryTerms, &failure);
  }
  if (failure) {
    log().error("Failed to search query in salt due to error: {}", platform::printable(failure));
    platform::setError(error, *failure);
    return {};
  }
  const int64_t threshold =
      query.searchParams()->intValueForKey("queryModification.sufficentRetrievalThreshold");
  if (!_shouldRunQueryModification(items, threshold)) return items;
  return searchModified(query, saltQueryTerms, std::move(items), error);
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

TALIndexer::Items TALIndexer::searchOnce(const TLQuery& query,
                                         std::vector<saltsearch::Term>& saltQueryTerms,
                                         TLErrorOut error) {
  if (_shutdown || _textStore == nullptr) {
    _errorWithCode(TALIndexerError::shuttingDown, "shutting down", error);
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
  const auto results = saltsearch::Search(*_textStore, saltQueryTerms, options);
  Signpost::end(signpost, "Search index", "found {} items", results.size());
  log().standard("Got {} results", results.size());
  if (results.empty()) return {};

  Items items = retrieveItems(results, query, queryTime, error);
  Signpost::begin(signpost, "ranking items", "ranking {} items", items.size());
  rankItems(items);
  Signpost::end(signpost, "ranking items", "ranked {} items", items.size());
  logRanking(query, items);
  return items;
}

TALIndexer::Items TALIndexer::retrieveItems(const std::vector<saltsearch::DocResult>& results,
                                            const TLQuery& query, double queryTime,
                                            TLErrorOut error) {
  const uint64_t signpost = Signpost::identifierForObject(&query);
  Signpost::begin(signpost, "retrieve items", "retrieving {} items", results.size());
  std::vector<uint32_t> ids;
  ids.reserve(results.size());
  for (const auto& result : results) {
    if (result.docID == 0) {
      log().error("Invalid doc id: {}", result.docID);
    } else {
      ids.push_back(result.docID);
    }
  }
  Items items;
  std::optional<TLError> failure;
  const auto documents = docStore()->documentsWithIDs(ids, &failure);
  if (failure) {
    log().error("Internal docid {} not found in docstore, got error: {}", fmt::join(ids, ","),
                platform::printable(failure));
    platform::setError(error, *failure);
  } else {
    const float textScoreWeight =
        query.searchParams()->floatValueForKey("ranking.textScoreWeight").value_or(0.0F);
    const float freshnessWeight =
        query.searchParams()->floatValueForKey("ranking.freshnessWeight").value_or(0.0F);
    items.reserve(results.size());
    for (const auto& result : results) {
      const auto document = documents.find(result.docID);
      if (document == documents.end()) {
        log().error("Internal docid {} not found in docstore. Text score: {:f}.", result.docID,
                    result.score);
        continue;
      }
      _fillScores(*document->second, result, queryTime, textScoreWeight, freshnessWeight);
      items.push_back(document->second);
    }
  }
  Signpost::end(signpost, "retrieve items", "retrieved {} items", items.size());
  return items;
}

void TALIndexer::_fillScores(TLIndexableItem& item, const saltsearch::DocResult& indexerResult,
                             double queryTime, float textScoreWeight, float freshnessWeight) {
  item.setCard(std::make_shared<TLCard>());
  item.card()->setTextScore(static_cast<float>(indexerResult.score));
  item.card()->setLightScore(
      _lightWeightScoring(item, queryTime, textScoreWeight, freshnessWeight));
}

// The text product is rounded to float, the sum made in double, and rounded to float again: the
// order is part of the result.
float TALIndexer::_lightWeightScoring(const TLIndexableItem& item, double queryTime,
                                      float textScoreWeight, float freshnessWeight) {
  TLCard& card = *item.card();
  card.setMailDateReceived(item.doubleValueForKey(TLAttributeKey::MAIL_DATE_RECEIVED));
  card.setFreshness(_computeFreshnessPenalty(card.mailDateReceived(), queryTime));
  const float text = textScoreWeight * card.textScore();
  return static_cast<float>(card.freshness() * static_cast<double>(freshnessWeight) +
                            static_cast<double>(text));
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

void TALIndexer::rankItems(Items& items) {
  std::vector<RankKey> keys;
  keys.reserve(items.size());
  for (auto& item : items) {
    const float light = item->card()->lightScore();
    const auto date = static_cast<float>(item->card()->mailDateReceived());
    keys.push_back({light, date, std::move(item)});
  }
  std::stable_sort(keys.begin(), keys.end(), ranksBefore);
  for (size_t i = 0; i < items.size(); ++i) items[i] = std::move(keys[i].item);
}

void TALIndexer::logRanking(const TLQuery& query, const Items& items) {
  if (!rankingLog().enabled(platform::LogLevel::info)) return;
  rankingLog().info("\n\nQuery: {} | Ranked {} items\n", platform::redacted(query.originalQuery()),
                    items.size());
  const int64_t cap = query.searchParams()->intValueForKey("ranking.rankingLogsItemCap");
  const size_t shown = cap < 0 ? 0 : std::min(items.size(), static_cast<size_t>(cap));
  for (size_t i = 0; i < shown; ++i) {
    rankingLog().info("Result {} of top {}: \n{}", i + 1, shown, rankingEntry(*items[i]));
  }
}

std::optional<TALIndexer::Items> TALIndexer::iterateAllDocsToFindMatchingSubjects(
    const Strings& subjects, TLErrorOut error) {
  const std::unordered_set<TLString> wanted(subjects.begin(), subjects.end());
  std::unordered_set<TLString> unmatched = wanted;
  Items results;
  std::optional<TLError> failure;
  const auto store = docStore();
  const bool walked =
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
  if (!walked) {
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
