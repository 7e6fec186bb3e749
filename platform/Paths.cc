#include "platform/Paths.h"

#include <unistd.h>

#include <cstdlib>

namespace platform {

namespace {

std::string_view variable(const char* name) {
  const char* value = std::getenv(name);
  return value == nullptr ? "" : value;
}

// Empty unless the variable holds an absolute path; one relative to the working directory is
// certainly a mistake.
std::string_view directoryVariable(const char* name) {
  const std::string_view value = variable(name);
  return value.starts_with('/') ? value : "";
}

// `given` is the variable set by systemd; `base` is the user's own directory, empty for none.
std::string chooseDirectory(const char* given, const std::string& base, const char* system) {
  if (const std::string_view list = variable(given); !list.empty()) {
    return std::string(list.substr(0, list.find(':')));
  }
  return base.empty() || geteuid() == 0 ? system : joinPath(base, "tallow");
}

}  // namespace

std::string stateDirectory() {
  std::string base(directoryVariable("XDG_STATE_HOME"));
  if (const std::string home(directoryVariable("HOME")); base.empty() && !home.empty()) {
    base = joinPath(home, ".local/state");
  }
  return chooseDirectory("STATE_DIRECTORY", base, "/var/lib/tallow");
}

std::string runtimeDirectory() {
  return chooseDirectory("RUNTIME_DIRECTORY", std::string(directoryVariable("XDG_RUNTIME_DIR")),
                         "/run/tallow");
}

std::string processLockPath(const std::string& state) {
  return joinPath(state, "tallowsearchd.lock");
}

std::string dataRoot(const std::string& state) {
  return joinPath(state, "TallowSearch");
}

std::string purgeDirectory(const std::string& state) {
  return joinPath(state, "purging");
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
         protectionClass.size() <= kMaxNameBytes &&
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
