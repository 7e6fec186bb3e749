#pragma once

#include <systemd/sd-bus.h>

#include <string_view>

// Byte arrays in D-Bus messages. Negative results are errno values.
namespace client {

inline int appendBytes(sd_bus_message* message, std::string_view bytes) {
  return sd_bus_message_append_array(message, 'y', bytes.data(), bytes.size());
}

// Reads one byte array; 0 at the end of the enclosing array. The view is valid as long as the
// message.
inline int readBytes(sd_bus_message* message, std::string_view& bytes) {
  const void* data = nullptr;
  size_t size = 0;
  const int result = sd_bus_message_read_array(message, 'y', &data, &size);
  if (result > 0) bytes = {static_cast<const char*>(data), size};
  return result;
}

}  // namespace client
