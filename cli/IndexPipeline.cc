#include "cli/IndexPipeline.h"

#include "cli/MailWalker.h"
#include "cli/MessageParser.h"
#include "platform/Queue.h"

namespace cli {

// The work of the reading thread: gathers a batch and pushes it when it is full.
class IndexPipeline::Reading {
 public:
  explicit Reading(IndexPipeline& pipeline)
      : _pipeline(pipeline), _parser(pipeline._extractProgram) {}

  bool walk(const std::string& path) {
    const MailSink sink{
        [this](std::string_view bytes, const MessageOrigin& origin) { return add(bytes, origin); },
        [this](const std::string& where, const std::string& reason) {
          (where == _named ? _batch.pathFailures : _batch.messageFailures)
              .push_back({where, reason});
          return flushIfFull();
        },
        [this](const std::string& ignored) { _batch.ignored.push_back(ignored); },
        [this](uint64_t bytes) { _batch.inputBytes += bytes; }};
    return walkMail(path, {[&](const std::string& file, bool named, uint64_t) {
                             _named = named ? file : std::string();
                             return readMailFile(file, named, sink);
                           },
                           [&](const std::string& where, const std::string& reason) {
                             _batch.pathFailures.push_back({where, reason});
                             return flushIfFull();
                           }});
  }

  bool flush() { return _pipeline._queue.push(std::exchange(_batch, MailBatch())); }

 private:
  bool add(std::string_view bytes, const MessageOrigin& origin) {
    auto result = _parser.parse(bytes, origin);
    if (const auto* bad = std::get_if<UnparsableMessage>(&result)) {
      _batch.messageFailures.push_back({origin.identifier, bad->reason});
      return flushIfFull();
    }
    const auto& message = std::get<ParsedMessage>(result);
    if (message.cut) _batch.cut.push_back(origin.identifier);
    _batch.attachments.add(message.attachments);
    client::EncodedItem item = client::encode(*message.item);
    if (!_batch.items.empty() && _batch.itemBytes + item.bytes.size() > kBatchBytes && !flush()) {
      return false;
    }
    _batch.itemBytes += item.bytes.size();
    _batch.items.push_back(std::move(item));
    return flushIfFull();
  }

  bool flushIfFull() {
    const size_t reports = _batch.messageFailures.size() + _batch.pathFailures.size() +
                           _batch.ignored.size() + _batch.cut.size();
    const bool full = _batch.items.size() >= kBatchItems || _batch.itemBytes >= kBatchBytes ||
                      reports >= kBatchReports;
    return !full || flush();
  }

  IndexPipeline& _pipeline;
  MessageParser _parser;
  MailBatch _batch;
  std::string _named;
};

IndexPipeline::IndexPipeline(std::vector<std::string> paths, std::string extractProgram)
    : _paths(std::move(paths)),
      _extractProgram(std::move(extractProgram)),
      _thread([this] { run(); }) {}

IndexPipeline::~IndexPipeline() {
  _queue.cancel();
  _thread.join();
}

void IndexPipeline::run() {
  platform::setThreadName("tallow.reader");
  Reading reading(*this);
  bool goOn = true;
  for (const std::string& path : _paths) goOn = goOn && reading.walk(path);
  if (goOn) reading.flush();
  _queue.end();
}

}  // namespace cli
