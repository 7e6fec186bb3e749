#pragma once

#include <optional>
#include <string>
#include <vector>

#include "client/SearchServiceProxy.h"
#include "sync/Catalogue.h"

namespace mailsync {

// All messages in the index below the roots, which are files or directories. May
// include messages that the mailboxes no longer have or that other clients sent. Nullopt on error.
//
// One reply has at most kInventoryItems. A root with more is queried folder by folder, using the
// catalogue's `folders`. A single folder with more is treated as absent, so its mail is sent again.
inline constexpr int64_t kInventoryItems = 50000;

[[nodiscard]] std::optional<std::vector<IndexedMessage>> readInventory(
    client::SearchServiceProxy& service, const std::string& protectionClass,
    const std::vector<std::string>& roots, const std::vector<std::string>& folders,
    TLErrorOut error);

// Messages whose folder path begins with `place`, at most kInventoryItems.
[[nodiscard]] std::optional<client::SearchServiceProxy::Items> itemsAt(
    client::SearchServiceProxy& service, const std::string& protectionClass,
    const std::string& place, TLErrorOut error);

[[nodiscard]] bool isAtOrBelow(const std::string& path, const std::string& place);

}  // namespace mailsync
