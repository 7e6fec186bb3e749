#include "cli/LastSearch.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <nlohmann/json.hpp>
#include <vector>

#include "cli/Identifier.h"
#include "platform/FileDescriptor.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "sync/Catalogue.h"

namespace cli {

namespace {

constexpr size_t kMaxFileBytes = size_t{8} << 20;
constexpr size_t kMaxNameBytes = 100;

std::string variable(const char* name) {
  const char* const value = std::getenv(name);
  return value == nullptr ? "" : value;
}

// The start time of a process, in ticks since boot; empty if unknown. It is the 20th field after
// the program's name, which is in parentheses.
std::string startOf(pid_t process) {
  const auto status = platform::readFile(fmt::format("/proc/{}/stat", process), 4096, nullptr);
  if (!status) return "";
  size_t at = status->rfind(')');
  for (int field = 0; field < 20 && at != std::string::npos; ++field) {
    at = status->find(' ', at + 1);
  }
  if (at == std::string::npos) return "";
  return status->substr(at + 1, status->find(' ', at + 1) - at - 1);
}

// The file name for this session; empty if there is no session.
std::string sessionName() {
  const std::string named = variable("TALLOW_SESSION");
  if (!named.empty()) {
    std::string name = percentEncodePath(named);
    std::replace(name.begin(), name.end(), '/', '+');
    return "named-" + name.substr(0, kMaxNameBytes);
  }
  const platform::FileDescriptor terminal(open("/dev/tty", O_RDONLY | O_NOCTTY | O_CLOEXEC));
  if (terminal.get() < 0) return "";
  const pid_t leader = getsid(0);
  return fmt::format("terminal-{}-{}", leader, startOf(leader));
}

// Uses the daemon's directory of that name if it exists, and never creates it.
std::string directory() {
  const std::string runtime = variable("XDG_RUNTIME_DIR");
  if (runtime.starts_with('/')) {
    const std::string own = platform::joinPath(runtime, "tallow");
    if (access(own.c_str(), W_OK | X_OK) == 0) return platform::joinPath(own, "searches");
  }
  return platform::joinPath(mailsync::defaultCatalogueDirectory(), "searches");
}

void removeOldest(const std::string& place) {
  const auto names = platform::listDirectory(place, nullptr);
  if (!names || names->size() <= kMaxSessions) return;
  std::vector<std::pair<time_t, std::string>> files;
  for (const std::string& name : *names) {
    struct stat info;
    std::string path = platform::joinPath(place, name);
    if (lstat(path.c_str(), &info) == 0) files.emplace_back(info.st_mtime, std::move(path));
  }
  std::sort(files.begin(), files.end());
  for (size_t i = 0; i + kMaxSessions < files.size(); ++i) unlink(files[i].second.c_str());
}

}  // namespace

void keepLastSearch(const LastSearch& search) {
  const std::string name = sessionName();
  const std::string place = directory();
  if (name.empty() || !platform::createDirectories(place, nullptr)) return;
  nlohmann::json ranks = nlohmann::json::array();
  for (const auto& [rank, identifier] : search.results) {
    if (ranks.size() == LastSearch::kMaxResults) break;
    ranks.push_back({rank, identifier});
  }
  const nlohmann::json json{{"words", search.words}, {"results", std::move(ranks)}};
  const std::string text = json.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace);
  if (text.size() > kMaxFileBytes) return;
  platform::writeFileAtomically(platform::joinPath(place, name), text, nullptr);
  removeOldest(place);
}

std::optional<LastSearch> lastSearch() {
  const std::string name = sessionName();
  if (name.empty()) return std::nullopt;
  const auto text =
      platform::readFile(platform::joinPath(directory(), name), kMaxFileBytes, nullptr);
  if (!text) return std::nullopt;
  try {
    const auto json = nlohmann::json::parse(*text);
    LastSearch search{json.at("words").get<std::string>()};
    for (const auto& row : json.at("results")) {
      search.results[row.at(0).get<size_t>()] = row.at(1).get<std::string>();
    }
    return search;
  } catch (const nlohmann::json::exception&) {
    return std::nullopt;  // the file is not ours, or cut short
  }
}

}  // namespace cli
