#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "cli/BatchPace.h"
#include "client/SearchServiceProxy.h"
#include "sync/Catalogue.h"
#include "sync/ItemReader.h"

namespace mailsync {

// What the daemon keeps for us beside the index: which catalogue's batches it has, and up to which.
struct DeliveredState {
  std::string catalogue;
  int64_t sequence = 0;

  [[nodiscard]] std::string text() const;
  [[nodiscard]] static std::optional<DeliveredState> parse(const std::string& text);
};

struct DeliveryCounts {
  uint64_t added = 0;
  uint64_t replaced = 0;
  uint64_t deleted = 0;
  uint64_t failed = 0;
  uint64_t cut = 0;
};

// Sends what waits in a catalogue to the daemon, deletions first.
//
// Every call is noted in the catalogue before it is made, under the number of the batch that it
// belongs to, and a batch ends with a call that stores its number as the client state. So whatever
// is noted with a number above the daemon's state may be in the index or not, and is deleted and
// sent again; an identifier that the index does not have is no error then. A batch ends when
// kStateInterval has passed, since the daemon syncs its files for each state.
//
// One thread.
class Delivery {
 public:
  static constexpr std::chrono::milliseconds kStateInterval{2000};

  struct Target {
    std::string name;
    std::string protectionClass;
    uint64_t largestMessage = 0;  // larger ones fail; 0 for no limit
    int64_t firstMessage = 0;     // of the catalogue; those before it stay waiting
  };
  struct Observer {
    std::function<void(const std::string& where, const std::string& reason)> complain;
    std::function<void(const DeliveryCounts& counts)> progress;
    std::function<bool()> cancelled;
  };

  Delivery(Catalogue& catalogue, client::SearchServiceProxy& service, Target target,
           Observer observer);

  // Sends all of it from `firstMessage` on. False with an error when the daemon or the catalogue
  // has failed; what the daemon has acknowledged stays. Cancelled, it ends after the call in hand,
  // in order. `storedState` is what the daemon has now; a state is stored only where it would
  // differ.
  bool run(const std::optional<DeliveredState>& storedState, TLErrorOut error);

  [[nodiscard]] const DeliveryCounts& counts() const { return _counts; }

 private:
  using Items = std::span<const ReadBatch::Item>;

  bool sendDeletions(TLErrorOut error);
  bool sendMessages(TLErrorOut error);
  bool sendBatch(const ReadBatch& batch, TLErrorOut error);
  bool sendPiece(Items items, TLErrorOut error);
  bool sendSingly(Items items, TLErrorOut error);
  bool deleteSingly(const std::vector<std::string>& identifiers, TLErrorOut error);
  bool call(std::span<const client::EncodedItem> items, const std::vector<std::string>& deletions,
            bool withState, TLErrorOut error);
  bool note(const std::function<void()>& write, TLErrorOut error);
  [[nodiscard]] bool stateIsDue() const;

  Catalogue& _catalogue;
  client::SearchServiceProxy& _service;
  const Target _target;
  const Observer _observer;
  DeliveryCounts _counts;
  cli::BatchPace _pace;
  int64_t _sequence = 0;  // of the batch in hand
  bool _open = false;     // something of it has been sent
  std::chrono::steady_clock::time_point _lastState;
};

}  // namespace mailsync
