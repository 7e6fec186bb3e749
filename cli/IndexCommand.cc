#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <nlohmann/json.hpp>

#include "cli/AttachmentCounts.h"
#include "cli/BatchPace.h"
#include "cli/Commands.h"
#include "cli/ErrorText.h"
#include "cli/HelperProgram.h"
#include "cli/IndexPipeline.h"
#include "cli/MailWalker.h"
#include "cli/MessageParser.h"
#include "cli/ProgressBar.h"
#include "cli/Results.h"
#include "cli/Settings.h"
#include "cli/SyncCommand.h"
#include "client/SearchServiceProxy.h"
#include "sync/MessageDigest.h"

namespace cli {

namespace {

uint64_t totalBytes(const std::vector<std::string>& paths) {
  uint64_t total = 0;
  const WalkVisitor visitor{[&](const std::string&, bool, uint64_t size) {
                              total += size;
                              return true;
                            },
                            [](const std::string&, const std::string&) { return true; }};
  for (const std::string& path : paths) walkMail(path, visitor);
  return total;
}

// Settings that are wrong do not keep mail out: `index` uses no other setting.
std::string programFor(const Options& options) {
  const auto settings = readSettings();
  const auto* const read = std::get_if<Settings>(&settings);
  return extractProgram(options, read == nullptr || read->attachments);
}

// One run of `index`: sends the batches and counts the results.
class Indexing {
 public:
  explicit Indexing(const Options& options)
      : _options(options),
        _service(options.runtimeDirectory, options.patience()),
        _progress(ProgressBar::shown() ? totalBytes(options.arguments) : 0) {}

  ExitStatus run() {
    IndexPipeline pipeline(_options.arguments, programFor(_options));
    while (!interrupted()) {
      auto batch = pipeline.next();
      if (!batch) break;
      report(*batch);
      std::optional<TLError> error;
      if (!sendInPieces(batch->items, &error)) {
        _progress.clear();
        const ExitStatus status = complain(error);
        printSummary();
        return status;
      }
      _bytes += batch->inputBytes;
      _progress.update(_bytes, _indexed);
    }
    _progress.clear();
    const bool written = printSummary();
    const bool failed = _pathFailures + _messageFailures + _refused > 0;
    if (!written || failed || interrupted()) return ExitStatus::failure;
    return _indexed > 0 ? ExitStatus::done : ExitStatus::nothingFound;
  }

 private:
  void say(const std::string& message) {
    _progress.clear();
    complain(message);
  }

  void report(const MailBatch& batch) {
    for (const auto& failure : batch.pathFailures) {
      say(fmt::format("{}: {}", failure.where, failure.reason));
    }
    for (const auto& failure : batch.messageFailures) {
      say(fmt::format("{}: {}", failure.where, failure.reason));
    }
    if (_options.verbose) {
      for (const auto& path : batch.ignored) say(path + ": no mail");
      for (const auto& identifier : batch.cut) say(identifier + ": too long, cut");
    }
    _pathFailures += batch.pathFailures.size();
    _messageFailures += batch.messageFailures.size();
    _ignored += batch.ignored.size();
    _cut += batch.cut.size();
    _attachments.add(batch.attachments);
  }

  // Both return false only if continuing makes no sense.
  bool sendInPieces(std::span<const client::EncodedItem> items, TLErrorOut error) {
    while (!items.empty() && !interrupted()) {
      const auto piece = items.first(std::min(_pace.items(), items.size()));
      const auto start = std::chrono::steady_clock::now();
      if (!send(piece, error)) return false;
      _pace.replied(piece.size(), std::chrono::steady_clock::now() - start);
      items = items.subspan(piece.size());
    }
    return true;
  }
  bool send(std::span<const client::EncodedItem> items, TLErrorOut error) {
    std::optional<TLError> failure;
    if (_service.indexItems(items, _options.name, _options.protectionClass, &failure)) {
      _indexed += items.size();
      return true;
    }
    if (!isRefusedMessage(*failure)) {
      platform::setError(error, *failure);
      return false;
    }
    if (items.size() == 1) {
      say(fmt::format("{}: {}", items[0].identifier, plainText(*failure)));
      ++_refused;
      return true;
    }
    // The batch failed at one item. Sends each item alone to find it.
    for (const client::EncodedItem& item : items) {
      if (!send(std::span(&item, 1), error)) return false;
    }
    return true;
  }

  bool printSummary() const {
    std::string text;
    if (_options.format == OutputFormat::json) {
      text = jsonText({{"indexed", _indexed},
                       {"unreadableMessages", _messageFailures},
                       {"unreadablePaths", _pathFailures},
                       {"refused", _refused},
                       {"cut", _cut},
                       {"ignoredFiles", _ignored},
                       {"attachments", attachmentJSON(_attachments)},
                       {"interrupted", interrupted()}});
    } else {
      text = fmt::format("{} messages indexed", _indexed);
      const auto add = [&](uint64_t count, const char* what) {
        if (count > 0) text += fmt::format(", {} {}", count, what);
      };
      add(_messageFailures, "unreadable");
      add(_pathFailures, "paths not read");
      add(_refused, "refused by the daemon");
      add(_cut, "too long and cut");
      add(_ignored, "other files ignored");
      text += interrupted() ? ", interrupted\n" : "\n";
      if (_options.verbose) text += attachmentText(_attachments, "attachments: ", "attachments: ");
    }
    return std::fwrite(text.data(), 1, text.size(), stdout) == text.size() &&
           std::fflush(stdout) == 0;
  }

  const Options& _options;
  client::SearchServiceProxy _service;
  ProgressBar _progress;
  BatchPace _pace;
  uint64_t _bytes = 0;
  uint64_t _indexed = 0;
  uint64_t _messageFailures = 0;
  uint64_t _pathFailures = 0;
  uint64_t _refused = 0;
  uint64_t _cut = 0;
  uint64_t _ignored = 0;
  extract::Counts _attachments;
};

// Reads the standard input to its end, up to one byte over the limit of a message.
std::optional<std::string> readStandardInput() {
  std::string text;
  std::array<char, 65536> buffer;
  while (text.size() <= kMaxMessageBytes) {
    const ssize_t count = read(STDIN_FILENO, buffer.data(), buffer.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return std::nullopt;
    if (count == 0) break;
    text.append(buffer.data(), static_cast<size_t>(count));
  }
  return text;
}

// Indexes one message from the standard input, for delivery agents. It has no place, so its
// identifier comes from its content.
ExitStatus indexStandardInput(const Options& options) {
  const auto text = readStandardInput();
  if (!text || text->size() > kMaxMessageBytes) {
    complain(text ? fmt::format("the message is longer than {} MiB", kMaxMessageBytes >> 20)
                  : std::string("the standard input cannot be read"));
    return ExitStatus::failure;
  }
  std::string_view message = *text;
  if (message.starts_with("From ")) {
    message.remove_prefix(std::min(message.find('\n'), message.size() - 1) + 1);
  }
  MessageParser parser(programFor(options));
  auto result = parser.parse(message, {"message/" + mailsync::messageDigest(message), "", ""});
  if (const auto* bad = std::get_if<UnparsableMessage>(&result)) {
    complain("the standard input: " + bad->reason);
    return ExitStatus::failure;
  }
  const client::EncodedItem item = client::encode(*std::get<ParsedMessage>(result).item);
  client::SearchServiceProxy service(options.runtimeDirectory, options.patience());
  std::optional<TLError> error;
  if (!service.indexItems(std::span(&item, 1), options.name, options.protectionClass, &error)) {
    return complain(error);
  }
  return print(options.format == OutputFormat::json
                   ? jsonText({{"indexed", 1}, {"identifier", item.identifier}})
                   : std::string("1 message indexed\n"));
}

}  // namespace

ExitStatus runIndex(const Options& options) {
  if (options.arguments.size() == 1 && options.arguments[0] == "-") {
    return indexStandardInput(options);
  }
  return Indexing(options).run();
}

}  // namespace cli
