#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "platform/TLError.h"

// Writes a protection class anew without what was deleted from it, and gives back the room. While
// it works no daemon can start: it holds the daemon's process lock.
namespace inspect {

struct PurgeReport {
  uint64_t documents = 0;    // deleted ones that were left out
  uint64_t bytesBefore = 0;  // of all files of the class
  uint64_t bytesAfter = 0;
  bool hadSetAside = false;  // a damaged index that was set aside, which goes too
};

// Called with what is being done, many times.
using PurgeProgress = std::function<void(const char* step)>;

// Builds the class anew beside the old one, checks it, brings it to the disk, and exchanges the two
// directories in one step; then the old one is removed. What is left when it ends at any moment, by
// a kill or a loss of power, is either the old class or the new. A rest lies in
// platform::purgeDirectory, and the next purge or the next start of the daemon removes it.
//
// What the new class holds: the documents that are in the store and not deleted from the index,
// with the same IDs; the client states; of the vocabulary, the words that are still there.
//
// None, with the error and nothing changed, when the class cannot be read, is not the caller's own,
// or when there is too little room; EWOULDBLOCK when a daemon runs.
[[nodiscard]] std::optional<PurgeReport> purge(const std::string& state,
                                               const std::string& protectionClass,
                                               const PurgeProgress& progress, TLErrorOut error);

// What it would give back, by the share of the deleted texts. Changes nothing, and lets daemons
// start. `bytesAfter` is an estimate.
[[nodiscard]] std::optional<PurgeReport> estimatePurge(const std::string& state,
                                                       const std::string& protectionClass,
                                                       TLErrorOut error);

}  // namespace inspect
