#include "platform/Paths.h"

#include <cstdlib>

namespace platform {

namespace {

std::string directoryFromEnvironment(const char* variable, const char* fallback) {
  const char* value = std::getenv(variable);
  if (value == nullptr || *value == '\0') return fallback;
  const std::string_view list(value);
  return std::string(list.substr(0, list.find(':')));
}

}  // namespace

std::string stateDirectory() {
  return directoryFromEnvironment("STATE_DIRECTORY", "/var/lib/tallow");
}

std::string runtimeDirectory() {
  return directoryFromEnvironment("RUNTIME_DIRECTORY", "/run/tallow");
}

std::string processLockPath(const std::string& state) {
  return joinPath(state, "tallowsearchd.lock");
}

std::string dataRoot(const std::string& state) {
  return joinPath(state, "TallowSearch");
}

std::string synonymFilePath() {
  return joinPath(stateDirectory(), "TALLOW/en_synonyms.txt");
}

std::string defaultsFilePath() {
  return joinPath(stateDirectory(), "defaults.json");
}

std::string lockStatusPath() {
  return joinPath(runtimeDirectory(), "lock_status");
}

bool namesOneDirectory(std::string_view protectionClass) {
  return !protectionClass.empty() && protectionClass != "." && protectionClass != ".." &&
         protectionClass.size() <= kLongestName &&
         protectionClass.find_first_of(std::string_view("/\0", 2)) == std::string_view::npos;
}

std::string textIndexPath(const std::string& root, const std::string& protectionClass) {
  return joinPath(joinPath(root, protectionClass), "salt");
}

std::string joinPath(const std::string& base, const std::string& component) {
  if (base.empty() || base.back() == '/') return base + component;
  return base + '/' + component;
}

}  // namespace platform
