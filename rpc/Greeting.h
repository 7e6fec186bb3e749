#pragma once

struct sd_bus;

namespace rpc {

// Adds the few operations of a bus daemon that general D-Bus tools call before and beside those of
// a service, such as Hello, although there is no bus: busctl and gdbus cannot do without them.
// Nothing is looked up or remembered. Returns false for want of memory.
[[nodiscard]] bool addGreeting(sd_bus* bus);

}  // namespace rpc
