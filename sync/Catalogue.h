#pragma once

#include <cstdint>
#include <limits>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "extract/Protocol.h"
#include "sync/Database.h"

namespace mailsync {

// The last batch in which a message was sent. Batches are numbered from 1, and numbers never
// decrease. A message is in the index if its number is at most the catalogue's `acknowledged`; if
// it is larger, the message must be sent.
inline constexpr int64_t kWaiting = std::numeric_limits<int64_t>::max();  // current version unsent
inline constexpr int64_t kFailed = -1;  // not to be sent; `problem` says why

enum class FileKind : int64_t {
  maildir = 0,  // one message, identified by folder and name without flags
  single = 1,   // one message, identified by its path
  mbox = 2,
  other = 3,  // not mail
  alias = 4,  // another path to a file in the catalogue
};

struct DirectoryRow {
  int64_t id = 0;
  int64_t parent = 0;  // 0 for a root
  std::string path;    // canonical
  int64_t inode = 0;
  int64_t modified = 0;  // nanoseconds since 1970, when it was last listed
  bool settled = false;  // `modified` was old enough that the next change will alter it
  bool plain = false;    // has files outside of a Maildir, which are checked in every run
  bool missing = false;
};

struct FileRow {
  int64_t id = 0;
  int64_t directory = 0;
  std::string name;
  int64_t inode = 0;
  int64_t size = 0;
  int64_t modified = 0;  // nanoseconds since 1970; -1 forces another check
  FileKind kind = FileKind::other;
};

// Whether a file's metadata is unchanged; its content is then assumed to be unchanged.
[[nodiscard]] inline bool sameState(const FileRow& a, const FileRow& b) {
  return a.inode == b.inode && a.size == b.size && a.modified == b.modified;
}

struct MessageRow {
  int64_t id = 0;
  int64_t file = 0;
  std::string identifier;
  std::string digest;   // of the content; empty until it has been read
  int64_t offset = -1;  // in an mbox file
  std::string flags;    // Maildir letters, sorted
  int64_t sequence = kWaiting;
  bool replace = false;  // an older version is or may be in the index
};

// A message to send, and the file that contains it.
struct WaitingMessage {
  MessageRow message;
  FileKind kind = FileKind::other;
  std::string path;
};

// The states of a folder's messages.
struct FolderCount {
  std::string path;
  int64_t messages = 0;
  int64_t indexed = 0;
  int64_t waiting = 0;
  int64_t failed = 0;
  bool missing = false;
};

// The number of messages of one month.
struct MonthCount {
  std::string month;  // such as 2024-02; empty for messages whose date is not known
  int64_t messages = 0;
};

// What the index held at the end of a run, for the history. Counters grow from one measurement to
// the next, unless the daemon has lost them.
struct Measurement {
  int64_t day = 0;         // such as 20240206, in the user's time zone
  int64_t messages = 0;    // in the index
  int64_t indexBytes = 0;  // on the disk; 0 if not known
  int64_t storeBytes = 0;
  int64_t scans = 0;  // for prefixes, of searches
  double scanSeconds = 0;
  int64_t merges = 0;
  double mergeSeconds = 0;
};

// The days of the history that are kept.
inline constexpr int64_t kMaxMeasurements = 1000;

struct Problem {
  std::string identifier;
  std::string path;
  std::string reason;
};

// A message that the index has, and its date there.
struct IndexedMessage {
  std::string identifier;
  std::optional<int64_t> date;  // seconds since 1970
};

// The current place of a message.
struct MessagePlace {
  std::string path;
  std::optional<int64_t> offset;
  std::string flags;
  bool indexed = false;
};

// The known state of the mail below some roots: where each message is, the metadata of its file,
// and the batch in which it was sent to the daemon. One process at a time writes (see MailSync);
// others may read. One thread.
//
// The first failure of the database is kept in `failure`. Later calls have no lasting effect,
// because a transaction with a failure is never committed.
class Catalogue {
 public:
  // Null with an error if it cannot be opened. A catalogue with another schema is emptied.
  [[nodiscard]] static std::unique_ptr<Catalogue> open(const std::string& path, TLErrorOut error);

  [[nodiscard]] const std::optional<TLError>& failure() const { return _database->failure(); }
  void begin() { _database->execute("BEGIN IMMEDIATE"); }
  // False after a failure; everything since `begin` is then rolled back.
  bool commit();
  void rollback() { _database->execute("ROLLBACK"); }

  // A random name, chosen when the catalogue was created.
  [[nodiscard]] const std::string& id() const { return _id; }
  [[nodiscard]] int64_t acknowledged() const { return _acknowledged; }
  void setAcknowledged(int64_t sequence);
  // The highest batch number of any row; at least `acknowledged`.
  [[nodiscard]] int64_t highestSequence();
  // Deletions up to this batch number have been forgotten.
  [[nodiscard]] int64_t horizon();
  void forgetOldDeletions();
  // Removes all acknowledged deletions, including their bytes in the file. Not between `begin` and
  // `commit`. If the daemon is later restored to an older state, it must be asked for its contents.
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
  // Also removes its messages; those that may be in the index become deletions.
  void removeFile(int64_t id);

  [[nodiscard]] std::vector<MessageRow> messagesOf(int64_t file);
  [[nodiscard]] std::optional<MessageRow> messageWithIdentifier(const std::string& identifier);
  void addMessage(const MessageRow& row);
  // Updates the offset in an mbox file and the flags, which may change without the content.
  void setPlace(int64_t message, int64_t offset, const std::string& flags);
  void setDigest(int64_t message, const std::string& digest);
  // The content has changed: the message must be deleted and added again.
  void setStale(int64_t message);
  // An older version that may be in the index is deleted as well, unless `deleted` says that this
  // is done.
  void setFailed(int64_t message, const std::string& problem, bool deleted = false);
  // As setStale, for all messages but those that failed.
  void setAllStale();
  void removeMessage(int64_t id);
  // Messages that failed are tried again.
  void retryFailed();

  [[nodiscard]] int64_t waitingCount();
  // In order of arrival, so messages of one file are mostly adjacent.
  [[nodiscard]] std::vector<int64_t> waitingIDs(int64_t first = 0);
  // The ID of the newest message.
  [[nodiscard]] int64_t lastMessage() { return scalar("SELECT MAX(id) FROM message"); }
  [[nodiscard]] std::optional<WaitingMessage> waitingMessage(int64_t id);
  // `date` is that of the message in the index, in seconds since 1970.
  void setSent(int64_t message, int64_t sequence, const std::string& digest,
               std::optional<int64_t> date);

  [[nodiscard]] int64_t waitingDeletionCount();
  [[nodiscard]] std::vector<std::string> waitingDeletions();
  void addDeletion(const std::string& identifier);
  void setDeletionSequence(const std::string& identifier, int64_t sequence);

  // Aligns the catalogue with the index. Messages that the index has count as sent; all others
  // wait, and so do those sent after `trusted`, because the index may have another version.
  // Messages that only the index has are deleted.
  void adopt(const std::vector<IndexedMessage>& inIndex, int64_t trusted);

  // What became of attachments, each time that a message was read.
  void addAttachments(const extract::Counts& counts);
  [[nodiscard]] extract::Counts attachments();

  [[nodiscard]] std::vector<FolderCount> folderCounts();
  // By month, in the user's time zone, of the messages that are in the index.
  [[nodiscard]] std::vector<MonthCount> monthCounts();
  [[nodiscard]] std::vector<Problem> problems(size_t most);
  [[nodiscard]] std::optional<MessagePlace> find(const std::string& identifier);

  // The measurements of the last days, oldest first. A day has at most one.
  [[nodiscard]] std::vector<Measurement> measurements();
  [[nodiscard]] bool isMeasured(int64_t day);
  void addMeasurement(const Measurement& measurement);

 private:
  explicit Catalogue(std::unique_ptr<Database> database) : _database(std::move(database)) {}
  bool prepare();
  void noteDeletion(int64_t message);

  // The rows of a query with one parameter. `text` is a string literal.
  std::vector<FileRow> files(const char* text, int64_t value);

  // The prepared statement for a string literal, cached.
  Statement& sql(const char* text);
  int64_t scalar(const char* text);

  const std::unique_ptr<Database> _database;
  std::unordered_map<const char*, Statement> _statements;
  std::string _id;
  int64_t _acknowledged = 0;
};

// The directory of the catalogues: tallow in $XDG_STATE_HOME, by default ~/.local/state.
[[nodiscard]] std::string defaultCatalogueDirectory();

// The catalogue file in `directory` for a runtime directory and a protection class.
[[nodiscard]] std::string cataloguePath(const std::string& directory,
                                        const std::string& runtimeDirectory,
                                        const std::string& protectionClass);

}  // namespace mailsync
