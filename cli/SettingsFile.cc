#include "cli/SettingsFile.h"

#include <fmt/format.h>
#include <fmt/ranges.h>

#include <cerrno>
#include <filesystem>
#include <nlohmann/json.hpp>

#include "cli/Settings.h"
#include "cli/Terminal.h"
#include "platform/Files.h"
#include "platform/Text.h"

namespace cli {

namespace {

constexpr size_t kMaxFileBytes = size_t{1} << 20;
constexpr const char* kHead = "# Made by `tallow setup`; tallow-config(5) describes all keys.\n";

// TOML and JSON write strings alike, and control characters only as escapes.
std::string quotedPath(const std::string& path, const std::string& home) {
  const bool below = home.size() > 1 && path.starts_with(home + '/');
  return escapeJSONForTerminal(
      nlohmann::json(below ? '~' + path.substr(home.size()) : path).dump());
}

std::string quotedList(const std::vector<std::string>& paths, const std::string& home) {
  std::vector<std::string> quoted;
  for (const std::string& path : paths) quoted.push_back(quotedPath(path, home));
  return fmt::format("{}", fmt::join(quoted, ", "));
}

// The text with the list in its place.
std::string inserted(const std::string& text, const Settings& before,
                     const std::vector<std::string>& paths, const std::string& home) {
  const auto place = startOfRoots(text);
  if (!place) return (text.empty() ? kHead : "") + rootsLine(paths, home) + text;
  std::string result = text;
  const std::string list = quotedList(paths, home) + (before.roots.empty() ? "" : ", ");
  return result.insert(std::min(*place, text.size()), list);
}

// The file that is to be replaced: what links lead to.
std::string targetOf(const std::string& path) {
  std::error_code failure;
  const auto target = std::filesystem::canonical(path, failure);
  return failure ? path : target.string();
}

}  // namespace

bool fitsSettings(const std::string& path) {
  return platform::isValidUTF8(path);
}

std::string rootsLine(const std::vector<std::string>& paths, const std::string& home) {
  return fmt::format("roots = [{}]\n", quotedList(paths, home));
}

std::optional<std::string> withRoots(const std::string& text, const std::vector<std::string>& paths,
                                     const std::string& home) {
  auto before = parseSettings(text, "", home);
  auto* const wanted = std::get_if<Settings>(&before);
  if (wanted == nullptr) return std::nullopt;
  std::string result = inserted(text, *wanted, paths, home);
  wanted->roots.insert(wanted->roots.begin(), paths.begin(), paths.end());
  const auto after = parseSettings(result, "", home);
  const auto* const read = std::get_if<Settings>(&after);
  if (read == nullptr || *read != *wanted) return std::nullopt;
  return result;
}

bool addRootsToSettings(const std::vector<std::string>& paths, const std::string& home,
                        TLErrorOut error) {
  const std::string path = settingsPath();
  std::optional<TLError> failure;
  const auto text = platform::readFile(path, kMaxFileBytes, &failure);
  if (!text && failure->code != ENOENT) {
    platform::setError(error, *failure);
    return false;
  }
  const auto result = withRoots(text.value_or(""), paths, home);
  if (!result) {
    platform::setError(error, {kPOSIXErrorDomain, EINVAL,
                               path + " stays as it is; add by hand " + rootsLine(paths, home)});
    return false;
  }
  const std::string directory = std::filesystem::path(path).parent_path();
  return platform::createDirectories(directory, error) &&
         platform::writeFileAtomically(targetOf(path), *result, error);
}

}  // namespace cli
