#pragma once

struct sd_bus;

namespace rpc {

// Adds the operations of a bus daemon, such as Hello, that busctl, gdbus and other D-Bus tools call
// before those of a service. There is no bus, so nothing is looked up or stored. False when memory
// is short.
[[nodiscard]] bool addGreeting(sd_bus* bus);

}  // namespace rpc
