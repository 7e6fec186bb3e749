#pragma once

#include <string>

namespace testsupport {

// A new directory, removed with its contents at the end of the test.
class TemporaryDirectory {
 public:
  TemporaryDirectory();
  ~TemporaryDirectory();
  TemporaryDirectory(const TemporaryDirectory&) = delete;
  TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

  [[nodiscard]] const std::string& path() const { return _path; }
  [[nodiscard]] std::string operator/(const std::string& name) const { return _path + '/' + name; }
  // Writes a file, whose directories are made, and returns its path.
  std::string write(const std::string& name, const std::string& content) const;
  void makeMaildir(const std::string& name) const;

 private:
  std::string _path;
};

}  // namespace testsupport
