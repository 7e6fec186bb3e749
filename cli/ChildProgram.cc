#include "cli/ChildProgram.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>

#include "platform/FileDescriptor.h"
#include "platform/SpawnPlan.h"

namespace cli {

namespace {

using Clock = std::chrono::steady_clock;

// Adds what can be read now. False at the end of the output.
bool readSome(int descriptor, std::string& output) {
  std::array<char, 4096> piece;
  const ssize_t size = read(descriptor, piece.data(), piece.size());
  if (size < 0) return errno == EINTR || errno == EAGAIN;
  const size_t room = kMaxProgramOutput - output.size();
  output.append(piece.data(), std::min(static_cast<size_t>(size), room));
  return size > 0;
}

// Collects the output until the process has ended. False after `until`.
bool follow(int ended, platform::FileDescriptor output, Clock::time_point until,
            std::string& text) {
  for (;;) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(until - Clock::now()).count();
    if (left <= 0) return false;
    std::array<pollfd, 2> waited{{{ended, POLLIN, 0}, {output.get(), POLLIN, 0}}};
    if (poll(waited.data(), waited.size(), static_cast<int>(left)) < 0 && errno != EINTR) {
      return false;
    }
    // All that the process has written is read before its end counts.
    if (waited[1].revents != 0) {
      if (!readSome(output.get(), text)) output.reset();
    } else if (waited[0].revents != 0) {
      return true;
    }
  }
}

int statusOf(pid_t process) {
  int status = 0;
  while (waitpid(process, &status, 0) < 0 && errno == EINTR) {
  }
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

}  // namespace

ProgramRun runProgram(const std::vector<std::string>& words, std::chrono::milliseconds patience) {
  ProgramRun run;
  const auto until = Clock::now() + patience;
  std::array<int, 2> ends{-1, -1};
  run.status = pipe2(ends.data(), O_CLOEXEC) == 0 ? 0 : errno;
  platform::FileDescriptor output(ends[0]);
  platform::FileDescriptor input(ends[1]);
  pid_t process = -1;
  platform::SpawnPlan plan;
  plan.silence(STDIN_FILENO).pass(input.get(), STDOUT_FILENO).pass(input.get(), STDERR_FILENO);
  plan.resetSignals({SIGPIPE, SIGINT, SIGTERM});
  if (run.status == 0) run.status = plan.run(words, process);
  if (run.status != 0) return run;
  input.reset();
  const platform::FileDescriptor ended(static_cast<int>(syscall(SYS_pidfd_open, process, 0)));
  const bool done = follow(ended.get(), std::move(output), until, run.output);
  if (!done) kill(process, SIGKILL);
  run.status = statusOf(process);
  run.end = done ? ProgramRun::End::exited : ProgramRun::End::timedOut;
  return run;
}

}  // namespace cli
