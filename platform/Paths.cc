#include "platform/Paths.h"

#include <cstdlib>
#include <string_view>

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

std::string dataRoot() {
  return joinPath(stateDirectory(), "TallowSearch");
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

std::string joinPath(const std::string& base, const std::string& component) {
  if (base.empty() || base.back() == '/') return base + component;
  return base + '/' + component;
}

}  // namespace platform
