#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace cli {

// The user's settings from config.toml, for `sync`, `watch`, the desktop and `mcp`. Paths are
// absolute.
struct Settings {
  std::vector<std::string> roots;
  std::vector<std::string> excluded;           // directories
  std::vector<std::string> excludedNames;      // directories, relative to each root
  std::map<std::string, std::string> classes;  // protection class by folder
  uint64_t largestMail = 0;                    // in bytes; 0 if the user set no limit
  bool onBattery = false;
  bool attachments = true;  // their text is indexed
  bool desktopSearch = false;
  std::string desktopClass = "default";  // the protection class that the desktop searches
  std::vector<std::string> mcpFolders;   // whose mail `mcp` may show

  [[nodiscard]] bool operator==(const Settings&) const = default;
};

// tallow/config.toml in $XDG_CONFIG_HOME, by default ~/.config.
[[nodiscard]] std::string settingsPath();

// Parses settings from a TOML text; missing keys keep their defaults. Or an error message for the
// user with file, line, key and allowed values. `home` replaces "~".
[[nodiscard]] std::variant<Settings, std::string> parseSettings(std::string_view text,
                                                                const std::string& file,
                                                                const std::string& home);

// The byte after the bracket that opens the list of roots in a TOML text; nullopt if there is none.
[[nodiscard]] std::optional<size_t> startOfRoots(std::string_view text);

// The settings from the user's file; the defaults if there is none.
[[nodiscard]] std::variant<Settings, std::string> readSettings();

}  // namespace cli
