// tallow-extract: takes attachments apart for tallow. Standard input is a socket to it; see
// Protocol.h. Ends when the socket is closed.

#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "extract/Protocol.h"
#include "extract/Sandbox.h"
#include "extract/TextExtraction.h"
#include "platform/FileDescriptor.h"

namespace {

constexpr int kSocket = STDIN_FILENO;
constexpr int kMaxRequests = 1000;  // after which a new process begins without what this one lost

// A file in memory, or empty.
class MappedFile {
 public:
  explicit MappedFile(int descriptor) {
    struct stat info;
    if (fstat(descriptor, &info) != 0 || info.st_size <= 0) return;
    _size = static_cast<size_t>(info.st_size);
    _data = mmap(nullptr, _size, PROT_READ, MAP_PRIVATE, descriptor, 0);
  }
  ~MappedFile() {
    if (_data != MAP_FAILED) munmap(_data, _size);
  }
  MappedFile(const MappedFile&) = delete;
  MappedFile& operator=(const MappedFile&) = delete;

  [[nodiscard]] std::string_view bytes() const {
    return _data == MAP_FAILED ? std::string_view()
                               : std::string_view(static_cast<const char*>(_data), _size);
  }

 private:
  void* _data = MAP_FAILED;
  size_t _size = 0;
};

bool sendAll(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t sent = send(kSocket, bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (sent < 0 && errno == EINTR) continue;
    if (sent <= 0) return false;
    bytes.remove_prefix(static_cast<size_t>(sent));
  }
  return true;
}

bool reply(const extract::Extraction& extraction, bool last) {
  const auto size = static_cast<uint32_t>(extraction.text.size());
  return sendAll(encode(extract::ReplyHeader{extraction.outcome, last, size})) &&
         sendAll(extraction.text);
}

// Waits for a request and its file. The client sends each with one call, far below the size of the
// socket's buffer, so it arrives whole. Nullopt at the end.
std::optional<extract::Request> receive(platform::FileDescriptor& file) {
  std::array<char, extract::kRequestBytes> bytes;
  alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control;
  iovec part{bytes.data(), bytes.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.data();
  message.msg_controllen = control.size();
  ssize_t size;
  do {
    size = recvmsg(kSocket, &message, MSG_CMSG_CLOEXEC);
  } while (size < 0 && errno == EINTR);
  const cmsghdr* const header = size > 0 ? CMSG_FIRSTHDR(&message) : nullptr;
  if (header == nullptr || header->cmsg_type != SCM_RIGHTS ||
      header->cmsg_len != CMSG_LEN(sizeof(int))) {
    return std::nullopt;
  }
  int descriptor = -1;
  std::memcpy(&descriptor, CMSG_DATA(header), sizeof descriptor);
  file = platform::FileDescriptor(descriptor);
  return extract::parseRequest({bytes.data(), static_cast<size_t>(size)});
}

int serve() {
  for (int requests = 1;; ++requests) {
    platform::FileDescriptor file;
    const auto request = receive(file);
    if (!request) return 0;
    const MappedFile mapped(file.get());
    const auto extraction = extract::extractText(request->kind, mapped.bytes(), request->limit);
    const bool last = requests >= kMaxRequests || extract::shouldRetire();
    if (!reply(extraction, last) || last) return 0;
  }
}

bool isSocket(int descriptor) {
  struct stat info;
  return fstat(descriptor, &info) == 0 && S_ISSOCK(info.st_mode);
}

}  // namespace

int main() {
  if (!isSocket(kSocket)) {
    std::fputs("tallow-extract: tallow runs this program; see tallow-extract(8)\n", stderr);
    return 2;
  }
  close_range(STDERR_FILENO + 1, ~0U, 0);
  extract::loadLibraries();
  if (!extract::enterSandbox(kSocket)) return 1;
  // Without the libraries' clean-up, which may need more than the sandbox allows.
  _exit(reply({}, false) ? serve() : 1);
}
