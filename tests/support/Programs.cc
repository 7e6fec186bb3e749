#include "tests/support/Programs.h"

#include <cstdio>
#include <cstdlib>

namespace testsupport {

std::string outputOf(const std::string& command) {
  std::string output;
  FILE* const pipe = popen((command + " 2>/dev/null").c_str(), "r");
  if (pipe == nullptr) return output;
  char buffer[4096];
  for (size_t n = 0; (n = fread(buffer, 1, sizeof buffer, pipe)) > 0;) output.append(buffer, n);
  pclose(pipe);
  return output;
}

std::string missingProgram(std::initializer_list<const char*> programs) {
  for (const char* const name : programs) {
    if (outputOf(std::string("command -v ") + name).empty()) return name;
  }
  return "";
}

bool isCI() {
  const char* const ci = std::getenv("CI");
  return ci != nullptr && std::string(ci) == "true";
}

}  // namespace testsupport
