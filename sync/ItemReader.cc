#include "sync/ItemReader.h"

#include <fmt/format.h>
#include <unistd.h>

#include <map>
#include <span>

#include "cli/Identifier.h"
#include "cli/IndexPipeline.h"
#include "cli/MailDate.h"
#include "cli/MailFile.h"
#include "cli/MessageParser.h"
#include "platform/Queue.h"
#include "sync/MessageDigest.h"

namespace mailsync {

namespace {

void addFlags(TLIndexableItem& item, const std::string& flags) {
  const auto add = [&](TLAttributeKey key, char letter) {
    item.addAttributeWithKeyIntValue(key, flags.find(letter) != std::string::npos ? 1 : 0);
  };
  add(TLAttributeKey::READ, 'S');
  add(TLAttributeKey::FLAGGED, 'F');
  add(TLAttributeKey::REPLIED_TO, 'R');
}

}  // namespace

// The work of the reading thread: gathers a batch and pushes it when it is full.
class ItemReader::Reading {
 public:
  explicit Reading(ItemReader& reader) : _reader(reader), _parser(reader._extractProgram) {}

  // All messages must be from one file.
  bool read(std::span<const WaitingMessage> group) {
    std::map<std::string, const WaitingMessage*> wanted;
    for (const WaitingMessage& waiting : group) wanted[waiting.message.identifier] = &waiting;
    const FileKind kind = group.front().kind;
    // The file may have been renamed for a flag since the scan.
    const std::string path = cli::findMaildirFile(group.front().path);
    std::map<std::string, int> copies;
    bool goOn = true;
    const cli::MailSink sink{
        [&](std::string_view bytes, const cli::MessageOrigin& origin) {
          const std::string digest = messageDigest(bytes);
          const WaitingMessage* message = &group.front();
          if (kind == FileKind::mbox) {
            const int copy = copies[digest]++;
            const auto found = wanted.find(
                cli::mboxIdentifier(path, copy == 0 ? digest : fmt::format("{}.{}", digest, copy)));
            if (found == wanted.end()) return true;
            message = found->second;
          }
          goOn = add(*message, bytes, digest, origin);
          return goOn && kind == FileKind::mbox;
        },
        [&](const std::string& where, const std::string& reason) {
          if (kind != FileKind::mbox) goOn = fail(group.front(), where, reason, isReadable(path));
          return goOn;
        },
        [](const std::string&) {}, [](uint64_t) {}};
    cli::readMailFile(path, true, sink);
    return goOn;
  }

  bool flush() { return _reader._queue.push(std::exchange(_batch, ReadBatch())); }

 private:
  static bool isReadable(const std::string& path) { return access(path.c_str(), R_OK) == 0; }

  bool add(const WaitingMessage& waiting, std::string_view bytes, const std::string& digest,
           cli::MessageOrigin origin) {
    const std::string where = origin.identifier;
    const uint64_t largest = _reader._largestMessage;
    if (largest > 0 && bytes.size() > largest) {
      return fail(waiting, where, fmt::format("larger than the limit of {} bytes", largest), true);
    }
    origin.identifier = waiting.message.identifier;
    auto result = _parser.parse(bytes, origin);
    if (const auto* bad = std::get_if<cli::UnparsableMessage>(&result)) {
      return fail(waiting, where, bad->reason, true);
    }
    const auto& parsed = std::get<cli::ParsedMessage>(result);
    addFlags(*parsed.item, waiting.message.flags);
    client::EncodedItem item = client::encode(*parsed.item);
    if (!_batch.items.empty() && _batch.bytes + item.bytes.size() > cli::kBatchBytes && !flush()) {
      return false;
    }
    _batch.bytes += item.bytes.size();
    _batch.cut += parsed.cut ? 1 : 0;
    _batch.attachments.add(parsed.attachments);
    const bool replace = waiting.message.replace || waiting.message.sequence != kWaiting;
    _batch.items.push_back({waiting.message.id, replace, digest,
                            cli::wholeSeconds(cli::dateOf(*parsed.item)), std::move(item)});
    return flushIfFull();
  }

  bool fail(const WaitingMessage& waiting, const std::string& where, const std::string& reason,
            bool lasting) {
    _batch.failures.push_back({waiting.message.id, where, reason, lasting});
    return flushIfFull();
  }

  bool flushIfFull() {
    const bool full = _batch.items.size() >= cli::kBatchItems || _batch.bytes >= cli::kBatchBytes ||
                      _batch.failures.size() >= cli::kBatchReports;
    return !full || flush();
  }

  ItemReader& _reader;
  cli::MessageParser _parser;
  ReadBatch _batch;
};

ItemReader::ItemReader(std::vector<WaitingMessage> messages, uint64_t largestMessage,
                       std::string extractProgram)
    : _messages(std::move(messages)),
      _largestMessage(largestMessage),
      _extractProgram(std::move(extractProgram)),
      _thread([this] { run(); }) {}

ItemReader::~ItemReader() {
  _queue.cancel();
  _thread.join();
}

void ItemReader::run() {
  platform::setThreadName("tallow.reader");
  Reading reading(*this);
  bool goOn = true;
  const std::span<const WaitingMessage> all(_messages);
  for (size_t begin = 0; goOn && begin < all.size();) {
    size_t end = begin + 1;
    while (end < all.size() && all[end].path == all[begin].path) ++end;
    goOn = reading.read(all.subspan(begin, end - begin));
    begin = end;
  }
  if (goOn) reading.flush();
  _queue.end();
}

}  // namespace mailsync
