#pragma once

#include <systemd/sd-bus.h>

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/RPC.h"

// Between the messages of the bus library and the values that handlers take and send. Everything
// that builds a message is negative where D-Bus cannot carry it or memory is short, and leaves the
// message for the caller to release either way.
namespace platform {

// All arguments of a call. None where the content is not what the signature says, or has too many
// elements: the bus library looks at the header of a message when it comes, and at its content only
// here. The bytes are those of the message.
[[nodiscard]] std::optional<std::vector<RPCArguments::Value>> readArguments(
    sd_bus_message* message, std::string_view signature);

// The bytes that the values take in a reply, without its header and numbers.
[[nodiscard]] size_t sizeOf(const RPCValues& values);

int buildReturn(sd_bus_message* call, const RPCValues& values, sd_bus_message** reply);
int buildFailure(sd_bus_message* call, const char* name, const std::string& message,
                 sd_bus_message** reply);
int buildError(sd_bus_message* call, const TLError& error, sd_bus_message** reply);

// A message of this side with the cookie of the call and nothing of its content: all that a reply
// needs to know. Null when memory is short.
[[nodiscard]] sd_bus_message* standInFor(sd_bus* bus, sd_bus_message* call);

}  // namespace platform
