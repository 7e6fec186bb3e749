#pragma once

#include <functional>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "daemon/TALIndexerManager.h"
#include "platform/Log.h"
#include "platform/Mutex.h"
#include "records/TLQuery.h"

using TLErrorReply = std::function<void(const std::optional<TLError>&)>;

// Implements both RPC services. For each request it finds the indexer of the protection class,
// calls it, and passes the outcome to the reply. It creates no errors of its own.
//
// The indexer name that clients pass does not select an indexer: it is logged, and it is the name
// of the client state. A verification query (daemon/VerificationQuery.h) is answered by exact
// comparison.
//
// Threads: every operation runs on the caller's thread, and several may run at once. Item
// operations return at once and reply from the indexer's queue; searches and statistics reply
// before they return. After `shutdown` a request gets no indexer, and its reply is not called.
class TALSearchService {
 public:
  using Items = TALIndexer::Items;
  using Strings = TALIndexer::Strings;

  explicit TALSearchService(std::shared_ptr<TALIndexerManager> indexerManager);

  // The search service.
  void indexItems(Items items, const std::string& toIndexerNamed,
                  const std::string& protectionClass, TLErrorReply reply);
  void deleteItemsWithIdentifiers(Strings identifiers, const std::string& fromIndexerNamed,
                                  const std::string& protectionClass, TLErrorReply reply);
  void indexItems(Items items, Strings deleteItemsWithIdentifiers,
                  std::optional<std::string> clientState, const std::string& toIndexerNamed,
                  const std::string& protectionClass, TLErrorReply reply);
  void fetchLastClientStateFromIndexerNamed(
      const std::string& name, const std::string& protectionClass,
      const std::function<void(const std::optional<std::string>&, const std::optional<TLError>&)>&
          reply);
  void deleteItemsWithDomainIdentifiers(Strings domainIdentifiers,
                                        const std::string& fromIndexerNamed,
                                        const std::string& protectionClass, TLErrorReply reply);
  void deleteAllItemsFromIndexerNamed(const std::string& name, const std::string& protectionClass,
                                      TLErrorReply reply);
  // The items are null only together with an error. The resolved parameters are written into the
  // query. `maxResults` is compared as unsigned, so a negative value truncates nothing. `replaced`,
  // which may be null, receives the words that were replaced for these results; it is complete when
  // the operation returns.
  void searchItemsForQuery(
      TLQuery& query, uint64_t withOption, const std::string& forProtectionClass,
      int64_t maxResults,
      const std::function<void(const std::optional<Items>&, const std::optional<TLError>&)>& reply,
      WordReplacements* replaced = nullptr);

  // The debug service.
  void ping(const std::string& input, const std::function<void(const std::string&)>& reply);
  void fetchStatsForIndexerNamed(
      const std::string& name, const std::string& protectionClass,
      const std::function<void(const nlohmann::json&, const std::optional<TLError>&)>& reply);
  void fetchStatsForSaltNamed(const std::string& name, const std::string& protectionClass,
                              const std::function<void(const std::optional<std::string>&,
                                                       const std::optional<TLError>&)>& reply);
  void forceVacuumAndCompactForProtectionClass(const std::string& protectionClass,
                                               TLErrorReply reply);

  // Shuts down the indexers one after another and waits for each.
  void shutdown();

  // "<empty>" for an empty text, so that log lines have no empty fields.
  [[nodiscard]] static std::string cleanName(const std::string& name);
  [[nodiscard]] static std::string cleanProtectionClass(const std::string& protectionClass);
  [[nodiscard]] static std::string _searchDescriptionWithOptions(uint64_t options,
                                                                 int64_t maxResults);

  static const platform::Log& log();

 private:
  // Null without an error after `shutdown`.
  std::shared_ptr<TALIndexer> indexerFor(const std::string& protectionClass, TLErrorOut error);
  // The common part of the four item operations.
  void runItemOperation(const std::string& description, const std::string& protectionClass,
                        TLErrorReply reply,
                        const std::function<void(TALIndexer&, TALIndexer::Completion)>& operation);

  mutable platform::Mutex _mutex;
  std::shared_ptr<TALIndexerManager> _indexerManager TL_GUARDED_BY(_mutex);
};
