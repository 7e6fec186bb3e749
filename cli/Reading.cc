#include "cli/Reading.h"

#include <fmt/format.h>

#include <cerrno>

#include "cli/Highlight.h"
#include "cli/MailFile.h"

namespace cli {

namespace {

// The longest name of a field, a colon and a space.
constexpr size_t kFieldColumns = 10;

std::nullopt_t fail(TLErrorOut error, const char* reason) {
  platform::setError(error, {"tallow", ENOENT, reason});
  return std::nullopt;
}

}  // namespace

std::optional<std::string> readSingleMessage(const std::string& identifier, size_t most,
                                             MailReader& reader, TLErrorOut error) {
  if (!parseIdentifier(identifier)) return fail(error, "no message on this disk is named so");
  auto message = reader.read(identifier, most, error);
  if (message && message->starts_with("From ") &&
      isFromLine(message->substr(0, message->find('\n') + 1))) {
    return fail(error,
                "this is a mailbox; name one of its messages, as `tallow search --format=files` "
                "does");
  }
  return message;
}

std::string sizeText(uint64_t bytes) {
  if (bytes < 1000) return fmt::format("{} B", bytes);
  if (bytes < 1000000) return fmt::format("{:.1f} kB", static_cast<double>(bytes) / 1e3);
  if (bytes < 1000000000) return fmt::format("{:.1f} MB", static_cast<double>(bytes) / 1e6);
  return fmt::format("{:.1f} GB", static_cast<double>(bytes) / 1e9);
}

std::string readingText(MailView& view, const std::string& path,
                        const std::vector<std::string>& words, const Palette& palette) {
  const auto marked = [&](const std::string& text) {
    return highlight(cleanLinesForTerminal(text), words, palette.match, palette.end);
  };
  std::string out;
  const auto addField = [&](const std::string& name, const std::string& value) {
    out += fmt::format("{}{:{}}{}", palette.faint, name + ':', kFieldColumns, palette.end) + value +
           '\n';
  };
  for (const auto& [name, value] : view.fields()) addField(name, marked(cleanForTerminal(value)));
  addField("File", cleanForTerminal(path));
  const std::string body = marked(view.text());
  out += '\n' + (body.empty() ? fmt::format("{}(no text){}", palette.faint, palette.end) : body);
  if (!out.ends_with('\n')) out += '\n';
  if (!view.complete()) {
    out += fmt::format("\n{}The text is longer than is shown; --raw shows all of it.{}\n",
                       palette.faint, palette.end);
  }
  const auto attachments = view.attachments();
  if (!attachments.empty()) {
    out += fmt::format("\n{}Attachments, saved by --attachment N -o FILE:{}\n", palette.faint,
                       palette.end);
  }
  size_t number = 0;
  for (const auto& attachment : attachments) {
    const std::string name = cleanForTerminal(attachment.name);
    out += fmt::format("{:3}  {}  {}{}, {}{}\n", ++number, name.empty() ? "(no name)" : name,
                       palette.faint, cleanForTerminal(attachment.type), sizeText(attachment.bytes),
                       palette.end);
  }
  return out;
}

}  // namespace cli
