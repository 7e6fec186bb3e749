#pragma once

#include <functional>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "platform/Queue.h"

// Registers a block whose dictionary joins the diagnostic captures of the process. The block runs
// on `queue`, which must outlive the registration. The result cancels the registration: after it
// has returned, the block is not called again. Neither is called on `queue` itself.
[[nodiscard]] std::function<void()> TLLogRegisterStateCaptureBlock(
    platform::SerialQueue& queue, std::string title, std::function<nlohmann::json()> block);

namespace platform {

// The block of bytes of one capture: 200 bytes of header (type 1 at 0, size of the data at 4, both
// little-endian 32-bit, title at 136, NUL-terminated and cut to 63 bytes), then the dictionary as
// CBOR. None for an empty dictionary or one that CBOR cannot hold; the latter is logged.
[[nodiscard]] std::optional<std::string> stateCaptureRecord(const std::string& title,
                                                            const nlohmann::json& dictionary);

// Runs every registered block on its queue, waits for them, and gives the records.
[[nodiscard]] std::vector<std::string> captureState();

// captureState, each record written to the log as its title and JSON.
void logCapturedState();

}  // namespace platform
