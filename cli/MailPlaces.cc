#include "cli/MailPlaces.h"

#include <algorithm>
#include <charconv>
#include <filesystem>
#include <memory>
#include <utility>

#include "cli/Identifier.h"
#include "cli/SyncCommand.h"
#include "platform/Files.h"

namespace cli {

namespace {

// Splits PATH:OFFSET as written by `tallow search --format=files`; nullopt if a file has that name.
std::optional<std::pair<std::string, uint64_t>> messageInFile(const std::string& path) {
  const size_t colon = path.rfind(':');
  if (colon == std::string::npos || platform::fileExists(path)) return std::nullopt;
  uint64_t offset = 0;
  const char* const end = path.data() + path.size();
  const auto [stop, failure] = std::from_chars(path.data() + colon + 1, end, offset);
  if (failure != std::errc() || stop != end) return std::nullopt;
  return std::pair(path.substr(0, colon), offset);
}

void addNew(std::vector<std::string>& list, std::string text) {
  if (std::find(list.begin(), list.end(), text) == list.end()) list.push_back(std::move(text));
}

}  // namespace

MailReader::OffsetOf offsetsOfSync(const Options& options) {
  struct Opened {
    bool tried = false;
    std::unique_ptr<mailsync::Catalogue> catalogue;
  };
  return [opened = std::make_shared<Opened>(), settings = syncSettings(options)](
             const std::string& identifier) -> std::optional<uint64_t> {
    if (!std::exchange(opened->tried, true)) {
      opened->catalogue = mailsync::openCatalogue(settings, nullptr);
    }
    if (opened->catalogue == nullptr) return std::nullopt;
    const auto place = opened->catalogue->find(identifier);
    if (!place || !place->offset) return std::nullopt;
    return static_cast<uint64_t>(*place->offset);
  };
}

bool namesPath(const std::string& argument) {
  for (const char* const begin : {"/", "./", "../"}) {
    if (argument.starts_with(begin)) return true;
  }
  if (argument == "." || argument == ".." || platform::fileExists(argument)) return true;
  const auto message = messageInFile(argument);
  return message && platform::fileExists(message->first);
}

std::vector<std::string> spellingsOf(const std::string& path) {
  std::error_code failure;
  std::vector<std::string> spellings;
  for (const auto& found : {std::filesystem::weakly_canonical(path, failure),
                            std::filesystem::absolute(path, failure).lexically_normal()}) {
    std::string text = found.string();
    while (text.size() > 1 && text.ends_with('/')) text.pop_back();
    if (!text.empty()) addNew(spellings, std::move(text));
  }
  return spellings;
}

std::vector<std::string> identifiersOf(const std::string& path) {
  std::vector<std::string> identifiers;
  const auto message = messageInFile(path);
  for (const std::string& spelling : spellingsOf(message ? message->first : path)) {
    if (message) {
      addNew(identifiers, mboxIdentifier(spelling, message->second));
      continue;
    }
    if (isMaildirFile(spelling)) addNew(identifiers, maildirIdentifier(spelling));
    addNew(identifiers, fileIdentifier(spelling));
  }
  return identifiers;
}

}  // namespace cli
