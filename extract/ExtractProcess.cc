#include "extract/ExtractProcess.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>

#include "platform/SpawnPlan.h"

namespace extract {

namespace {

// Starts the program with the socket, without output, and without a signal from a terminal, which
// would take the text from the mail that is in hand. -1 on failure.
pid_t startProgram(const std::string& program, int socket) {
  platform::SpawnPlan plan;
  plan.pass(socket, STDIN_FILENO).silence(STDOUT_FILENO).silence(STDERR_FILENO).inOwnGroup();
  plan.blockSignals({SIGTERM});  // of a service manager, to all processes of a unit
  pid_t process = -1;
  return plan.run({program}, process) == 0 ? process : -1;
}

// An unnamed file in memory with these bytes; none on failure.
platform::FileDescriptor memoryFile(std::string_view bytes) {
  platform::FileDescriptor file(memfd_create("attachment", MFD_CLOEXEC));
  while (file.get() >= 0 && !bytes.empty()) {
    const ssize_t written = write(file.get(), bytes.data(), bytes.size());
    if (written < 0 && errno == EINTR) continue;
    if (written <= 0) return platform::FileDescriptor();
    bytes.remove_prefix(static_cast<size_t>(written));
  }
  return file;
}

// Waits until the socket can be read. False after `until`.
bool waitFor(int socket, ExtractProcess::Clock::time_point until) {
  for (;;) {
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(until - ExtractProcess::Clock::now());
    if (left.count() <= 0) return false;
    pollfd descriptor{socket, POLLIN, 0};
    const int result = poll(&descriptor, 1, static_cast<int>(left.count()));
    if (result > 0) return true;
    if (result == 0 || errno != EINTR) return false;
  }
}

}  // namespace

ExtractProcess::Text ExtractProcess::text(Kind kind, std::string_view file, size_t limit,
                                          std::chrono::milliseconds patience) {
  if (file.size() > kMaxFileBytes) return {Outcome::tooLarge, {}};
  if (file.empty()) return {Outcome::empty, {}};
  const auto most = static_cast<uint32_t>(std::clamp<size_t>(limit, 1, kMaxTextBytes));
  if (_process < 0 && !start()) return {Outcome::notRun, {}};
  const auto until = Clock::now() + std::min<std::chrono::milliseconds>(patience, kPatience);
  auto answer = request(kind, file, most) ? reply(most, until) : std::nullopt;
  if (answer) return std::move(*answer);
  end();
  return {Clock::now() >= until ? Outcome::timedOut : Outcome::crashed, {}};
}

bool ExtractProcess::start() {
  while (_failedStarts < kMaxFailedStarts) {
    if (spawn() && reply(0, Clock::now() + kStartPatience)) {
      _failedStarts = 0;
      return true;
    }
    end();
    ++_failedStarts;
  }
  return false;
}

bool ExtractProcess::spawn() {
  std::array<int, 2> ends{-1, -1};
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) return false;
  _socket = platform::FileDescriptor(ends[0]);
  const platform::FileDescriptor theirs(ends[1]);
  _process = startProgram(_program, theirs.get());
  return _process > 0;
}

void ExtractProcess::end() {
  _socket.reset();
  if (_process > 0) {
    kill(_process, SIGKILL);
    while (waitpid(_process, nullptr, 0) < 0 && errno == EINTR) {
    }
  }
  _process = -1;
}

bool ExtractProcess::request(Kind kind, std::string_view file, uint32_t limit) {
  const platform::FileDescriptor memory = memoryFile(file);
  if (memory.get() < 0) return false;
  std::string bytes = encode(Request{kind, limit});
  alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
  iovec part{bytes.data(), bytes.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.data();
  message.msg_controllen = control.size();
  cmsghdr* const header = CMSG_FIRSTHDR(&message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(sizeof(int));
  const int descriptor = memory.get();
  std::memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
  return sendmsg(_socket.get(), &message, MSG_NOSIGNAL | MSG_DONTWAIT) ==
         static_cast<ssize_t>(bytes.size());
}

bool ExtractProcess::read(std::string& bytes, size_t size, Clock::time_point until) {
  bytes.resize(size);
  for (size_t at = 0; at < size;) {
    if (!waitFor(_socket.get(), until)) return false;
    const ssize_t got = recv(_socket.get(), bytes.data() + at, size - at, MSG_DONTWAIT);
    if (got < 0 && (errno == EINTR || errno == EAGAIN)) continue;
    if (got <= 0) return false;
    at += static_cast<size_t>(got);
  }
  return true;
}

std::optional<ExtractProcess::Text> ExtractProcess::reply(uint32_t limit, Clock::time_point until) {
  std::string bytes;
  if (!read(bytes, kReplyBytes, until)) return std::nullopt;
  const auto header = parseReply(bytes, limit);
  if (!header || !read(bytes, header->size, until)) return std::nullopt;
  if (header->last) end();
  return Text{header->outcome, std::move(bytes)};
}

}  // namespace extract
