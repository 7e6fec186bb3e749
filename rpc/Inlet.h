#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Mutex.h"
#include "rpc/Server.h"

namespace rpc {

// Limits the bytes held by requests over all connections of the process. Any thread.
class RequestBudget {
 public:
  using Resume = std::function<void()>;

  static RequestBudget& shared();

  // Reserves `bytes` for a message. False when it must wait: `resume` is then called once, on any
  // thread, when there may be room.
  [[nodiscard]] bool take(size_t bytes, Resume resume) TL_EXCLUDES(_mutex);
  void give(size_t bytes) TL_EXCLUDES(_mutex);

 private:
  platform::Mutex _mutex;
  size_t _taken TL_GUARDED_BY(_mutex) = 0;
  std::vector<Resume> _waiting TL_GUARDED_BY(_mutex);
};

// Splits what a peer sends into messages, before the bus library sees them; the size of each is
// known from its header. The authentication lines, up to BEGIN, come first.
//
// Does no I/O; one thread.
class Framer {
 public:
  enum class Part {
    header,       // bytes of an incomplete header, which is kept here
    begins,       // the header is now complete; see `header` and `messageBytes`
    more,         // bytes of an unfinished message or authentication
    ends,         // the last bytes of a message or of the authentication
    unacceptable  // not a message that a peer may send
  };
  struct Piece {
    Part part;
    size_t size;  // how many of the given bytes this piece has
  };

  // The next piece of `bytes`, which must not be empty.
  [[nodiscard]] Piece next(std::string_view bytes);

  [[nodiscard]] bool authenticating() const { return _authenticating; }
  // A message has begun and not ended.
  [[nodiscard]] bool inMessage() const { return _headerSize != 0; }
  // The size, including the header, of the message whose header is complete.
  [[nodiscard]] size_t messageBytes() const { return _messageBytes; }
  // The header of that message, to be passed on once there is room for the whole message.
  [[nodiscard]] std::string_view header() const { return {_header.data(), _headerSize}; }

 private:
  static constexpr size_t kHeaderBytes = 16;
  static constexpr size_t kMaxAuthenticationBytes = 16384;

  Piece nextOfAuthentication(std::string_view bytes);
  bool readHeader();

  bool _authenticating = true;
  size_t _authenticationBytes = 0;
  std::string _line;  // the current line of the authentication, as long as it may still be BEGIN
  std::array<char, kHeaderBytes> _header{};
  size_t _headerSize = 0;
  size_t _messageBytes = 0;
  size_t _left = 0;  // bytes of the message still to come
};

}  // namespace rpc
