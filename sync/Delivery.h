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

// The client state that the daemon stores: which catalogue's batches it has, and up to which
// number.
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

// Sends the waiting changes of a catalogue to the daemon, deletions first.
//
// Every call is recorded in the catalogue before it is made, with the number of its batch. A batch
// ends with a call that stores its number as the client state. So a change whose number is above
// the daemon's state may or may not be in the index: it is deleted and sent again, and an unknown
// identifier is not an error then. A batch ends after kStateInterval, because the daemon syncs its
// files for each state.
//
// One thread.
class Delivery {
 public:
  static constexpr std::chrono::milliseconds kStateInterval{2000};

  struct Target {
    std::string name;
    std::string protectionClass;
    uint64_t largestMessage = 0;      // larger ones fail; 0 for no limit
    int64_t firstMessage = 0;         // its ID in the catalogue; earlier ones keep waiting
    std::string extractProgram = {};  // see ItemReader
  };
  struct Observer {
    std::function<void(const std::string& where, const std::string& reason)> complain;
    std::function<void(const DeliveryCounts& counts)> progress;
    std::function<bool()> cancelled;
  };

  Delivery(Catalogue& catalogue, client::SearchServiceProxy& service, Target target,
           Observer observer);

  // Sends everything from `firstMessage` on. False with an error if the daemon or the catalogue
  // failed; acknowledged changes are kept. If cancelled, it finishes the current call and returns
  // in a consistent state. `storedState` is the daemon's current state; a new one is stored only if
  // it differs.
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
  int64_t _sequence = 0;  // of the current batch
  bool _open = false;     // a part of it has been sent
  std::chrono::steady_clock::time_point _lastState;
};

}  // namespace mailsync
