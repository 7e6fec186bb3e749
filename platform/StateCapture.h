#pragma once

#include <functional>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "platform/Queue.h"

// Registers a block whose dictionary becomes part of the diagnostic captures of the process. The
// block runs on `queue`, which must outlive the registration. The returned function cancels the
// registration; after it has returned, the block is not called again. Call neither function on
// `queue` itself.
[[nodiscard]] std::function<void()> TLLogRegisterStateCaptureBlock(
    platform::SerialQueue& queue, std::string title, std::function<nlohmann::json()> block);

namespace platform {

// The bytes of one capture: a header of 200 bytes (type 1 at offset 0 and size of the data at 4,
// both little-endian 32-bit; title at 136, NUL-terminated and truncated to 63 bytes), then the
// dictionary as CBOR. Nullopt for an empty dictionary or, with a log line, one that CBOR cannot
// represent.
[[nodiscard]] std::optional<std::string> stateCaptureRecord(const std::string& title,
                                                            const nlohmann::json& dictionary);

// Runs every registered block on its queue, waits for them and returns the records.
[[nodiscard]] std::vector<std::string> captureState();

// Captures the state and logs each record as its title and JSON.
void logCapturedState();

}  // namespace platform
