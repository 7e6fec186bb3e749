// What a process can still do in the sandbox.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <functional>

#include "extract/Sandbox.h"

namespace {

constexpr int kNoSandbox = 77;

// Whether `act` returns true in the sandbox of a process of its own. `socket` is the allowed one.
bool inSandbox(const std::function<bool(int socket)>& act) {
  std::array<int, 2> ends{-1, -1};
  EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, ends.data()), 0);
  const pid_t process = fork();
  if (process == 0) {
    if (!extract::enterSandbox(ends[1])) _exit(kNoSandbox);
    _exit(act(ends[1]) ? 0 : 1);
  }
  int status = 0;
  EXPECT_EQ(waitpid(process, &status, 0), process);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) != kNoSandbox) << status;
  close(ends[0]);
  close(ends[1]);
  return status == 0;
}

bool opens(const char* path, int flags) {
  return open(path, flags, 0600) >= 0;
}

TEST(Sandbox, LeavesMemoryAndOneSocket) {
  EXPECT_TRUE(inSandbox([](int socket) { return send(socket, "x", 1, 0) == 1; }));
  EXPECT_TRUE(inSandbox([](int) {
    void* const memory =
        mmap(nullptr, 1 << 20, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    return memory != MAP_FAILED && munmap(memory, 1 << 20) == 0;
  }));
}

TEST(Sandbox, TakesEverythingElse) {
  const std::pair<const char*, std::function<bool(int)>> acts[] = {
      {"read a file", [](int) { return opens("/etc/passwd", O_RDONLY); }},
      {"read this program", [](int) { return opens("/proc/self/exe", O_RDONLY); }},
      {"list a directory", [](int) { return opens("/", O_RDONLY | O_DIRECTORY); }},
      {"write a table", [](int) { return opens("/usr/share/poppler/cMap/x", O_WRONLY | O_CREAT); }},
      {"write a new file", [](int) { return opens("sandbox-test", O_WRONLY | O_CREAT); }},
      {"remove a file", [](int) { return unlink("sandbox-test") == 0 || errno == ENOENT; }},
      {"use another socket", [](int) { return send(STDERR_FILENO, "x", 1, 0) == 1; }},
      {"write to a descriptor", [](int socket) { return write(socket, "x", 1) == 1; }},
      {"reach the network", [](int) { return socket(AF_INET, SOCK_STREAM, 0) >= 0; }},
      {"start a process", [](int) { return fork() >= 0; }},
      {"run a program", [](int) { return execl("/bin/true", "true", nullptr) == 0; }},
      {"end its parent", [](int) { return kill(getppid(), 0) == 0; }},
      {"make code", [](int) {
         return mmap(nullptr, 4096, PROT_READ | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0) !=
                MAP_FAILED;
       }}};
  for (const auto& [what, act] : acts) EXPECT_FALSE(inSandbox(act)) << what;
}

#ifndef TALLOW_UNLIMITED_MEMORY
TEST(Sandbox, LimitsMemory) {
  EXPECT_FALSE(inSandbox([](int) {
    return mmap(nullptr, extract::kMaxMemoryBytes, PROT_READ, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0) !=
           MAP_FAILED;
  }));
}
#endif

}  // namespace
