#include "cli/Identifier.h"

#include <fmt/format.h>

#include <charconv>
#include <string>

#include "platform/Files.h"

namespace cli {

namespace {

constexpr std::string_view kFilePrefix = "file/";
constexpr std::string_view kMboxPrefix = "mbox/";
constexpr std::string_view kOffset = "?offset=";
constexpr std::string_view kMessage = "?message=";
constexpr std::string_view kFlags = ":2,";

bool isUnreserved(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
         std::string_view("-._~").find(c) != std::string_view::npos;
}

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  return -1;
}

std::optional<std::string> percentDecode(std::string_view text) {
  std::string bytes;
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '%') {
      bytes.push_back(text[i]);
      continue;
    }
    if (text.size() - i < 3 || hexDigit(text[i + 1]) < 0 || hexDigit(text[i + 2]) < 0) {
      return std::nullopt;
    }
    bytes.push_back(static_cast<char>(hexDigit(text[i + 1]) * 16 + hexDigit(text[i + 2])));
    i += 2;
  }
  return bytes;
}

std::string_view directoryOf(std::string_view path) {
  const size_t slash = path.rfind('/');
  return slash == std::string_view::npos ? std::string_view() : path.substr(0, slash);
}

std::string_view nameOf(std::string_view path) {
  return path.substr(path.rfind('/') + 1);
}

std::string_view withoutFlags(std::string_view path) {
  const size_t flags = path.rfind(kFlags);
  const bool inName = flags != std::string_view::npos && path.find('/', flags) == path.npos;
  return inName ? path.substr(0, flags) : path;
}

}  // namespace

std::string percentEncodePath(std::string_view path) {
  std::string text;
  text.reserve(path.size());
  for (const char c : path) {
    if (c == '/' || isUnreserved(c)) {
      text.push_back(c);
    } else {
      fmt::format_to(std::back_inserter(text), "%{:02X}", static_cast<unsigned char>(c));
    }
  }
  return text;
}

bool isMaildirFile(std::string_view path) {
  const std::string_view directory = nameOf(directoryOf(path));
  return directory == "cur" || directory == "new";
}

std::string fileIdentifier(std::string_view path) {
  const std::string_view named = isMaildirFile(path) ? withoutFlags(path) : path;
  return std::string(kFilePrefix.substr(0, kFilePrefix.size() - 1)) + percentEncodePath(named);
}

std::string mboxIdentifier(std::string_view path, uint64_t offset) {
  return fmt::format("{}{}{}{}", kMboxPrefix.substr(0, kMboxPrefix.size() - 1),
                     percentEncodePath(path), kOffset, offset);
}

std::string mboxIdentifier(std::string_view path, std::string_view message) {
  return fmt::format("{}{}{}{}", kMboxPrefix.substr(0, kMboxPrefix.size() - 1),
                     percentEncodePath(path), kMessage, message);
}

std::string maildirIdentifier(std::string_view path) {
  const std::string_view folder = directoryOf(directoryOf(path));
  return fileIdentifier(fmt::format("{}/cur/{}", folder, nameOf(path)));
}

std::string_view maildirFlags(std::string_view path) {
  const std::string_view name = withoutFlags(path);
  return name.size() == path.size() ? std::string_view() : path.substr(name.size() + kFlags.size());
}

std::optional<MailLocation> parseIdentifier(std::string_view identifier) {
  const bool isFile = identifier.starts_with(kFilePrefix);
  if (!isFile && !identifier.starts_with(kMboxPrefix)) return std::nullopt;
  std::string_view path = identifier.substr(kFilePrefix.size() - 1);
  MailLocation location;
  if (!isFile) {
    const size_t query = path.rfind('?');
    if (query == std::string_view::npos) return std::nullopt;
    const std::string_view place = path.substr(query);
    if (place.starts_with(kMessage)) {
      location.message = std::string(place.substr(kMessage.size()));
    } else if (place.starts_with(kOffset)) {
      const std::string_view number = place.substr(kOffset.size());
      uint64_t offset = 0;
      const auto [end, failure] =
          std::from_chars(number.data(), number.data() + number.size(), offset);
      if (failure != std::errc() || end != number.data() + number.size()) return std::nullopt;
      location.offset = offset;
    } else {
      return std::nullopt;
    }
    path = path.substr(0, query);
  }
  auto decoded = percentDecode(path);
  if (!decoded) return std::nullopt;
  location.path = std::move(*decoded);
  return location;
}

std::string findMaildirFile(const std::string& path) {
  if (!isMaildirFile(path) || platform::fileExists(path)) return path;
  const std::string name(nameOf(path));
  const std::string maildir(directoryOf(directoryOf(path)));
  for (const char* sub : {"cur", "new"}) {
    const std::string directory = maildir + '/' + sub + '/';
    const auto entries = platform::listDirectory(directory, nullptr);
    if (!entries) continue;
    for (const std::string& entry : *entries) {
      if (withoutFlags(entry) == name) return directory + entry;
    }
  }
  return path;
}

}  // namespace cli
