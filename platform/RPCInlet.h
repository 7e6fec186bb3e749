#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Mutex.h"
#include "platform/RPC.h"

namespace platform {

// The bytes that requests hold, over all connections of the process. Any thread.
class RPCRequestBudget {
 public:
  using Resume = std::function<void()>;

  static RPCRequestBudget& shared();

  // Takes `bytes` for a message. False when it has to wait: `resume` is called once, on any thread,
  // when there may be room.
  [[nodiscard]] bool take(size_t bytes, Resume resume) TL_EXCLUDES(_mutex);
  void give(size_t bytes) TL_EXCLUDES(_mutex);

 private:
  Mutex _mutex;
  size_t _taken TL_GUARDED_BY(_mutex) = 0;
  std::vector<Resume> _waiting TL_GUARDED_BY(_mutex);
};

// Finds the messages in what a peer sends, before the bus library sees them: how large each one is
// is known from its header. First come the lines of the authentication, up to BEGIN.
//
// No input or output; one thread.
class RPCFramer {
 public:
  enum class Part {
    header,       // these bytes belong to a header that is not complete; it is kept here
    begins,       // with them the header is complete; see `header` and `messageBytes`
    more,         // they belong to a message, or to the authentication, that goes on
    ends,         // they are the last of a message, or of the authentication
    unacceptable  // this is no message that a peer may send
  };
  struct Piece {
    Part part;
    size_t size;  // how many of the given bytes belong to it
  };

  // The next piece at the beginning of `bytes`, which is not empty.
  [[nodiscard]] Piece next(std::string_view bytes);

  [[nodiscard]] bool authenticating() const { return _authenticating; }
  // A message has begun and not ended.
  [[nodiscard]] bool inMessage() const { return _headerSize != 0; }
  // The size of the message whose header is complete, with its header.
  [[nodiscard]] size_t messageBytes() const { return _messageBytes; }
  // The header of that message, which is passed on once there is room for all of it.
  [[nodiscard]] std::string_view header() const { return {_header.data(), _headerSize}; }

 private:
  static constexpr size_t kHeaderBytes = 16;
  static constexpr size_t kMaximumAuthenticationBytes = 16384;

  Piece nextOfAuthentication(std::string_view bytes);
  bool readHeader();

  bool _authenticating = true;
  size_t _authenticationBytes = 0;
  std::string _line;  // the end of what was authenticated with, as long as it may be BEGIN
  std::array<char, kHeaderBytes> _header{};
  size_t _headerSize = 0;
  size_t _messageBytes = 0;
  size_t _left = 0;  // of the message after its header
};

}  // namespace platform
