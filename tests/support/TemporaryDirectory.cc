#include "tests/support/TemporaryDirectory.h"

#include <stdlib.h>

#include <filesystem>

#include "platform/Assert.h"

namespace testsupport {

TemporaryDirectory::TemporaryDirectory() {
  std::string pattern = std::filesystem::temp_directory_path().string() + "/tallow-test-XXXXXX";
  TL_ASSERT(mkdtemp(pattern.data()) != nullptr);
  _path = pattern;
}

TemporaryDirectory::~TemporaryDirectory() {
  std::error_code ignored;
  std::filesystem::remove_all(_path, ignored);
}

}  // namespace testsupport
