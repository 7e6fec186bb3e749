#pragma once

#include <systemd/sd-bus.h>

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "rpc/Server.h"

// Converts between messages of the bus library and values of handlers. Functions that build a
// message return a negative value if D-Bus cannot carry it or memory is short; the caller releases
// the message in either case.
namespace rpc {

// All arguments of a call. Nullopt if the content does not match the signature or has too many
// elements: the bus library checks only the header of an incoming message. The bytes point into the
// message.
[[nodiscard]] std::optional<std::vector<Arguments::Value>> readArguments(
    sd_bus_message* message, std::string_view signature);

// The bytes that the values take in a reply, without header and numbers.
[[nodiscard]] size_t sizeOf(const Values& values);

int buildReturn(sd_bus_message* call, const Values& values, sd_bus_message** reply);
int buildFailure(sd_bus_message* call, const char* name, const std::string& message,
                 sd_bus_message** reply);
int buildError(sd_bus_message* call, const TLError& error, sd_bus_message** reply);

// A message with the header of a call and no content, which is all that a reply needs. Null when
// memory is short.
[[nodiscard]] sd_bus_message* standInFor(sd_bus* bus, sd_bus_message* call);

}  // namespace rpc
