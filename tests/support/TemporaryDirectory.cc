#include "tests/support/TemporaryDirectory.h"

#include <stdlib.h>

#include <filesystem>
#include <fstream>

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

std::string TemporaryDirectory::write(const std::string& name, const std::string& content) const {
  const std::string path = *this / name;
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path, std::ios::binary) << content;
  return path;
}

void TemporaryDirectory::makeMaildir(const std::string& name) const {
  for (const char* const part : {"/cur", "/new", "/tmp"}) {
    std::filesystem::create_directories(*this / name + part);
  }
}

}  // namespace testsupport
