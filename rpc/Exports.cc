#include "rpc/Exports.h"

namespace rpc {

int Exports::add(sd_bus* bus, const std::string& path, const Interface& interface,
                 Receiver receiver) {
  sd_bus_vtable start{};
  start.type = _SD_BUS_VTABLE_START;
  start.x.start.element_size = sizeof(sd_bus_vtable);
  start.x.start.features = _SD_BUS_VTABLE_PARAM_NAMES;
  start.x.start.vtable_format_reference = &sd_bus_object_vtable_format;
  sd_bus_vtable end{};
  end.type = _SD_BUS_VTABLE_END;

  std::vector<sd_bus_vtable>& vtable = _vtables.emplace_back();
  vtable.push_back(start);
  for (const Method& method : interface.methods) {
    vtable.push_back(entryOf(method, receiver.handler));
  }
  vtable.push_back(end);
  return sd_bus_add_object_vtable(bus, nullptr, path.c_str(), interface.name.c_str(), vtable.data(),
                                  receiver.data);
}

sd_bus_vtable Exports::entryOf(const Method& method, sd_bus_message_handler_t handler) {
  std::string& names = _argumentNames.emplace_back();
  for (const char* name : method.argumentNames) names.append(name).push_back('\0');
  sd_bus_vtable entry{};
  entry.type = _SD_BUS_VTABLE_METHOD;
  entry.flags = SD_BUS_VTABLE_UNPRIVILEGED;
  entry.x.method.member = method.member;
  entry.x.method.signature = method.inputSignature;
  entry.x.method.result = method.outputSignature;
  entry.x.method.handler = handler;
  entry.x.method.names = names.c_str();
  return entry;
}

}  // namespace rpc
