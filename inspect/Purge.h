#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "platform/TLError.h"

// Purging: rewrites a protection class without the remains of deleted data, and returns the space.
// It holds the daemon's process lock, so no daemon can start meanwhile.
namespace inspect {

struct PurgeReport {
  uint64_t documents = 0;    // deleted documents left out
  uint64_t bytesBefore = 0;  // size of all files of the class
  uint64_t bytesAfter = 0;
  bool hadSetAside = false;  // a damaged index had been set aside; it is removed too
};

// Called often, with the current step.
using PurgeProgress = std::function<void(const char* step)>;

// Builds the new class beside the old one, checks it, syncs it, exchanges the two directories
// atomically, and removes the old one. After a kill or a power loss at any moment, either the old
// class or the new one is complete. The remains lie in platform::purgeDirectory; the next purge or
// the next start of the daemon removes them.
//
// The new class contains the documents that are in the store and not deleted from the index, with
// the same IDs; the client states; and the words of the vocabulary that still occur.
//
// Nullopt, with an error and nothing changed, if the class cannot be read, is not owned by the
// caller, or there is too little space; EWOULDBLOCK if a daemon is running.
[[nodiscard]] std::optional<PurgeReport> purge(const std::string& state,
                                               const std::string& protectionClass,
                                               const PurgeProgress& progress, TLErrorOut error);

// Estimates what a purge would free, from the share of deleted texts. Changes nothing, and lets
// daemons start. `bytesAfter` is an estimate.
[[nodiscard]] std::optional<PurgeReport> estimatePurge(const std::string& state,
                                                       const std::string& protectionClass,
                                                       TLErrorOut error);

}  // namespace inspect
