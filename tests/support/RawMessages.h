#pragma once

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <string>
#include <string_view>

// Sockets and hand-made D-Bus messages, for peers that violate the protocol.
namespace testsupport {

inline sockaddr_un addressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  return address;
}

// A socket connected to `path`; negative if nobody accepts.
inline int connectTo(const std::string& path) {
  const sockaddr_un address = addressOf(path);
  const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) {
    return descriptor;
  }
  close(descriptor);
  return -1;
}

// A socket that listens at `path`; negative if that fails.
inline int listenAt(const std::string& path) {
  const sockaddr_un address = addressOf(path);
  const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (bind(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 &&
      listen(descriptor, 8) == 0) {
    return descriptor;
  }
  close(descriptor);
  return -1;
}

// The first lines of the handshake, without BEGIN.
inline std::string authenticationLines() {
  constexpr const char* kDigits = "0123456789abcdef";
  std::string text = std::string(1, '\0') + "AUTH EXTERNAL ";
  for (const char digit : std::to_string(getuid())) {
    text += kDigits[digit >> 4];
    text += kDigits[digit & 15];
  }
  return text + "\r\n";
}

// The next bytes received; empty at the end.
inline std::string receiveSome(int descriptor) {
  char buffer[4096];
  const ssize_t size = recv(descriptor, buffer, sizeof buffer, 0);
  return {buffer, static_cast<size_t>(std::max<ssize_t>(size, 0))};
}

// False when the other side has closed.
inline bool sendAll(int descriptor, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t size = send(descriptor, bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (size < 0 && errno == EINTR) continue;
    if (size <= 0) return false;
    bytes.remove_prefix(static_cast<size_t>(size));
  }
  return true;
}

inline bool authenticate(int descriptor) {
  return sendAll(descriptor, authenticationLines()) && !receiveSome(descriptor).empty() &&
         sendAll(descriptor, "BEGIN\r\n");
}

// The body of a message, little-endian, value by value.
class RawBody {
 public:
  RawBody& number32(uint32_t value) { return align(4).little(value, 4); }
  RawBody& number64(uint64_t value) { return align(8).little(value, 8); }
  RawBody& text(std::string_view value) {
    number32(static_cast<uint32_t>(value.size()));
    _bytes.append(value) += '\0';
    return *this;
  }
  RawBody& bytes(std::string_view value) {
    number32(static_cast<uint32_t>(value.size()));
    _bytes.append(value);
    return *this;
  }
  // An array; `append` adds each element, which begins at a multiple of 4.
  template <typename Elements, typename Append>
  RawBody& array(const Elements& elements, const Append& append) {
    number32(0);
    const size_t begin = _bytes.size();
    for (const auto& element : elements) append(*this, element);
    const auto size = static_cast<uint32_t>(_bytes.size() - begin);
    for (size_t i = 0; i < 4; ++i) _bytes[begin - 4 + i] = static_cast<char>(size >> (8 * i));
    return *this;
  }
  template <typename Elements>
  RawBody& texts(const Elements& elements) {
    return array(elements, [](RawBody& body, std::string_view text) { body.text(text); });
  }
  template <typename Elements>
  RawBody& bytesArray(const Elements& elements) {
    return array(elements, [](RawBody& body, const auto& item) { body.bytes(item.bytes); });
  }

  [[nodiscard]] const std::string& content() const { return _bytes; }

 private:
  RawBody& align(size_t size) {
    while (_bytes.size() % size != 0) _bytes += '\0';
    return *this;
  }
  RawBody& little(uint64_t value, size_t size) {
    for (size_t i = 0; i < size; ++i) _bytes += static_cast<char>(value >> (8 * i));
    return *this;
  }

  std::string _bytes;
};

// A call with serial 1.
inline std::string rawCall(std::string_view path, std::string_view interface,
                           std::string_view member, std::string_view signature,
                           const std::string& body) {
  const auto number = [](size_t value) {
    return RawBody().number32(static_cast<uint32_t>(value)).content();
  };
  std::string fields;
  const auto field = [&](char code, char type, std::string_view value) {
    while (fields.size() % 8 != 0) fields += '\0';
    fields += std::string({code, 1, type, 0});
    fields += type == 'g' ? std::string(1, static_cast<char>(value.size())) : number(value.size());
    fields.append(value) += '\0';
  };
  field(1, 'o', path);
  field(2, 's', interface);
  field(3, 's', member);
  field(8, 'g', signature);
  std::string message =
      std::string("l\1\0\1", 4) + number(body.size()) + number(1) + number(fields.size()) + fields;
  while (message.size() % 8 != 0) message += '\0';
  return message + body;
}

}  // namespace testsupport
