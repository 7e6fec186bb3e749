#include "cli/Settings.h"

#include <fmt/format.h>

#define TOML_EXCEPTIONS 0
#include <toml++/toml.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cstdlib>
#include <optional>

#include "cli/MailFile.h"
#include "cli/NearestName.h"
#include "platform/Files.h"
#include "platform/Paths.h"

namespace cli {

namespace {

constexpr size_t kMaxFileBytes = size_t{1} << 20;
constexpr uint64_t kMinLimit = 1000;
constexpr uint64_t kMaxLimit = kMaxMessageBytes;

// Reads the value of one key. False if the value is not allowed.
class Reader {
 public:
  Reader(Settings& settings, const std::string& home) : _settings(settings), _home(home) {}

  bool readRoots(const toml::node& value) { return readPaths(value, _settings.roots); }
  bool readMCPFolders(const toml::node& value) { return readPaths(value, _settings.mcpFolders); }
  bool readExcluded(const toml::node& value) {
    return readTexts(value, [this](const std::string& text) {
      const auto path = absolute(text);
      if (path) {
        _settings.excluded.push_back(*path);
      } else {
        _settings.excludedNames.push_back(text);
      }
      return !text.empty();
    });
  }
  bool readClasses(const toml::node& value) {
    const toml::table* const table = value.as_table();
    if (table == nullptr) return false;
    for (const auto& [folder, name] : *table) {
      const auto path = absolute(std::string(folder.str()));
      const auto text = name.value_exact<std::string>();
      if (!path || !text || !platform::namesOneDirectory(*text)) return false;
      _settings.classes[*path] = *text;
    }
    return true;
  }
  bool readLargestMail(const toml::node& value) {
    const auto number = value.value_exact<int64_t>();
    const auto text = value.value_exact<std::string>();
    const auto bytes = number && *number > 0 ? std::optional(static_cast<uint64_t>(*number))
                       : text                ? bytesOf(*text)
                                             : std::nullopt;
    if (!bytes || *bytes < kMinLimit || *bytes > kMaxLimit) return false;
    _settings.largestMail = *bytes;
    return true;
  }
  bool readOnBattery(const toml::node& value) { return readFlag(value, _settings.onBattery); }
  bool readAttachments(const toml::node& value) { return readFlag(value, _settings.attachments); }
  bool readDesktopSearch(const toml::node& value) {
    return readFlag(value, _settings.desktopSearch);
  }
  bool readDesktopClass(const toml::node& value) {
    const auto text = value.value_exact<std::string>();
    if (!text || !platform::namesOneDirectory(*text)) return false;
    _settings.desktopClass = *text;
    return true;
  }

 private:
  static bool readFlag(const toml::node& value, bool& flag) {
    const auto given = value.value_exact<bool>();
    if (given) flag = *given;
    return given.has_value();
  }

  template <typename Take>
  static bool readTexts(const toml::node& value, const Take& take) {
    const toml::array* const list = value.as_array();
    if (list == nullptr) return false;
    for (const toml::node& entry : *list) {
      const auto text = entry.value_exact<std::string>();
      if (!text || text->find('\0') != std::string::npos || !take(*text)) return false;
    }
    return true;
  }

  bool readPaths(const toml::node& value, std::vector<std::string>& paths) const {
    return readTexts(value, [&](const std::string& text) {
      const auto path = absolute(text);
      if (path) paths.push_back(*path);
      return path.has_value();
    });
  }

  [[nodiscard]] std::optional<std::string> absolute(const std::string& text) const {
    if (text.starts_with('/')) return text;
    if (text == "~") return _home;
    if (text.starts_with("~/")) return platform::joinPath(_home, text.substr(2));
    return std::nullopt;
  }

  // The bytes in a text such as "20 MB".
  static std::optional<uint64_t> bytesOf(const std::string& text) {
    uint64_t number = 0;
    const char* const end = text.data() + text.size();
    const auto [rest, failure] = std::from_chars(text.data(), end, number);
    if (failure != std::errc() || number > kMaxLimit) return std::nullopt;
    std::string unit(rest, end);
    unit.erase(0, unit.find_first_not_of(' '));
    if (unit == "KB") return number * 1000;
    if (unit == "MB") return number * 1000 * 1000;
    return std::nullopt;
  }

  Settings& _settings;
  const std::string& _home;
};

struct Key {
  const char* name;
  bool (Reader::*read)(const toml::node& value);
  const char* allowed;
};

constexpr std::array<Key, 9> kKeys{{
    {"roots", &Reader::readRoots, "a list of paths, each from / or ~/ on"},
    {"exclude", &Reader::readExcluded,
     "a list of folders, from / or ~/ on, or below each root: [\".Trash\", \"~/Mail/old\"]"},
    {"class", &Reader::readClasses,
     "a table of folders, from / or ~/ on, with their protection class: {\"~/Mail/work\" = "
     "\"work\"}"},
    {"largest_mail", &Reader::readLargestMail,
     "a number of bytes or a text such as \"500 KB\" or \"20 MB\", from 1 KB to 67 MB"},
    {"on_battery", &Reader::readOnBattery, "true or false"},
    {"attachments", &Reader::readAttachments, "true or false"},
    {"desktop_search", &Reader::readDesktopSearch, "true or false"},
    {"desktop_class", &Reader::readDesktopClass, "the name of a protection class"},
    {"mcp_folders", &Reader::readMCPFolders, "a list of paths, each from / or ~/ on"},
}};

std::string quoted(std::string_view text) {
  return fmt::format("\"{}\"", text);
}

std::string listOfKeys() {
  std::string list;
  for (const Key& key : kKeys) list += (list.empty() ? "" : ", ") + std::string(key.name);
  return list;
}

std::string tellUnknown(std::string_view name) {
  const char* const nearest = nearestName(name, kKeys);
  const std::string hint = nearest == nullptr ? "the keys are " + listOfKeys()
                                              : fmt::format("did you mean {}?", quoted(nearest));
  return fmt::format("there is no key {}; {}", quoted(name), hint);
}

std::string variable(const char* name) {
  const char* const value = std::getenv(name);
  return value == nullptr ? "" : value;
}

}  // namespace

std::string settingsPath() {
  std::string base = variable("XDG_CONFIG_HOME");
  if (!base.starts_with('/')) base = platform::joinPath(variable("HOME"), ".config");
  return platform::joinPath(base, "tallow/config.toml");
}

std::variant<Settings, std::string> parseSettings(std::string_view text, const std::string& file,
                                                  const std::string& home) {
  const toml::parse_result result = toml::parse(text);
  if (!result) {
    return fmt::format("{}:{}: {}", file, result.error().source().begin.line,
                       std::string_view(result.error().description()));
  }
  Settings settings;
  Reader reader(settings, home);
  for (const auto& [name, value] : result.table()) {
    const auto key =
        std::find_if(kKeys.begin(), kKeys.end(),
                     [&, word = name.str()](const Key& row) { return word == row.name; });
    const std::string where = fmt::format("{}:{}: ", file, name.source().begin.line);
    if (key == kKeys.end()) return where + tellUnknown(name.str());
    if (!(reader.*key->read)(value)) {
      return fmt::format("{}{} takes {}", where, key->name, key->allowed);
    }
  }
  return settings;
}

std::optional<size_t> startOfRoots(std::string_view text) {
  const toml::parse_result result = toml::parse(text);
  const toml::array* const roots = result ? result.table()["roots"].as_array() : nullptr;
  if (roots == nullptr) return std::nullopt;
  // Only a key stands before the list in its line, so that its columns are bytes.
  const toml::source_position begin = roots->source().begin;
  size_t line = 0;
  for (size_t i = 1; i < begin.line && line < text.size(); ++i) {
    line = std::min(text.find('\n', line), text.size() - 1) + 1;
  }
  return line + begin.column;
}

std::variant<Settings, std::string> readSettings() {
  const std::string path = settingsPath();
  std::optional<TLError> error;
  const auto text = platform::readFile(path, kMaxFileBytes, &error);
  if (text) return parseSettings(*text, path, variable("HOME"));
  if (error->code == ENOENT) return Settings();
  return error->message;
}

}  // namespace cli
