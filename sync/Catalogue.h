#pragma once

#include <cstdint>
#include <limits>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "sync/Database.h"

namespace mailsync {

// The last batch that a message went out with. Batches are numbered from 1 and never number less
// than before. A message is in the index when its number is at most the catalogue's `acknowledged`;
// a larger one is to be sent.
inline constexpr int64_t kWaiting = std::numeric_limits<int64_t>::max();  // never sent as it is now
inline constexpr int64_t kFailed = -1;  // not to be sent; `problem` tells why

enum class FileKind : int64_t {
  maildir = 0,  // one message, identified by folder and name without flags
  single = 1,   // one message, identified by its path
  mbox = 2,
  other = 3,  // no mail
  alias = 4,  // another path to a file that the catalogue has
};

struct DirectoryRow {
  int64_t id = 0;
  int64_t parent = 0;  // 0 for a root
  std::string path;    // canonical
  int64_t inode = 0;
  int64_t modified = 0;  // nanoseconds since 1970, as of the last look into it
  bool settled = false;  // that time was old enough to tell the next change
  bool plain = false;    // has files other than those of a Maildir, which are looked at each time
  bool missing = false;
};

struct FileRow {
  int64_t id = 0;
  int64_t directory = 0;
  std::string name;
  int64_t inode = 0;
  int64_t size = 0;
  int64_t modified = 0;  // nanoseconds since 1970; -1 to have it looked at again
  FileKind kind = FileKind::other;
};

// Whether a file looks as it did: its content is taken for the same then.
[[nodiscard]] inline bool sameState(const FileRow& a, const FileRow& b) {
  return a.inode == b.inode && a.size == b.size && a.modified == b.modified;
}

struct MessageRow {
  int64_t id = 0;
  int64_t file = 0;
  std::string identifier;
  std::string digest;   // of the content; empty until it was read
  int64_t offset = -1;  // in an mbox file
  std::string flags;    // letters of a Maildir, in order
  int64_t sequence = kWaiting;
  bool replace = false;  // an older version is in the index, or may be
};

// A message to send, with the file that holds it.
struct WaitingMessage {
  MessageRow message;
  FileKind kind = FileKind::other;
  std::string path;
};

// What became of a folder's messages.
struct FolderCount {
  std::string path;
  int64_t messages = 0;
  int64_t indexed = 0;
  int64_t waiting = 0;
  int64_t failed = 0;
  bool missing = false;
};

struct Problem {
  std::string identifier;
  std::string path;
  std::string reason;
};

// Where a message lies at present.
struct MessagePlace {
  std::string path;
  std::optional<int64_t> offset;
  std::string flags;
  bool indexed = false;
};

// What is known of the mail below some roots: where it lies, how its files looked, and with which
// batch each message went to the daemon. One process at a time writes (see MailSync); others may
// read. One thread.
//
// The first failure of the database stays in `failure`; everything after it has no effect that
// counts, since a transaction with a failure is never committed.
class Catalogue {
 public:
  // Null with an error where it cannot be opened; of another schema, it starts afresh.
  [[nodiscard]] static std::unique_ptr<Catalogue> open(const std::string& path, TLErrorOut error);

  [[nodiscard]] const std::optional<TLError>& failure() const { return _database->failure(); }
  void begin() { _database->execute("BEGIN IMMEDIATE"); }
  // False, with everything since `begin` undone, after a failure.
  bool commit();
  void rollback() { _database->execute("ROLLBACK"); }

  // A random name, made with the catalogue.
  [[nodiscard]] const std::string& id() const { return _id; }
  [[nodiscard]] int64_t acknowledged() const { return _acknowledged; }
  void setAcknowledged(int64_t sequence);
  // The highest number that any row has, at least `acknowledged`.
  [[nodiscard]] int64_t highestSequence();
  // Deletions up to this number are forgotten.
  [[nodiscard]] int64_t horizon();
  void forgetOldDeletions();
  // All that the daemon has acknowledged, also in the bytes of the file. Not between `begin` and
  // `commit`. A daemon that is set back afterwards is asked for what it holds.
  bool forgetDeletions();
  [[nodiscard]] std::string value(const char* key);
  void setValue(const char* key, const std::string& value);

  [[nodiscard]] std::vector<std::string> roots();
  void addRoot(const std::string& path);
  void removeRoot(const std::string& path);

  [[nodiscard]] std::vector<DirectoryRow> directories();
  int64_t addDirectory(const DirectoryRow& row);
  void updateDirectory(const DirectoryRow& row);
  void removeDirectory(int64_t id);
  [[nodiscard]] bool hasContent(int64_t directory);

  [[nodiscard]] std::vector<FileRow> filesOf(int64_t directory);
  [[nodiscard]] std::vector<FileRow> filesWithInode(int64_t inode);
  [[nodiscard]] std::vector<FileRow> aliasesIn(int64_t directory);
  [[nodiscard]] std::optional<FileRow> file(int64_t id);
  int64_t addFile(const FileRow& row);
  void updateFile(const FileRow& row);
  // With its messages, which are noted as deletions where they may be in the index.
  void removeFile(int64_t id);

  [[nodiscard]] std::vector<MessageRow> messagesOf(int64_t file);
  [[nodiscard]] std::optional<MessageRow> messageWithIdentifier(const std::string& identifier);
  void addMessage(const MessageRow& row);
  // Of an mbox file, whose messages move; and flags, which are in a file's name.
  void setPlace(int64_t message, int64_t offset, const std::string& flags);
  void setDigest(int64_t message, const std::string& digest);
  // Its content has changed: to be deleted and added.
  void setStale(int64_t message);
  // Unless it has been deleted, an older version that may be in the index is to go.
  void setFailed(int64_t message, const std::string& problem, bool deleted = false);
  void removeMessage(int64_t id);
  // Messages that failed are tried once more.
  void retryFailed();

  [[nodiscard]] int64_t waitingCount();
  // In the order in which they came, so that those of one file mostly stand together.
  [[nodiscard]] std::vector<int64_t> waitingIDs(int64_t first = 0);
  // The number of the message that came last.
  [[nodiscard]] int64_t lastMessage() { return scalar("SELECT MAX(id) FROM message"); }
  [[nodiscard]] std::optional<WaitingMessage> waitingMessage(int64_t id);
  void setSequence(int64_t message, int64_t sequence);

  [[nodiscard]] int64_t waitingDeletionCount();
  [[nodiscard]] std::vector<std::string> waitingDeletions();
  void addDeletion(const std::string& identifier);
  void setDeletionSequence(const std::string& identifier, int64_t sequence);

  // Puts everything to what the index holds: of the messages, those that it has count as found, and
  // all others wait; so do those that went out after `trusted`, as the index may have another
  // version. What it has and the catalogue does not is to be deleted.
  void adopt(const std::vector<std::string>& identifiersInIndex, int64_t trusted);

  [[nodiscard]] std::vector<FolderCount> folderCounts();
  [[nodiscard]] std::vector<Problem> problems(size_t most);
  [[nodiscard]] std::optional<MessagePlace> find(const std::string& identifier);

 private:
  explicit Catalogue(std::unique_ptr<Database> database) : _database(std::move(database)) {}
  bool prepare();
  void noteDeletion(int64_t message);

  // The rows of a literal with one parameter.
  std::vector<FileRow> files(const char* text, int64_t value);

  // The prepared statement of a literal.
  Statement& sql(const char* text);
  int64_t scalar(const char* text);

  const std::unique_ptr<Database> _database;
  std::unordered_map<const char*, Statement> _statements;
  std::string _id;
  int64_t _acknowledged = 0;
};

// Where the catalogues lie: tallow below $XDG_STATE_HOME, which is ~/.local/state unless set.
[[nodiscard]] std::string defaultCatalogueDirectory();

// The file of one runtime directory and protection class in `directory`.
[[nodiscard]] std::string cataloguePath(const std::string& directory,
                                        const std::string& runtimeDirectory,
                                        const std::string& protectionClass);

}  // namespace mailsync
