#pragma once

#include <cstdint>
#include <limits>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "client/Batches.h"
#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"
#include "rpc/Channel.h"

// The client library: everything that a client program needs to talk to the daemon.
namespace client {

// A word that a search replaced because it found too little as typed.
struct ReplacedWord {
  std::string typed;
  std::string replacement;
  std::string
      reason;  // "spelling", "synonym" or "stem"; a stem stands for any word that begins with it

  bool operator==(const ReplacedWord&) const = default;
};

// The daemon's search service. Each operation waits for its reply and fails with an error of the
// daemon or of this library (see Channel.h). One thread at a time, except
// `interrupt`.
//
// A list that is too long for one call is sent in several, in order. The first failure ends the
// operation; earlier calls keep their effect.
class SearchServiceProxy {
 public:
  explicit SearchServiceProxy(const std::string& runtimeDirectory,
                              rpc::Patience patience = rpc::Patience(0))
      : _channel(runtimeDirectory, rpc::kSearchServiceName, patience) {}

  // `name` identifies the client in the daemon's log and its client state; `protectionClass`
  // selects the index.
  bool indexItems(std::span<const EncodedItem> items, const std::string& name,
                  const std::string& protectionClass, TLErrorOut error);

  bool deleteItemsWithIdentifiers(std::span<const std::string> identifiers, const std::string& name,
                                  const std::string& protectionClass, TLErrorOut error);

  // Deletes, then indexes, then stores the state, if given. The state is sent with the last call,
  // so it is stored only after everything else has succeeded.
  bool indexItems(std::span<const EncodedItem> items, std::span<const std::string> identifiers,
                  const std::optional<std::string>& clientState, const std::string& name,
                  const std::string& protectionClass, TLErrorOut error);

  // The last stored state; null without an error if there is none.
  [[nodiscard]] std::optional<std::string> fetchLastClientState(const std::string& name,
                                                                const std::string& protectionClass,
                                                                TLErrorOut error);

  bool deleteItemsWithDomainIdentifiers(std::span<const std::string> domainIdentifiers,
                                        const std::string& name, const std::string& protectionClass,
                                        TLErrorOut error);

  bool deleteAllItems(const std::string& name, const std::string& protectionClass,
                      TLErrorOut error);

  using Items = std::vector<std::shared_ptr<TLIndexableItem>>;
  static constexpr int64_t kNoMaximum = std::numeric_limits<int64_t>::max();

  // Best first; nullopt on failure, for example if the query is too large for a call (see
  // `encode`).
  [[nodiscard]] std::optional<Items> searchItems(const TLQuery& query, uint64_t options,
                                                 const std::string& protectionClass,
                                                 int64_t maxResults, TLErrorOut error);

  // The words that the last search of this proxy replaced. Nullopt on failure, also if the daemon
  // does not support it or the connection has changed since the search.
  [[nodiscard]] std::optional<std::vector<ReplacedWord>> replacedWords(TLErrorOut error);

  // From any thread: ends the current operation and prevents later ones.
  void interrupt() { _channel.interrupt(); }

 private:
  bool callWithTexts(const char* member, std::span<const std::string> texts,
                     const std::string& name, const std::string& protectionClass, TLErrorOut error);

  rpc::Channel _channel;
};

}  // namespace client
