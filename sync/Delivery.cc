#include "sync/Delivery.h"

#include <fmt/format.h>

#include <algorithm>
#include <charconv>

#include "cli/ErrorText.h"

namespace mailsync {

namespace {

constexpr std::string_view kStatePrefix = "tallow-sync 1 ";

constexpr size_t kDeletionsOfACall = 500;
constexpr size_t kMessagesOfAReader = 5000;

}  // namespace

std::string DeliveredState::text() const {
  return fmt::format("{}{} {}", kStatePrefix, catalogue, sequence);
}

std::optional<DeliveredState> DeliveredState::parse(const std::string& text) {
  const size_t space = text.rfind(' ');
  if (!text.starts_with(kStatePrefix) || space < kStatePrefix.size()) return std::nullopt;
  DeliveredState state;
  state.catalogue = text.substr(kStatePrefix.size(), space - kStatePrefix.size());
  const char* const end = text.data() + text.size();
  const auto result = std::from_chars(text.data() + space + 1, end, state.sequence);
  const bool good = result.ec == std::errc() && result.ptr == end && state.sequence >= 0;
  return good ? std::optional(state) : std::nullopt;
}

Delivery::Delivery(Catalogue& catalogue, client::SearchServiceProxy& service, Target target,
                   Observer observer)
    : _catalogue(catalogue),
      _service(service),
      _target(std::move(target)),
      _observer(std::move(observer)),
      _sequence(catalogue.highestSequence() + 1),
      _lastState(std::chrono::steady_clock::now()) {}

bool Delivery::run(const std::optional<DeliveredState>& storedState, TLErrorOut error) {
  // The state may differ although nothing waits: the index was found to match.
  _open = !storedState || storedState->catalogue != _catalogue.id() ||
          storedState->sequence != _catalogue.acknowledged();
  if (!sendDeletions(error) || !sendMessages(error)) return false;
  if (_open && !call({}, {}, true, error)) return false;
  return note([&] { _catalogue.forgetOldDeletions(); }, error);
}

bool Delivery::note(const std::function<void()>& write, TLErrorOut error) {
  _catalogue.begin();
  write();
  if (_catalogue.commit()) return true;
  platform::setError(error, *_catalogue.failure());
  return false;
}

bool Delivery::stateIsDue() const {
  return std::chrono::steady_clock::now() - _lastState >= kStateInterval;
}

// A call that stores the state ends the batch.
bool Delivery::call(std::span<const client::EncodedItem> items,
                    const std::vector<std::string>& deletions, bool withState, TLErrorOut error) {
  _open = true;
  std::optional<std::string> state;
  if (withState) state = DeliveredState{_catalogue.id(), _sequence}.text();
  if (!_service.indexItems(items, deletions, state, _target.name, _target.protectionClass, error)) {
    return false;
  }
  if (!withState) return true;
  _open = false;
  _lastState = std::chrono::steady_clock::now();
  return note([&] { _catalogue.setAcknowledged(_sequence++); }, error);
}

bool Delivery::sendDeletions(TLErrorOut error) {
  std::vector<std::string> all = _catalogue.waitingDeletions();
  std::span<const std::string> rest(all);
  while (!rest.empty() && !_observer.cancelled()) {
    const auto piece = rest.first(std::min(kDeletionsOfACall, rest.size()));
    const std::vector<std::string> deletions(piece.begin(), piece.end());
    const bool noted = note(
        [&] {
          for (const std::string& identifier : deletions) {
            _catalogue.setDeletionSequence(identifier, _sequence);
          }
        },
        error);
    if (!noted) return false;
    std::optional<TLError> failure;
    if (!call({}, deletions, stateIsDue(), &failure)) {
      if (!cli::isNotIndexed(*failure)) {
        platform::setError(error, *failure);
        return false;
      }
      if (!deleteSingly(deletions, error)) return false;
    }
    _counts.deleted += deletions.size();
    _observer.progress(_counts);
    rest = rest.subspan(piece.size());
  }
  return true;
}

// For a list that failed at an identifier unknown to the index.
bool Delivery::deleteSingly(const std::vector<std::string>& identifiers, TLErrorOut error) {
  for (const std::string& identifier : identifiers) {
    std::optional<TLError> failure;
    if (!_service.deleteItemsWithIdentifiers(std::span(&identifier, 1), _target.name,
                                             _target.protectionClass, &failure) &&
        !cli::isNotIndexed(*failure)) {
      platform::setError(error, *failure);
      return false;
    }
  }
  return true;
}

bool Delivery::sendMessages(TLErrorOut error) {
  const std::vector<int64_t> ids = _catalogue.waitingIDs(_target.firstMessage);
  for (size_t begin = 0; begin < ids.size() && !_observer.cancelled();) {
    std::vector<WaitingMessage> messages;
    for (; begin < ids.size() && messages.size() < kMessagesOfAReader; ++begin) {
      if (auto message = _catalogue.waitingMessage(ids[begin])) {
        messages.push_back(std::move(*message));
      }
    }
    ItemReader reader(std::move(messages), _target.largestMessage, _target.extractProgram);
    while (const auto batch = reader.next()) {
      if (_observer.cancelled()) return true;
      if (!sendBatch(*batch, error)) return false;
    }
  }
  return true;
}

bool Delivery::sendBatch(const ReadBatch& batch, TLErrorOut error) {
  _counts.cut += batch.cut;
  const bool noted = note(
      [&] {
        for (const ReadBatch::Failure& failure : batch.failures) {
          if (failure.lasting) _catalogue.setFailed(failure.message, failure.reason);
        }
        _catalogue.addAttachments(batch.attachments);
      },
      error);
  if (!noted) return false;
  for (const ReadBatch::Failure& failure : batch.failures) {
    _observer.complain(failure.where, failure.reason);
    ++_counts.failed;
  }
  for (Items rest(batch.items); !rest.empty() && !_observer.cancelled();) {
    const Items piece = rest.first(std::min(_pace.items(), rest.size()));
    const auto start = std::chrono::steady_clock::now();
    if (!sendPiece(piece, error)) return false;
    _pace.replied(piece.size(), std::chrono::steady_clock::now() - start);
    _observer.progress(_counts);
    rest = rest.subspan(piece.size());
  }
  return true;
}

bool Delivery::sendPiece(Items items, TLErrorOut error) {
  std::vector<client::EncodedItem> encoded;
  std::vector<std::string> deletions;
  for (const ReadBatch::Item& item : items) {
    encoded.push_back(item.item);
    if (item.replace) deletions.push_back(item.item.identifier);
  }
  const bool noted = note(
      [&] {
        for (const ReadBatch::Item& item : items) {
          _catalogue.setSent(item.message, _sequence, item.digest, item.date);
        }
      },
      error);
  if (!noted) return false;
  std::optional<TLError> failure;
  bool sent = call(encoded, deletions, stateIsDue(), &failure);
  if (!sent && cli::isNotIndexed(*failure)) {
    if (!deleteSingly(deletions, error)) return false;
    failure.reset();
    sent = call(encoded, {}, stateIsDue(), &failure);
  }
  if (!sent && cli::isRefusedMessage(*failure)) return sendSingly(items, error);
  if (!sent) {
    platform::setError(error, *failure);
    return false;
  }
  _counts.replaced += deletions.size();
  _counts.added += items.size() - deletions.size();
  return true;
}

// The batch failed at one item. Sends each item alone to find it. The deletions are done already.
bool Delivery::sendSingly(Items items, TLErrorOut error) {
  for (const ReadBatch::Item& item : items) {
    std::optional<TLError> failure;
    if (call(std::span(&item.item, 1), {}, false, &failure)) {
      ++(item.replace ? _counts.replaced : _counts.added);
      continue;
    }
    if (!cli::isRefusedMessage(*failure)) {
      platform::setError(error, *failure);
      return false;
    }
    const std::string reason = cli::plainText(*failure);
    _observer.complain(item.item.identifier, reason);
    ++_counts.failed;
    // A part of the message may be in the index.
    if (!deleteSingly({item.item.identifier}, error)) return false;
    if (!note([&] { _catalogue.setFailed(item.message, reason, true); }, error)) {
      return false;
    }
  }
  return true;
}

}  // namespace mailsync
