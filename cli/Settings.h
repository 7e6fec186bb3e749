#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace cli {

// What the user has set for `sync` and `watch` in config.toml. Paths are absolute.
struct Settings {
  std::vector<std::string> roots;
  std::vector<std::string> excluded;           // directories
  std::vector<std::string> excludedNames;      // the same, below each root
  std::map<std::string, std::string> classes;  // protection class by folder
  uint64_t largestMail = 0;                    // in bytes; 0 for no limit of the user's own
  bool onBattery = false;
};

// config.toml in tallow below $XDG_CONFIG_HOME, which is ~/.config unless set.
[[nodiscard]] std::string settingsPath();

// The settings of a TOML text; those that it does not name keep their default. Or what is wrong
// with it, for the user: file, line, key and what is allowed. `home` stands for "~".
[[nodiscard]] std::variant<Settings, std::string> parseSettings(std::string_view text,
                                                                const std::string& file,
                                                                const std::string& home);

// Those of the user's file; without one, the defaults.
[[nodiscard]] std::variant<Settings, std::string> readSettings();

}  // namespace cli
