#pragma once

#include <sys/resource.h>

#include <csignal>
#include <cstdint>

#include "platform/Assert.h"

namespace testsupport {

// During its lifetime, a write that exceeds this file size fails after a partial write, as on a
// full disk.
class FileSizeLimit {
 public:
  explicit FileSizeLimit(uint64_t bytes) {
    std::signal(SIGXFSZ, SIG_IGN);
    getrlimit(RLIMIT_FSIZE, &_before);
    const rlimit low{bytes, _before.rlim_max};
    TL_ASSERT(setrlimit(RLIMIT_FSIZE, &low) == 0);
  }
  ~FileSizeLimit() { setrlimit(RLIMIT_FSIZE, &_before); }
  FileSizeLimit(const FileSizeLimit&) = delete;
  FileSizeLimit& operator=(const FileSizeLimit&) = delete;

 private:
  rlimit _before{};
};

}  // namespace testsupport
