#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "cli/Highlight.h"
#include "cli/LastSearch.h"
#include "cli/MailFile.h"
#include "cli/MailPlaces.h"
#include "cli/MailView.h"
#include "cli/OutputFile.h"
#include "cli/Pager.h"
#include "cli/Reading.h"
#include "cli/Results.h"
#include "platform/Files.h"

namespace cli {

namespace {

std::optional<size_t> rankOf(const std::string& argument) {
  size_t rank = 0;
  const char* const end = argument.data() + argument.size();
  const auto [stop, failure] = std::from_chars(argument.data(), end, rank);
  if (argument.empty() || failure != std::errc() || stop != end) return std::nullopt;
  return rank;
}

// A requested message: its identifier and the words to mark.
struct Wanted {
  std::string identifier;
  std::vector<std::string> words;
};

// Nullopt after an error message, with the exit status in `status`.
std::optional<Wanted> wantedMessage(const std::string& argument, ExitStatus& status) {
  const auto search = lastSearch();
  Wanted wanted;
  if (search) wanted.words = queryWords(search->words);
  const auto rank = rankOf(argument);
  if (!rank) {
    wanted.identifier = namesPath(argument) ? identifiersOf(argument).front() : argument;
    return wanted;
  }
  status = ExitStatus::failure;
  if (!search) {
    complain(std::string("a number is that of a result, and no search of this terminal is known"));
    return std::nullopt;
  }
  const auto found = search->results.find(*rank);
  if (found == search->results.end()) {
    complain(fmt::format("the last search of this terminal showed no result {}", *rank));
    status = ExitStatus::nothingFound;
    return std::nullopt;
  }
  wanted.identifier = found->second;
  return wanted;
}

std::optional<std::string> readMessage(const std::string& identifier, MailReader& reader) {
  std::optional<TLError> error;
  auto message = readSingleMessage(identifier, kMaxMessageBytes, reader, &error);
  if (!message) complain(fmt::format("{}: {}", identifier, error->message));
  return message;
}

std::string readingJSON(MailView& view, const std::string& identifier, const std::string& path) {
  nlohmann::json fields = nlohmann::json::object();
  for (const auto& [name, value] : view.fields()) fields[name] = value;
  nlohmann::json attachments = nlohmann::json::array();
  for (const auto& [name, type, bytes] : view.attachments()) {
    attachments.push_back(
        {{"number", attachments.size() + 1}, {"name", name}, {"type", type}, {"bytes", bytes}});
  }
  const std::string text = view.text();
  return jsonText({{"schema", 1},
                   {"identifier", identifier},
                   {"path", path},
                   {"fields", std::move(fields)},
                   {"text", text},
                   {"complete", view.complete()},
                   {"attachments", std::move(attachments)}});
}

ExitStatus saveAttachment(const Options& options, const MailView& view) {
  const size_t count = view.attachments().size();
  if (options.attachment < 1 || static_cast<uint64_t>(options.attachment) > count) {
    complain(count == 0 ? std::string("the message has no attachments")
                        : fmt::format("the message has no attachment {}, only 1 to {}",
                                      options.attachment, count));
    return ExitStatus::failure;
  }
  const std::string bytes = view.attachment(static_cast<size_t>(options.attachment) - 1);
  if (options.output == "-") {
    if (isatty(STDOUT_FILENO) != 1) return print(bytes);
    complain(std::string("an attachment does not go to a terminal; name a file: -o FILE"));
    return ExitStatus::failure;
  }
  const bool saved =
      options.force ? replaceFile(options.output, bytes) : writeNewFile(options.output, bytes);
  if (saved) {
    return print(
        fmt::format("saved {} as {}\n", sizeText(bytes.size()), cleanForTerminal(options.output)));
  }
  if (errno != EEXIST) {
    complain(platform::posixError(errno, options.output).message);
  } else {
    complain(options.output + (options.force ? " is not a plain file, and stays"
                                             : " is there already; --force replaces a file"));
  }
  return ExitStatus::failure;
}

}  // namespace

ExitStatus runShow(const Options& options) {
  ExitStatus status = ExitStatus::failure;
  const auto wanted = wantedMessage(options.arguments.front(), status);
  if (!wanted) return status;
  MailReader reader(offsetsOfSync(options));
  const auto message = readMessage(wanted->identifier, reader);
  if (!message) return ExitStatus::failure;
  if (options.raw) {
    // Other programs receive the original bytes.
    return isatty(STDOUT_FILENO) == 1 ? page(cleanLinesForTerminal(*message)) : print(*message);
  }
  const auto view = MailView::parse(*message);
  if (view == nullptr) {
    complain(fmt::format("{}: not a mail message; --raw shows it as it is", wanted->identifier));
    return ExitStatus::failure;
  }
  if (options.attachment != 0) return saveAttachment(options, *view);
  const auto place = reader.locate(wanted->identifier);
  const std::string path = place ? place->path : "";
  if (options.format == OutputFormat::json) {
    return print(readingJSON(*view, wanted->identifier, path));
  }
  return page(
      readingText(*view, path, wanted->words, Palette(colorAllowed(options.color, STDOUT_FILENO))));
}

}  // namespace cli
