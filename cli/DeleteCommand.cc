#include <fmt/format.h>

#include <nlohmann/json.hpp>
#include <set>
#include <span>

#include "cli/Commands.h"
#include "cli/ErrorText.h"
#include "cli/Identifier.h"
#include "cli/MailFacts.h"
#include "cli/MailFile.h"
#include "cli/MailPlaces.h"
#include "cli/Results.h"
#include "cli/StateDirectory.h"
#include "client/SearchServiceProxy.h"
#include "sync/Inventory.h"
#include "sync/MessageDigest.h"

namespace cli {

namespace {

// Maximum number of searches to delete one folder and everything below it.
constexpr int kMaxRounds = 1000;

// The result for one argument.
struct Deletion {
  uint64_t messages = 0;
  std::optional<TLError> error = {};
};

// Deletes the messages and folders that the arguments name, one argument after another.
class Deleting {
 public:
  explicit Deleting(const Options& options)
      : _options(options), _service(options.runtimeDirectory, options.patience()) {}

  Deletion run(const std::string& argument) {
    if (!namesPath(argument)) return deleteFirst({argument});
    for (const std::string& spelling : spellingsOf(argument)) {
      Deletion deletion = deleteFolder(spelling);
      if (deletion.error || deletion.messages > 0) return deletion;
    }
    std::vector<std::string> identifiers = identifiersOf(argument);
    addNamesByContent(identifiers);
    return deleteFirst(identifiers);
  }

 private:
  // `sync` identifies a message of an mbox file by its content, but users name it by its place.
  static void addNamesByContent(std::vector<std::string>& identifiers) {
    MailReader reader;
    for (size_t i = identifiers.size(); i > 0; --i) {
      const auto location = parseIdentifier(identifiers[i - 1]);
      if (!location || !location->offset) continue;
      const auto message = reader.read(identifiers[i - 1], kMaxMessageBytes, nullptr);
      if (!message) continue;
      identifiers.push_back(mboxIdentifier(location->path, mailsync::messageDigest(*message)));
    }
  }

  // Deletes the first of the identifiers that the index knows.
  Deletion deleteFirst(const std::vector<std::string>& identifiers) {
    Deletion deletion;
    for (const std::string& identifier : identifiers) {
      std::optional<TLError> error;
      if (_service.deleteItemsWithIdentifiers(std::span(&identifier, 1), _options.name,
                                              _options.protectionClass, &error)) {
        return {1};
      }
      if (!isNotIndexed(*error)) return {0, error};
    }
    return deletion;
  }

  // Deletes all folders at a path or below it. A reply is bounded, so several may be needed; each
  // removes at least one folder from the next.
  Deletion deleteFolder(const std::string& path) {
    Deletion deletion;
    for (int round = 0; round < kMaxRounds; ++round) {
      const auto items =
          mailsync::itemsAt(_service, _options.protectionClass, path, &deletion.error);
      if (!items) return deletion;
      std::set<std::string> domains;
      uint64_t messages = 0;
      for (const auto& item : *items) {
        if (!mailsync::isAtOrBelow(folderPath(*item), path)) continue;
        domains.insert(platform::toUTF8(platform::orEmpty(item->domainIdentifier())));
        ++messages;
      }
      if (domains.empty()) return deletion;
      const std::vector<std::string> list(domains.begin(), domains.end());
      if (!_service.deleteItemsWithDomainIdentifiers(list, _options.name, _options.protectionClass,
                                                     &deletion.error)) {
        return deletion;
      }
      deletion.messages += messages;
      if (items->size() < static_cast<size_t>(mailsync::kInventoryItems)) break;
    }
    return deletion;
  }

  const Options& _options;
  client::SearchServiceProxy _service;
};

std::string lineOf(const std::string& argument, const Deletion& deletion) {
  const std::string what = cleanForTerminal(argument);
  return deletion.messages == 1 ? fmt::format("deleted {}\n", what)
                                : fmt::format("deleted {}: {} messages\n", what, deletion.messages);
}

}  // namespace

// Handles each argument separately, so that a failure does not stop the others.
ExitStatus runDelete(const Options& options) {
  if (isUnknownClass(options)) return complainOfUnknownClass(options);
  Deleting deleting(options);
  nlohmann::json list = nlohmann::json::array();
  std::string text;
  bool failed = false;
  size_t done = 0;
  for (const std::string& argument : options.arguments) {
    const Deletion deletion = deleting.run(argument);
    if (rpc::isUnreachable(deletion.error)) return complain(deletion.error);
    const bool deleted = !deletion.error && deletion.messages > 0;
    if (deleted) {
      text += lineOf(argument, deletion);
    } else {
      complain(fmt::format("{}: {}", argument,
                           deletion.error ? plainText(*deletion.error) : "not in the index"));
    }
    failed = failed || deletion.error.has_value();
    done += deleted ? 1 : 0;
    list.push_back(
        {{"identifier", argument}, {"deleted", deleted}, {"messages", deletion.messages}});
  }
  ExitStatus status = done > 0 ? ExitStatus::done : ExitStatus::nothingFound;
  if (failed || (done > 0 && done < options.arguments.size())) status = ExitStatus::failure;
  return print(options.format == OutputFormat::json ? jsonText(list) : text, status);
}

}  // namespace cli
