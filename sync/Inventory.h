#pragma once

#include <optional>
#include <string>
#include <vector>

#include "client/SearchServiceProxy.h"

namespace mailsync {

// Identifiers of the messages that the index has below each of the roots, files or directories; it
// can hold more than the mailboxes have, and messages that other clients have sent. None after an
// error.
//
// One answer holds at most kInventoryItems. Where a root has more, it is asked for by its
// `folders`, the folders that the catalogue knows; one that has more by itself is taken for absent,
// so that its mail is sent once more.
inline constexpr int64_t kInventoryItems = 50000;

[[nodiscard]] std::optional<std::vector<std::string>> readInventory(
    client::SearchServiceProxy& service, const std::string& protectionClass,
    const std::vector<std::string>& roots, const std::vector<std::string>& folders,
    TLErrorOut error);

// Messages whose folder's path begins with `place`, kInventoryItems at most.
[[nodiscard]] std::optional<client::SearchServiceProxy::Items> itemsAt(
    client::SearchServiceProxy& service, const std::string& protectionClass,
    const std::string& place, TLErrorOut error);

[[nodiscard]] bool isAtOrBelow(const std::string& path, const std::string& place);

}  // namespace mailsync
