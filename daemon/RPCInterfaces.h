#pragma once

#include "daemon/TALSearchService.h"
#include "rpc/Server.h"

// The operations of the two services as members of their RPC interfaces. Records are decoded here:
// a call with invalid bytes is refused before anything is done, with the argument and the index in
// the error. The service must outlive the interfaces.
//
// The interfaces of the search service belong to one connection and its thread: they share the
// words that its last search replaced.
[[nodiscard]] rpc::Interface makeSearchServiceProtocol(
    TALSearchService& service, std::shared_ptr<WordReplacements> lastReplaced);
[[nodiscard]] rpc::Interface makeSearchExplanationProtocol(
    std::shared_ptr<const WordReplacements> lastReplaced);
[[nodiscard]] rpc::Interface makeDebugServiceProtocol(TALSearchService& service);
