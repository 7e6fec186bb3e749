#include "client/SearchServiceProxy.h"

#include <systemd/sd-bus.h>

#include <cerrno>

#include "client/MessageBytes.h"

namespace client {

namespace {

int appendItems(sd_bus_message* call, std::span<const EncodedItem> items) {
  int result = sd_bus_message_open_container(call, 'a', "ay");
  for (const EncodedItem& item : items) {
    if (result < 0) return result;
    result = appendBytes(call, item.bytes);
  }
  return result < 0 ? result : sd_bus_message_close_container(call);
}

int appendTexts(sd_bus_message* call, std::span<const std::string> texts) {
  int result = sd_bus_message_open_container(call, 'a', "s");
  for (const std::string& text : texts) {
    if (result < 0) return result;
    result = sd_bus_message_append(call, "s", text.c_str());
  }
  return result < 0 ? result : sd_bus_message_close_container(call);
}

int appendNames(sd_bus_message* call, const std::string& name, const std::string& protectionClass) {
  return sd_bus_message_append(call, "ss", name.c_str(), protectionClass.c_str());
}

int readItems(sd_bus_message* reply, SearchServiceProxy::Items& items) {
  int result = sd_bus_message_enter_container(reply, 'a', "ay");
  std::string_view bytes;
  while (result >= 0 && (result = readBytes(reply, bytes)) > 0) {
    auto item = std::make_shared<TLIndexableItem>();
    if (!item->initWithData(bytes)) return -EBADMSG;
    items.push_back(std::move(item));
  }
  return result < 0 ? result : sd_bus_message_exit_container(reply);
}

int readReplacedWords(sd_bus_message* reply, std::vector<ReplacedWord>& words) {
  const char* typed = nullptr;
  const char* replacement = nullptr;
  const char* reason = nullptr;
  int result = sd_bus_message_enter_container(reply, 'a', "(sss)");
  while (result >= 0 &&
         (result = sd_bus_message_read(reply, "(sss)", &typed, &replacement, &reason)) > 0) {
    words.push_back({typed, replacement, reason});
  }
  return result < 0 ? result : sd_bus_message_exit_container(reply);
}

int nothing(sd_bus_message*) {
  return 0;
}

}  // namespace

bool SearchServiceProxy::indexItems(std::span<const EncodedItem> items, const std::string& name,
                                    const std::string& protectionClass, TLErrorOut error) {
  const auto pieces = splitItems(items, error);
  if (!pieces) return false;
  for (const auto piece : *pieces) {
    const auto append = [&](sd_bus_message* call) {
      const int result = appendItems(call, piece);
      return result < 0 ? result : appendNames(call, name, protectionClass);
    };
    if (!_channel.call("IndexItems", rpc::kLongTimeout, append, nothing, error)) return false;
  }
  return true;
}

bool SearchServiceProxy::callWithTexts(const char* member, std::span<const std::string> texts,
                                       const std::string& name, const std::string& protectionClass,
                                       TLErrorOut error) {
  const auto pieces = splitTexts(texts, error);
  if (!pieces) return false;
  for (const auto piece : *pieces) {
    const auto append = [&](sd_bus_message* call) {
      const int result = appendTexts(call, piece);
      return result < 0 ? result : appendNames(call, name, protectionClass);
    };
    if (!_channel.call(member, rpc::kLongTimeout, append, nothing, error)) return false;
  }
  return true;
}

bool SearchServiceProxy::deleteItemsWithIdentifiers(std::span<const std::string> identifiers,
                                                    const std::string& name,
                                                    const std::string& protectionClass,
                                                    TLErrorOut error) {
  return callWithTexts("DeleteItemsWithIdentifiers", identifiers, name, protectionClass, error);
}

bool SearchServiceProxy::deleteItemsWithDomainIdentifiers(
    std::span<const std::string> domainIdentifiers, const std::string& name,
    const std::string& protectionClass, TLErrorOut error) {
  return callWithTexts("DeleteItemsWithDomainIdentifiers", domainIdentifiers, name, protectionClass,
                       error);
}

bool SearchServiceProxy::indexItems(std::span<const EncodedItem> items,
                                    std::span<const std::string> identifiers,
                                    const std::optional<std::string>& clientState,
                                    const std::string& name, const std::string& protectionClass,
                                    TLErrorOut error) {
  const auto itemPieces = splitItems(items, error);
  if (!itemPieces) return false;
  const auto textPieces = splitTexts(identifiers, error);
  if (!textPieces) return false;
  // All deletions except the last piece, then all items except the last piece, are sent as separate
  // calls, in the order of a single call.
  const bool single = itemPieces->size() <= 1;
  const size_t separate =
      single && !textPieces->empty() ? textPieces->size() - 1 : textPieces->size();
  for (size_t i = 0; i < separate; ++i) {
    if (!deleteItemsWithIdentifiers((*textPieces)[i], name, protectionClass, error)) return false;
  }
  for (size_t i = 0; i + 1 < itemPieces->size(); ++i) {
    if (!indexItems((*itemPieces)[i], name, protectionClass, error)) return false;
  }

  const auto append = [&](sd_bus_message* call) {
    const auto lastItems =
        itemPieces->empty() ? std::span<const EncodedItem>() : itemPieces->back();
    const auto lastTexts =
        separate < textPieces->size() ? textPieces->back() : std::span<const std::string>();
    int result = appendItems(call, lastItems);
    if (result >= 0) result = appendTexts(call, lastTexts);
    if (result >= 0) result = sd_bus_message_append(call, "b", clientState.has_value() ? 1 : 0);
    if (result >= 0) result = appendBytes(call, clientState.value_or(std::string()));
    return result < 0 ? result : appendNames(call, name, protectionClass);
  };
  return _channel.call("IndexItemsDeleteItemsWithIdentifiers", rpc::kLongTimeout, append, nothing,
                       error);
}

std::optional<std::string> SearchServiceProxy::fetchLastClientState(
    const std::string& name, const std::string& protectionClass, TLErrorOut error) {
  std::optional<std::string> state;
  const auto read = [&](sd_bus_message* reply) {
    int present = 0;
    std::string_view bytes;
    int result = sd_bus_message_read(reply, "b", &present);
    if (result >= 0) result = readBytes(reply, bytes);
    if (result > 0 && present != 0) state = std::string(bytes);
    return result;
  };
  _channel.call(
      "FetchLastClientState", rpc::kShortTimeout,
      [&](sd_bus_message* call) { return appendNames(call, name, protectionClass); }, read, error);
  return state;
}

bool SearchServiceProxy::deleteAllItems(const std::string& name, const std::string& protectionClass,
                                        TLErrorOut error) {
  return _channel.call(
      "DeleteAllItems", rpc::kLongTimeout,
      [&](sd_bus_message* call) { return appendNames(call, name, protectionClass); }, nothing,
      error);
}

std::optional<SearchServiceProxy::Items> SearchServiceProxy::searchItems(
    const TLQuery& query, uint64_t options, const std::string& protectionClass, int64_t maxResults,
    TLErrorOut error) {
  const auto bytes = encode(query, error);
  if (!bytes) return std::nullopt;
  Items items;
  const auto append = [&](sd_bus_message* call) {
    const int result = appendBytes(call, *bytes);
    return result < 0
               ? result
               : sd_bus_message_append(call, "tsx", options, protectionClass.c_str(), maxResults);
  };
  const auto read = [&](sd_bus_message* reply) { return readItems(reply, items); };
  if (!_channel.call("SearchItemsForQuery", rpc::kShortTimeout, append, read, error)) {
    return std::nullopt;
  }
  return items;
}

std::optional<std::vector<ReplacedWord>> SearchServiceProxy::replacedWords(TLErrorOut error) {
  std::vector<ReplacedWord> words;
  const auto read = [&](sd_bus_message* reply) { return readReplacedWords(reply, words); };
  if (!_channel.call(rpc::kSearchExplanationName, "FetchReplacedWords", rpc::kShortTimeout, nothing,
                     read, error)) {
    return std::nullopt;
  }
  return words;
}

}  // namespace client
