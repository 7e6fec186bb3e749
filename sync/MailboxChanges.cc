#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <utility>

#include "cli/Identifier.h"
#include "cli/MailFile.h"
#include "sync/MailboxScan.h"
#include "sync/MessageDigest.h"

// Settles files that were added, removed or changed.
namespace mailsync {

namespace {

// The messages found in a file outside of Maildirs.
struct FileContent {
  struct Message {
    std::string digest;
    int64_t offset;
    std::string flags;
    std::string problem;
  };
  FileKind kind = FileKind::other;
  std::vector<Message> messages;
  std::optional<std::string> failure;  // of the file as a whole
  bool complete = true;                // it was read to its end
};

FileContent readContent(const std::string& path) {
  FileContent content;
  const cli::MailSink sink{
      [&](std::string_view bytes, const cli::MessageOrigin& origin) {
        content.kind = origin.offset ? FileKind::mbox : FileKind::single;
        content.messages.push_back({messageDigest(bytes),
                                    origin.offset ? static_cast<int64_t>(*origin.offset) : -1,
                                    origin.offset ? statusFlags(bytes) : "", ""});
        content.complete = true;
        return true;
      },
      [&](const std::string& where, const std::string& reason) {
        content.complete = false;
        if (where == path) {
          content.failure = reason;
        } else {
          const std::string offset = where.substr(std::min(path.size() + 1, where.size()));
          content.kind = FileKind::mbox;
          content.messages.push_back({"", std::strtoll(offset.c_str(), nullptr, 10), "", reason});
        }
        return true;
      },
      [](const std::string&) {}, [](uint64_t) {}};
  cli::readMailFile(path, false, sink);
  return content;
}

}  // namespace

void MailboxScan::finish() {
  while (!_settings.cancelled() && (!_arrivals.empty() || !_departures.empty())) {
    // Aliases are removed first, because their names may be needed.
    for (auto id = _departures.begin(); id != _departures.end();) {
      const auto row = _catalogue.file(*id);
      if (row && row->kind == FileKind::alias) _catalogue.removeFile(*id);
      id = !row || row->kind == FileKind::alias ? _departures.erase(id) : std::next(id);
    }
    for (Arrival& arrival : std::exchange(_arrivals, {})) settle(arrival);
    for (const int64_t id : std::exchange(_departures, {})) {
      if (const auto row = _catalogue.file(id)) removeFile(*row);
    }
  }
  settleMissing();
}

void MailboxScan::settle(Arrival& arrival) {
  if (cli::isMaildirFile(arrival.path)) {
    arrival.row.kind = FileKind::maildir;
    if (settleMaildir(arrival)) return;
  }
  if (!settleAlias(arrival)) addFile(arrival);
}

// True if the message is known by another name.
bool MailboxScan::settleMaildir(Arrival& arrival) {
  const auto message = _catalogue.messageWithIdentifier(cli::maildirIdentifier(arrival.path));
  const auto before = message ? _catalogue.file(message->file) : std::nullopt;
  if (!before) return false;
  struct stat info {};
  if (!_departures.contains(before->id) && stat(pathOf(*before).c_str(), &info) == 0) {
    arrival.row.kind = FileKind::alias;
    _catalogue.addFile(arrival.row);
    return true;
  }
  _departures.erase(before->id);
  arrival.row.id = before->id;
  _catalogue.updateFile(arrival.row);
  const std::string flags(cli::maildirFlags(arrival.path));
  if (flags != message->flags) {
    _catalogue.setPlace(message->id, -1, flags);
    ++_counts.flagChanges;
  } else {
    ++_counts.moves;
  }
  if (!sameState(*before, arrival.row)) checkContent(arrival.path, arrival.row);
  return true;
}

// True if the same file is known by another path.
bool MailboxScan::settleAlias(Arrival& arrival) {
  for (const FileRow& row : _catalogue.filesWithInode(arrival.row.inode)) {
    if (row.kind == FileKind::alias || _departures.contains(row.id)) continue;
    struct stat info {};
    if (stat(pathOf(row).c_str(), &info) == 0) {
      if (static_cast<int64_t>(info.st_ino) != arrival.row.inode ||
          static_cast<int64_t>(info.st_dev) != arrival.device) {
        continue;
      }
      arrival.row.kind = FileKind::alias;
      _catalogue.addFile(arrival.row);
      return true;
    }
    // The file was moved here from a directory that no longer exists.
    if (errno == ENOENT && sameState(row, arrival.row)) _departures.insert(row.id);
  }
  return false;
}

void MailboxScan::addFile(Arrival& arrival) {
  if (arrival.row.kind == FileKind::maildir) {
    MessageRow message;
    message.file = _catalogue.addFile(arrival.row);
    message.identifier = cli::maildirIdentifier(arrival.path);
    message.flags = cli::maildirFlags(arrival.path);
    return _catalogue.addMessage(message);
  }
  arrival.row.kind = FileKind::other;
  arrival.row.id = _catalogue.addFile(arrival.row);
  readPlainFile(arrival.path, arrival.row);
}

// If there is another path to the file, or another file with the message's name, it takes over.
void MailboxScan::removeFile(const FileRow& row) {
  std::vector<FileRow> heirs;
  for (FileRow& other : _catalogue.filesWithInode(row.inode)) {
    if (other.kind == FileKind::alias) heirs.push_back(std::move(other));
  }
  if (row.kind == FileKind::maildir) {
    const std::string path = pathOf(row);
    const std::string folder = std::filesystem::path(path).parent_path().parent_path().string();
    const std::string identifier = cli::maildirIdentifier(path);
    for (const char* sub : {"/new", "/cur"}) {
      const auto directory = _directories.find(folder + sub);
      if (directory == _directories.end()) continue;
      for (FileRow& other : _catalogue.aliasesIn(directory->second.id)) {
        if (cli::maildirIdentifier(pathOf(other)) == identifier) heirs.push_back(std::move(other));
      }
    }
  }
  _catalogue.removeFile(row.id);
  for (const FileRow& heir : heirs) {
    struct stat info {};
    const std::string path = pathOf(heir);
    if (!_catalogue.file(heir.id)) continue;  // named twice
    _catalogue.removeFile(heir.id);
    if (stat(path.c_str(), &info) != 0) continue;
    FileRow arrived = rowOf(info);
    arrived.directory = heir.directory;
    arrived.name = heir.name;
    _arrivals.push_back(
        {heir.directory, path, std::move(arrived), static_cast<int64_t>(info.st_dev)});
  }
}

// --- Contents

void MailboxScan::readPlainFile(const std::string& path, FileRow& row) {
  const FileContent content = readContent(path);
  if (content.failure) {
    _settings.complain(path, *content.failure);
    ++_counts.unreadable;
  }
  std::map<std::string, MessageRow> known;
  for (MessageRow& message : _catalogue.messagesOf(row.id)) {
    std::string identifier = message.identifier;
    known.emplace(std::move(identifier), std::move(message));
  }
  std::map<std::string, int> copies;
  for (const FileContent::Message& seen : content.messages) {
    MessageRow message;
    message.file = row.id;
    message.digest = seen.digest;
    message.offset = seen.offset;
    message.flags = seen.flags;
    if (content.kind == FileKind::single) {
      message.identifier = cli::fileIdentifier(path);
    } else if (!seen.problem.empty()) {
      message.identifier = cli::mboxIdentifier(path, static_cast<uint64_t>(seen.offset));
    } else {
      const int copy = copies[seen.digest]++;
      message.identifier = cli::mboxIdentifier(
          path, copy == 0 ? seen.digest : fmt::format("{}.{}", seen.digest, copy));
    }
    const auto found = known.find(message.identifier);
    if (found == known.end()) {
      _catalogue.addMessage(message);
    } else {
      const MessageRow& before = found->second;
      if (before.flags != message.flags) ++_counts.flagChanges;
      if (before.flags != message.flags || before.offset != message.offset) {
        _catalogue.setPlace(before.id, message.offset, message.flags);
      }
      if (before.digest != message.digest) {
        _catalogue.setStale(before.id);
        _catalogue.setDigest(before.id, message.digest);
      }
      known.erase(found);
    }
    if (!seen.problem.empty()) {
      const auto added = _catalogue.messageWithIdentifier(message.identifier);
      if (added) _catalogue.setFailed(added->id, seen.problem);
    }
  }
  // Messages may follow the place that cannot be read, so none counts as deleted.
  if (content.complete) {
    for (const auto& [identifier, message] : known) _catalogue.removeMessage(message.id);
  }
  row.kind = !content.complete && content.messages.empty() ? row.kind : content.kind;
  // A file may change again within the same time step, and its permissions without a new time.
  if (content.failure || row.modified + kTimeStep >= _now) row.modified = -1;
  _catalogue.updateFile(row);
}

// For a Maildir file: checks whether the message has changed, or may be retried after a failure.
void MailboxScan::checkContent(const std::string& path, const FileRow& row) {
  const FileContent content = readContent(path);
  for (const MessageRow& message : _catalogue.messagesOf(row.id)) {
    const std::string digest = content.messages.empty() ? "" : content.messages.front().digest;
    if (digest == message.digest && message.sequence != kFailed) continue;
    if (message.digest.empty() && message.sequence == kWaiting) continue;
    _catalogue.setStale(message.id);
    _catalogue.setDigest(message.id, digest);
  }
}

}  // namespace mailsync
