#include "salt/Quarantine.h"

#include <fmt/chrono.h>
#include <fmt/format.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <ctime>

#include "platform/CrashNote.h"
#include "platform/Files.h"
#include "platform/Paths.h"

namespace salt {

namespace {

constexpr int64_t kHour = 3600;

}  // namespace

std::string crashNotesPath(const std::string& path) {
  return path + ".crashes";
}

bool hasCrashedTwice(const std::string& path) {
  const std::vector<int64_t> times = platform::CrashNote::times(crashNotesPath(path));
  return times.size() >= 2 && std::abs(times.back() - times[times.size() - 2]) < kHour;
}

std::vector<std::string> indexesSetAside(const std::string& path) {
  const size_t slash = path.rfind('/') + 1;  // 0 without a slash
  const std::string directory = slash == 0 ? "." : path.substr(0, slash);
  const std::string begin = path.substr(slash) + ".damaged-";
  std::vector<std::string> found;
  for (const std::string& name :
       platform::listDirectory(directory, nullptr).value_or(std::vector<std::string>())) {
    if (name.starts_with(begin)) found.push_back(platform::joinPath(directory, name));
  }
  return found;
}

std::optional<std::string> setAside(const std::string& path, TLErrorOut error) {
  std::string aside =
      fmt::format("{}.damaged-{:%Y%m%dT%H%M%SZ}", path, fmt::gmtime(std::time(nullptr)));
  // If the process ended right after the rename last time, only the notes are left to remove.
  if (platform::fileExists(path)) {
    for (const std::string& earlier : indexesSetAside(path)) platform::removeItem(earlier, nullptr);
    if (std::rename(path.c_str(), aside.c_str()) != 0) {
      platform::setError(error, platform::posixError(errno, "cannot set aside " + path));
      return std::nullopt;
    }
  }
  if (!platform::removeItem(crashNotesPath(path), error)) return std::nullopt;
  return aside;
}

}  // namespace salt
