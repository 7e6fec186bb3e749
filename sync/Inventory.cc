#include "sync/Inventory.h"

#include <fmt/format.h>

#include <algorithm>

#include "cli/Identifier.h"
#include "cli/MailDate.h"
#include "parameters/TLParamsManager.h"

namespace mailsync {

bool isAtOrBelow(const std::string& path, const std::string& place) {
  return path.starts_with(place) &&
         (path.size() == place.size() || place == "/" || path[place.size()] == '/');
}

std::optional<client::SearchServiceProxy::Items> itemsAt(client::SearchServiceProxy& service,
                                                         const std::string& protectionClass,
                                                         const std::string& place,
                                                         TLErrorOut error) {
  auto leaf = std::make_shared<TLQueryNode>();
  leaf->setMergeOp(TLQueryNodeMergeOp::LEAF);
  leaf->setOp(TLQueryNodeOp::STRING_EQUAL);
  leaf->addKey(TLAttributeKey::MAILBOX_IDENTIFIERS);
  leaf->setStringValue(platform::fromUTF8(place));
  TLQuery query;
  query.setRoot(leaf);
  query.setSearchParams(TLParamsManager::paramsFromString(
      platform::fromUTF8(fmt::format("salt.maxTopK={}", kInventoryItems))));
  return service.searchItems(query, 0, protectionClass, kInventoryItems, error);
}

std::optional<std::vector<IndexedMessage>> readInventory(client::SearchServiceProxy& service,
                                                         const std::string& protectionClass,
                                                         const std::vector<std::string>& roots,
                                                         const std::vector<std::string>& folders,
                                                         TLErrorOut error) {
  std::vector<IndexedMessage> messages;
  const auto isWanted = [&](const std::string& identifier) {
    const auto location = cli::parseIdentifier(identifier);
    return location && std::any_of(roots.begin(), roots.end(), [&](const std::string& root) {
             return isAtOrBelow(location->path, root);
           });
  };
  // False if there are more than fit into one reply.
  const auto take = [&](const std::string& place) -> std::optional<bool> {
    const auto items = itemsAt(service, protectionClass, place, error);
    if (!items) return std::nullopt;
    if (items->size() >= static_cast<size_t>(kInventoryItems)) return false;
    for (const auto& item : *items) {
      std::string identifier = platform::toUTF8(platform::orEmpty(item->identifier()));
      if (!isWanted(identifier)) continue;
      messages.push_back({std::move(identifier), cli::wholeSeconds(cli::dateOf(*item))});
    }
    return true;
  };
  for (const std::string& root : roots) {
    // The folder of a single message is the directory that it lies in.
    const std::string place = std::find(folders.begin(), folders.end(), root) != folders.end()
                                  ? root
                                  : root.substr(0, std::max<size_t>(root.rfind('/'), 1));
    const auto complete = take(place);
    if (!complete) return std::nullopt;
    if (*complete) continue;
    for (const std::string& folder : folders) {
      if (isAtOrBelow(folder, root) && !take(folder)) return std::nullopt;
    }
  }
  return messages;
}

}  // namespace mailsync
