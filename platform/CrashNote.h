#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace platform {

// Records in a file that a fatal signal (SIGABRT, SIGBUS, SIGFPE, SIGILL or SIGSEGV) arrived while
// a thread was working on certain data. Being killed or losing power leaves no note, since that
// says nothing about the data.
//
// While an object exists, its thread works on the data that the file `path` stands for. Objects of
// a thread nest; the innermost counts. The object keeps only a pointer, so the bytes of `path` must
// outlive it. Costs two stores to thread-local memory.
class CrashNote {
 public:
  explicit CrashNote(const std::string& path);
  ~CrashNote();
  CrashNote(const CrashNote&) = delete;
  CrashNote& operator=(const CrashNote&) = delete;

  // Makes fatal signals leave notes before they have their previous effect. Call it once per
  // process, before other threads start.
  static void begin();

  // The times of the notes in the file, in seconds since 1970, oldest first; empty when there is no
  // file. Reads at most 64 KiB.
  [[nodiscard]] static std::vector<int64_t> times(const std::string& path);

 private:
  const char* const _outer;
};

}  // namespace platform
