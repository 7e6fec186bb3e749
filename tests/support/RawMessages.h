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

#include "platform/FileDescriptor.h"

// Sockets and hand-made D-Bus messages, for peers that violate the protocol.
namespace testsupport {

inline sockaddr_un addressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  return address;
}

// A socket connected to `path`; none if nobody accepts.
inline platform::FileDescriptor connectTo(const std::string& path) {
  const sockaddr_un address = addressOf(path);
  platform::FileDescriptor one(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (connect(one.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    one.reset();
  }
  return one;
}

// A socket that listens at `path`; none if that fails.
inline platform::FileDescriptor listenAt(const std::string& path) {
  const sockaddr_un address = addressOf(path);
  platform::FileDescriptor one(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (bind(one.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      listen(one.get(), 8) != 0) {
    one.reset();
  }
  return one;
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

// Sends a message over a new connection. What is received until it contains `end`, or until the
// other side closes.
inline std::string answerTo(const std::string& message, const std::string& path,
                            std::string_view end = "") {
  const platform::FileDescriptor socket = connectTo(path);
  std::string answer;
  if (!authenticate(socket.get()) || !sendAll(socket.get(), message)) return answer;
  do {
    const std::string more = receiveSome(socket.get());
    if (more.empty()) break;
    answer += more;
  } while (answer.find(end) == std::string::npos);
  return answer;
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
