#include "cli/MailProgramSettings.h"

#include <algorithm>
#include <cctype>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <optional>
#include <string_view>

#include "platform/Files.h"
#include "platform/Paths.h"

namespace cli {

namespace {

constexpr size_t kMaxFileBytes = size_t{1} << 20;
constexpr size_t kMaxProfiles = 100;  // of Thunderbird; more are not looked at
constexpr std::string_view kSpace = " \t\r";

std::string_view trimmed(std::string_view text) {
  const size_t begin = text.find_first_not_of(kSpace);
  if (begin == std::string_view::npos) return {};
  return text.substr(begin, text.find_last_not_of(kSpace) - begin + 1);
}

bool sameWord(std::string_view a, std::string_view b) {
  const auto lower = [](char c) { return std::tolower(static_cast<unsigned char>(c)); };
  return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                    [&](char x, char y) { return lower(x) == lower(y); });
}

// What is in quotes, or everything before white space.
std::string_view firstValue(std::string_view text) {
  if (text.empty()) return text;
  if (text[0] == '"' || text[0] == '\'') return text.substr(1, text.find(text[0], 1) - 1);
  return text.substr(0, text.find_first_of(" \t\r;"));
}

using Take = std::function<void(std::string_view value)>;

template <typename Line>
void forEachLine(std::string_view text, const Line& line) {
  while (!text.empty()) {
    const size_t end = std::min(text.find('\n'), text.size());
    line(trimmed(text.substr(0, end)));
    text.remove_prefix(std::min(end + 1, text.size()));
  }
}

// `Path DIR` and `Inbox DIR` of sections that begin with `MaildirStore` and end at an empty line.
void readMbsync(std::string_view text, const Take& take) {
  bool inStore = false;
  forEachLine(text, [&](std::string_view line) {
    const std::string_view key = line.substr(0, line.find_first_of(kSpace));
    if (line.empty()) inStore = false;
    if (sameWord(key, "MaildirStore")) inStore = true;
    if (!inStore || !(sameWord(key, "Path") || sameWord(key, "Inbox"))) return;
    take(firstValue(trimmed(line.substr(key.size()))));
  });
}

// `KEY = VALUE`, and also `KEY: VALUE`.
void readKeys(std::string_view text, std::string_view wanted, const Take& take) {
  forEachLine(text, [&](std::string_view line) {
    const size_t sign = std::min(line.find_first_of("=:"), line.size());
    if (!sameWord(trimmed(line.substr(0, sign)), wanted) || sign == line.size()) return;
    take(trimmed(line.substr(sign + 1)));
  });
}

void readOfflineIMAP(std::string_view text, const Take& take) {
  readKeys(text, "localfolders", take);
}

// `source = maildir://DIR`, also with other types of local mail.
void readAerc(std::string_view text, const Take& take) {
  readKeys(text, "source", [&take](std::string_view value) {
    for (const std::string_view type : {"maildir://", "maildirpp://", "mbox://"}) {
      if (value.starts_with(type)) take(value.substr(type.size()));
    }
  });
}

// `set folder = DIR`, also among other variables.
void readMutt(std::string_view text, const Take& take) {
  static constexpr std::string_view kName = "folder";
  forEachLine(text, [&take](std::string_view line) {
    if (!line.starts_with("set ")) return;
    for (size_t at = line.find(kName); at != std::string_view::npos;
         at = line.find(kName, at + 1)) {
      const std::string_view rest = trimmed(line.substr(at + kName.size()));
      const bool word = kSpace.find(line[at - 1]) != std::string_view::npos;
      if (word && rest.starts_with('=')) take(firstValue(trimmed(rest.substr(1))));
    }
  });
}

struct Program {
  const char* file;  // below the home directory
  void (*read)(std::string_view text, const Take& take);
};

constexpr Program kPrograms[] = {
    {".mbsyncrc", readMbsync},
    {".config/isyncrc", readMbsync},
    {".offlineimaprc", readOfflineIMAP},
    {".config/offlineimap/config", readOfflineIMAP},
    {".muttrc", readMutt},
    {".mutt/muttrc", readMutt},
    {".config/mutt/muttrc", readMutt},
    {".neomuttrc", readMutt},
    {".config/neomutt/neomuttrc", readMutt},
    {".config/aerc/accounts.conf", readAerc},
};

constexpr const char* kThunderbird[] = {".thunderbird",
                                        ".var/app/org.mozilla.Thunderbird/.thunderbird",
                                        "snap/thunderbird/common/.thunderbird"};

std::optional<std::string> absolute(std::string_view value, const std::string& home) {
  if (value.find('\0') != std::string_view::npos) return std::nullopt;
  for (const std::string_view start : {"~/", "$HOME/", "${HOME}/"}) {
    if (value.starts_with(start)) {
      return platform::joinPath(home, std::string(value.substr(start.size())));
    }
  }
  if (value == "~") return home;
  return value.starts_with('/') ? std::optional(std::string(value)) : std::nullopt;
}

std::vector<std::string> thunderbirdFolders(const std::string& directory) {
  std::vector<std::string> folders;
  auto profiles = platform::listDirectory(directory, nullptr);
  if (!profiles) return folders;
  std::sort(profiles->begin(), profiles->end());
  profiles->resize(std::min(profiles->size(), kMaxProfiles));
  for (const std::string& profile : *profiles) {
    for (const char* const name : {"Mail", "ImapMail"}) {
      folders.push_back(platform::joinPath(platform::joinPath(directory, profile), name));
    }
  }
  return folders;
}

}  // namespace

std::vector<std::string> placesOfMailPrograms(const std::string& home) {
  std::vector<std::string> places;
  const Take take = [&](std::string_view value) {
    if (auto path = absolute(value, home)) places.push_back(std::move(*path));
  };
  for (const Program& program : kPrograms) {
    const std::string path = platform::joinPath(home, program.file);
    std::error_code ignored;
    // Anything but a file, such as a pipe, could block.
    if (!std::filesystem::is_regular_file(path, ignored)) continue;
    if (const auto text = platform::readFile(path, kMaxFileBytes, nullptr)) {
      program.read(*text, take);
    }
  }
  for (const char* const directory : kThunderbird) {
    const auto folders = thunderbirdFolders(platform::joinPath(home, directory));
    places.insert(places.end(), folders.begin(), folders.end());
  }
  return places;
}

}  // namespace cli
