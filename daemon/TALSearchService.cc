#include "daemon/TALSearchService.h"

#include <unistd.h>

#include <array>
#include <climits>
#include <limits>
#include <utility>

#include "daemon/VerificationQuery.h"
#include "platform/Clock.h"
#include "platform/Redaction.h"
#include "platform/Signpost.h"

using platform::MutexLock;
using platform::Signpost;

namespace {

constexpr const char* kBundleID = "mail_bundle_id";
constexpr const char* kEmpty = "<empty>";
constexpr uint64_t kSearchOptionTopHit = 1;
constexpr size_t kExecutablePathSize = 4096;

std::string executablePath() {
  std::array<char, kExecutablePathSize> buffer;
  const ssize_t size = readlink("/proc/self/exe", buffer.data(), buffer.size());
  return size > 0 ? std::string(buffer.data(), static_cast<size_t>(size)) : "tallowsearchd";
}

std::string hostName() {
  std::array<char, HOST_NAME_MAX + 1> buffer{};
  gethostname(buffer.data(), buffer.size() - 1);
  return buffer.data();
}

}  // namespace

const platform::Log& TALSearchService::log() {
  static const platform::Log handle(platform::kSubsystem, "TALSearchService");
  return handle;
}

TALSearchService::TALSearchService(std::shared_ptr<TALIndexerManager> indexerManager)
    : _indexerManager(std::move(indexerManager)) {}

std::string TALSearchService::cleanName(const std::string& name) {
  return name.empty() ? kEmpty : name;
}

std::string TALSearchService::cleanProtectionClass(const std::string& protectionClass) {
  return protectionClass.empty() ? kEmpty : protectionClass;
}

std::string TALSearchService::_searchDescriptionWithOptions(uint64_t options, int64_t maxResults) {
  const std::string maximum = maxResults == std::numeric_limits<int64_t>::max()
                                  ? "SysIntegerMax"
                                  : std::to_string(maxResults);
  const char* names =
      (options & kSearchOptionTopHit) != 0 ? "TLSearchOptionTopHit" : "TLSearchOptionNone";
  return fmt::format("<maxResults={}, options={}>", maximum, names);
}

std::shared_ptr<TALIndexer> TALSearchService::indexerFor(const std::string& protectionClass,
                                                         TLErrorOut error) {
  std::shared_ptr<TALIndexerManager> manager;
  {
    MutexLock lock(_mutex);
    manager = _indexerManager;
  }
  return manager == nullptr ? nullptr : manager->indexerWithProtectionClass(protectionClass, error);
}

void TALSearchService::runItemOperation(
    const std::string& description, const std::string& protectionClass, TLErrorReply reply,
    const std::function<void(TALIndexer&, TALIndexer::Completion)>& operation) {
  const uint64_t start = platform::monotonicTicks();
  log().standard("Requested {}", description);
  std::optional<TLError> error;
  const auto indexer = indexerFor(protectionClass, &error);
  if (error) {
    log().error("Failed {}, error={}", description, platform::printable(error));
    reply(error);
    return;
  }
  if (indexer == nullptr) return;
  operation(*indexer,
            [description, start, reply = std::move(reply)](const std::optional<TLError>& outcome) {
              reply(outcome);
              log().standard("Finished {}, timeTaken={} ms", description,
                             elapsedMillisSinceMonotonicTime(start));
            });
}

void TALSearchService::indexItems(Items items, const std::string& toIndexerNamed,
                                  const std::string& protectionClass, TLErrorReply reply) {
  runItemOperation(
      fmt::format("indexItems numDocuments={}, callerName={}, protectionClass={}", items.size(),
                  cleanName(toIndexerNamed), cleanProtectionClass(protectionClass)),
      protectionClass, std::move(reply),
      [&](TALIndexer& indexer, TALIndexer::Completion completion) {
        indexer.addDocs(std::move(items), kBundleID, std::move(completion));
      });
}

void TALSearchService::deleteItemsWithIdentifiers(Strings identifiers,
                                                  const std::string& fromIndexerNamed,
                                                  const std::string& protectionClass,
                                                  TLErrorReply reply) {
  runItemOperation(
      fmt::format("deleteItemsWithIdentifiers numDocuments={}, callerName={}, protectionClass={}",
                  identifiers.size(), cleanName(fromIndexerNamed),
                  cleanProtectionClass(protectionClass)),
      protectionClass, std::move(reply),
      [&](TALIndexer& indexer, TALIndexer::Completion completion) {
        indexer.deleteItemsByIdentifiers(std::move(identifiers), kBundleID, std::move(completion));
      });
}

void TALSearchService::deleteItemsWithDomainIdentifiers(Strings domainIdentifiers,
                                                        const std::string& fromIndexerNamed,
                                                        const std::string& protectionClass,
                                                        TLErrorReply reply) {
  runItemOperation(
      fmt::format(
          "deleteItemsWithDomainIdentifiers numDocuments={}, callerName={}, protectionClass={}",
          domainIdentifiers.size(), cleanName(fromIndexerNamed),
          cleanProtectionClass(protectionClass)),
      protectionClass, std::move(reply),
      [&](TALIndexer& indexer, TALIndexer::Completion completion) {
        indexer.deleteItemsByDomainIdentifiers(std::move(domainIdentifiers), std::move(completion));
      });
}

void TALSearchService::deleteAllItemsFromIndexerNamed(const std::string& name,
                                                      const std::string& protectionClass,
                                                      TLErrorReply reply) {
  runItemOperation(fmt::format("deleteAllItemsFromIndexerNamed callerName={}, protectionClass={}",
                               cleanName(name), cleanProtectionClass(protectionClass)),
                   protectionClass, std::move(reply),
                   [](TALIndexer& indexer, TALIndexer::Completion completion) {
                     indexer.resetWithCompletionHandler(std::move(completion));
                   });
}

void TALSearchService::indexItems(Items items, Strings deleteItemsWithIdentifiers,
                                  std::optional<std::string> clientState,
                                  const std::string& toIndexerNamed,
                                  const std::string& protectionClass, TLErrorReply reply) {
  const std::string name = cleanName(toIndexerNamed);
  const std::string shownClass = cleanProtectionClass(protectionClass);
  const size_t count = items.size();
  log().standard("indexItems: {}, deleteItems: {}, for name={}, protectionClass={}", count,
                 deleteItemsWithIdentifiers.size(), name, shownClass);
  std::optional<TLError> error;
  const auto indexer = indexerFor(protectionClass, &error);
  if (error) return reply(error);
  if (indexer == nullptr) return;
  indexer->addDocs(
      std::move(items), std::move(deleteItemsWithIdentifiers), std::move(clientState),
      platform::fromUTF8(toIndexerNamed), kBundleID,
      [count, name, shownClass, reply = std::move(reply)](const std::optional<TLError>& outcome) {
        reply(outcome);
        log().standard("indexItems done for {} documents for name={}, protectionClass={}", count,
                       name, shownClass);
      });
}

void TALSearchService::fetchLastClientStateFromIndexerNamed(
    const std::string& name, const std::string& protectionClass,
    const std::function<void(const std::optional<std::string>&, const std::optional<TLError>&)>&
        reply) {
  const std::string shownClass = cleanProtectionClass(protectionClass);
  log().standard("fetchLastClientStateWithCompletionHandler requested for protectionClass={}",
                 shownClass);
  std::optional<TLError> error;
  const auto indexer = indexerFor(protectionClass, &error);
  if (error) return reply(std::nullopt, error);
  if (indexer == nullptr) return;
  indexer->fetchLastClientStateforName(
      platform::fromUTF8(name),
      [&](const std::optional<std::string>& state, const std::optional<TLError>& outcome) {
        reply(state, outcome);
        log().standard("fetchLastClientStateWithCompletionHandler done for protectionClass={}",
                       shownClass);
      });
}

void TALSearchService::searchItemsForQuery(
    TLQuery& query, uint64_t withOption, const std::string& forProtectionClass, int64_t maxResults,
    const std::function<void(const std::optional<Items>&, const std::optional<TLError>&)>& reply,
    WordReplacements* replaced) {
  if (replaced != nullptr) replaced->clear();
  const uint64_t start = platform::monotonicTicks();
  const std::string description =
      fmt::format("searchItemsForQuery query={}, context={}, protectionClass={}",
                  platform::redacted(query.originalQuery()),
                  _searchDescriptionWithOptions(withOption, maxResults),
                  cleanProtectionClass(forProtectionClass));
  log().standard("Requested {}", description);
  const uint64_t signpost = Signpost::identifierForObject(&query);
  Signpost::begin(signpost, "SearchQuery", "query {}", platform::printable(query.rawQuery()));
  std::optional<TLError> error;
  const auto indexer = indexerFor(forProtectionClass, &error);
  if (error) {
    log().error("Failed {}, error={}", description, platform::printable(error));
    return reply(std::nullopt, error);
  }
  if (indexer == nullptr) return;

  if (isMailVerificationQuery(&query)) {
    log().standard("Query: [{}] detected to be a Verification Query",
                   platform::redacted(query.rawQuery()));
    const Strings subjects = subjectsFromRawQuery(platform::orEmpty(query.rawQuery()));
    const auto found = handleVerificationQueryWithIndexer(*indexer, query, subjects, &error);
    if (error) {
      log().error("[Verification Query] Search failed with error={}", platform::printable(error));
      return reply(std::nullopt, error);
    }
    Signpost::end(signpost, " [Verification Query] ", " query {} found {} items",
                  platform::redacted(query.rawQuery()), found->size());
    log().standard("Finished {}, results={}, timeTaken={} ms", description, found->size(),
                   elapsedMillisSinceMonotonicTime(start));
    return reply(found, std::nullopt);
  }

  size_t count = 0;
  Items items = indexer->search(query, &error, static_cast<uint64_t>(maxResults), &count, replaced);
  Signpost::end(signpost, "SearchQuery", "query {} found {} items",
                platform::redacted(query.rawQuery()), count);
  log().standard("Finished {}, results={}, timeTaken={} ms", description, items.size(),
                 elapsedMillisSinceMonotonicTime(start));
  reply(std::move(items), error);
}

void TALSearchService::ping(const std::string& input,
                            const std::function<void(const std::string&)>& reply) {
  log().standard("ping requested with input: {}", input);
  std::string path;
  {
    MutexLock lock(_mutex);
    if (_indexerManager != nullptr) path = _indexerManager->path();
  }
  reply(fmt::format("Received {}\nCmd: {}\nPid: {}\nHost: {}\nPersistent path: {}\n", input,
                    executablePath(), getpid(), hostName(), path));
  log().standard("ping done with input: {}", input);
}

void TALSearchService::fetchStatsForIndexerNamed(
    const std::string& name, const std::string& protectionClass,
    const std::function<void(const nlohmann::json&, const std::optional<TLError>&)>& reply) {
  log().standard("fetchStatsForIndexerNamed requested for name={}, protectionClass={}",
                 cleanName(name), cleanProtectionClass(protectionClass));
  std::optional<TLError> error;
  const auto indexer = indexerFor(protectionClass, &error);
  if (error) return reply(nullptr, error);
  if (indexer != nullptr) reply(indexer->docStats(), std::nullopt);
}

void TALSearchService::fetchStatsForSaltNamed(
    const std::string& name, const std::string& protectionClass,
    const std::function<void(const std::optional<std::string>&, const std::optional<TLError>&)>&
        reply) {
  log().standard("fetchStatsForSaltNamed requested for name={}, protectionClass={}",
                 cleanName(name), cleanProtectionClass(protectionClass));
  std::optional<TLError> error;
  const auto indexer = indexerFor(protectionClass, &error);
  if (error) return reply(std::nullopt, error);
  if (indexer != nullptr) reply(indexer->saltMetrics(), std::nullopt);
}

void TALSearchService::forceVacuumAndCompactForProtectionClass(const std::string& protectionClass,
                                                               TLErrorReply reply) {
  log().standard("vacuumAndCompactForProtectionClass requested for protectionClass={}",
                 cleanProtectionClass(protectionClass));
  std::optional<TLError> error;
  const auto indexer = indexerFor(protectionClass, &error);
  if (error) return reply(error);
  if (indexer != nullptr) indexer->saltVacuumAndCompactWithCompletionHandler(std::move(reply));
}

void TALSearchService::shutdown() {
  log().standard("Shutting down SearchService...");
  std::shared_ptr<TALIndexerManager> manager;
  {
    MutexLock lock(_mutex);
    manager = _indexerManager;
  }
  if (manager != nullptr) {
    for (const auto& indexer : manager->allIndexers()) indexer->shutdown();
  }
  {
    MutexLock lock(_mutex);
    _indexerManager = nullptr;
  }
  log().standard("SearchService has shut down");
}
