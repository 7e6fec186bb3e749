#include "rpc/Greeting.h"

#include <systemd/sd-bus.h>

namespace rpc {

namespace {

constexpr const char* kBusName = "org.freedesktop.DBus";
constexpr const char* kBusPath = "/org/freedesktop/DBus";

// The names of the two ends of any connection.
constexpr const char* kClientName = ":1.1";
constexpr const char* kServiceName = ":1.0";

int hello(sd_bus_message* call, void*, sd_bus_error*) {
  return sd_bus_reply_method_return(call, "s", kClientName);
}

int nameOwner(sd_bus_message* call, void*, sd_bus_error*) {
  return sd_bus_reply_method_return(call, "s", kServiceName);
}

int nothing(sd_bus_message* call, void*, sd_bus_error*) {
  return sd_bus_reply_method_return(call, nullptr);
}

const sd_bus_vtable kOperations[] = {
    SD_BUS_VTABLE_START(0), SD_BUS_METHOD("Hello", nullptr, "s", hello, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("GetNameOwner", "s", "s", nameOwner, SD_BUS_VTABLE_UNPRIVILEGED),
    // There are no signals that could match.
    SD_BUS_METHOD("AddMatch", "s", nullptr, nothing, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("RemoveMatch", "s", nullptr, nothing, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END};

}  // namespace

bool addGreeting(sd_bus* bus) {
  return sd_bus_add_object_vtable(bus, nullptr, kBusPath, kBusName, kOperations, nullptr) >= 0;
}

}  // namespace rpc
