#pragma once

#include <systemd/sd-bus.h>

#include <deque>
#include <string>
#include <vector>

#include "rpc/Server.h"

namespace rpc {

// The interfaces that a connection exports, in the form in which sd-bus takes them. The bus points
// into this object, which must outlive it. One thread.
class Exports {
 public:
  struct Receiver {
    sd_bus_message_handler_t handler;
    void* data;
  };

  // Exports the interface at the path; all of its calls go to the receiver. Returns a negative
  // errno value on failure.
  [[nodiscard]] int add(sd_bus* bus, const std::string& path, const Interface& interface,
                        Receiver receiver);

 private:
  [[nodiscard]] sd_bus_vtable entryOf(const Method& method, sd_bus_message_handler_t handler);

  std::deque<std::vector<sd_bus_vtable>> _vtables;
  std::deque<std::string> _argumentNames;
};

}  // namespace rpc
