#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace platform {

// A file in which a fatal signal (SIGABRT, SIGBUS, SIGFPE, SIGILL or SIGSEGV) notes that it came
// while a thread worked on certain data. A process that is killed, or whose machine loses power,
// leaves no note: that says nothing of the data.
//
// While an object of this class lives, its thread works on the data of the file `path`. Objects of
// one thread nest; the innermost counts. The bytes of `path` outlive the object, which keeps a
// pointer only. Costs two stores to memory of the thread.
class CrashNote {
 public:
  explicit CrashNote(const std::string& path);
  ~CrashNote();
  CrashNote(const CrashNote&) = delete;
  CrashNote& operator=(const CrashNote&) = delete;

  // From here on fatal signals leave notes, and then do what they did before. Once a process,
  // before other threads start.
  static void begin();

  // When the notes in the file were made, in seconds since 1970, the oldest first; none where there
  // is no such file, and at most as many as fit 64 KiB.
  [[nodiscard]] static std::vector<int64_t> times(const std::string& path);

 private:
  const char* const _outer;
};

}  // namespace platform
