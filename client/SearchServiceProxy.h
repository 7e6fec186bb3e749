#pragma once

#include <cstdint>
#include <limits>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "client/Batches.h"
#include "client/Channel.h"
#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"

namespace client {

inline constexpr const char* kSearchServiceName = "com.quill.tallowsearch.SearchService";
inline constexpr const char* kSearchExplanationName = "com.quill.tallowsearch.SearchExplanation";

// A word that a search replaced, since it found too little as typed.
struct ReplacedWord {
  std::string typed;
  std::string replacement;
  std::string reason;  // "spelling", "synonym" or "stem"; of a stem, any word that begins so counts

  bool operator==(const ReplacedWord&) const = default;
};

// The search service of the daemon. Each operation waits for its reply and fails with an error of
// the daemon or of this library (see Channel.h). One thread at a time.
//
// A list that is too long for one call goes out in several, in order, and the first failure ends
// it; what earlier calls did stays done.
class SearchServiceProxy {
 public:
  explicit SearchServiceProxy(const std::string& runtimeDirectory, Patience patience = Patience(0))
      : _channel(runtimeDirectory, kSearchServiceName, patience) {}

  // `name` names the client in the daemon's log and its state; `protectionClass` chooses the index.
  bool indexItems(std::span<const EncodedItem> items, const std::string& name,
                  const std::string& protectionClass, TLErrorOut error);

  bool deleteItemsWithIdentifiers(std::span<const std::string> identifiers, const std::string& name,
                                  const std::string& protectionClass, TLErrorOut error);

  // Deletes, then indexes, then stores the state, if given. The state goes with the last call, so
  // it is stored only after all else has succeeded.
  bool indexItems(std::span<const EncodedItem> items, std::span<const std::string> identifiers,
                  const std::optional<std::string>& clientState, const std::string& name,
                  const std::string& protectionClass, TLErrorOut error);

  // The state that was stored last; null where there is none and no error.
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

  // Best first; none after a failure, such as a query that is too large for a call (see `encode`).
  [[nodiscard]] std::optional<Items> searchItems(const TLQuery& query, uint64_t options,
                                                 const std::string& protectionClass,
                                                 int64_t maxResults, TLErrorOut error);

  // What the last search of this proxy replaced; none after a failure, as of a daemon that does not
  // tell, or where the connection is another one than the search had.
  [[nodiscard]] std::optional<std::vector<ReplacedWord>> replacedWords(TLErrorOut error);

 private:
  bool callWithTexts(const char* member, std::span<const std::string> texts,
                     const std::string& name, const std::string& protectionClass, TLErrorOut error);

  Channel _channel;
};

}  // namespace client
