#include "sync/Catalogue.h"

#include <fmt/format.h>
#include <glib.h>

#include <algorithm>
#include <cstdlib>
#include <random>

#include "platform/Files.h"
#include "platform/Paths.h"

namespace mailsync {

namespace {

constexpr const char* kSchemaVersion = "2";
constexpr const char* kSchemaWithoutDates = "1";

constexpr const char* kSchema = R"(
CREATE TABLE IF NOT EXISTS setting (key TEXT PRIMARY KEY, value BLOB) WITHOUT ROWID;
CREATE TABLE IF NOT EXISTS root (path BLOB PRIMARY KEY) WITHOUT ROWID;
CREATE TABLE IF NOT EXISTS directory (
  id INTEGER PRIMARY KEY, parent INTEGER NOT NULL, path BLOB NOT NULL UNIQUE,
  inode INTEGER NOT NULL, modified INTEGER NOT NULL, settled INTEGER NOT NULL,
  plain INTEGER NOT NULL, missing INTEGER NOT NULL);
CREATE TABLE IF NOT EXISTS file (
  id INTEGER PRIMARY KEY, directory INTEGER NOT NULL, name BLOB NOT NULL,
  inode INTEGER NOT NULL, size INTEGER NOT NULL, modified INTEGER NOT NULL, kind INTEGER NOT NULL);
CREATE UNIQUE INDEX IF NOT EXISTS file_name ON file (directory, name);
CREATE INDEX IF NOT EXISTS file_inode ON file (inode);
CREATE INDEX IF NOT EXISTS file_alias ON file (directory) WHERE kind = 4;
CREATE TABLE IF NOT EXISTS message (
  id INTEGER PRIMARY KEY, file INTEGER NOT NULL, identifier TEXT NOT NULL UNIQUE,
  digest TEXT NOT NULL, position INTEGER NOT NULL, flags TEXT NOT NULL,
  sequence INTEGER NOT NULL, replace INTEGER NOT NULL, problem TEXT, date INTEGER);
CREATE INDEX IF NOT EXISTS message_file ON message (file);
CREATE INDEX IF NOT EXISTS message_sequence ON message (sequence);
CREATE TABLE IF NOT EXISTS deletion (identifier TEXT PRIMARY KEY, sequence INTEGER NOT NULL)
  WITHOUT ROWID;
CREATE INDEX IF NOT EXISTS deletion_sequence ON deletion (sequence);
CREATE TABLE IF NOT EXISTS measurement (
  day INTEGER PRIMARY KEY, messages INTEGER NOT NULL, index_bytes INTEGER NOT NULL,
  store_bytes INTEGER NOT NULL, scans INTEGER NOT NULL, scan_microseconds INTEGER NOT NULL,
  merges INTEGER NOT NULL, merge_microseconds INTEGER NOT NULL);
CREATE TABLE IF NOT EXISTS attachment (
  type TEXT NOT NULL, outcome TEXT NOT NULL, count INTEGER NOT NULL, PRIMARY KEY (type, outcome))
  WITHOUT ROWID;
)";

constexpr const char* kDropAll = R"(
DROP TABLE IF EXISTS setting; DROP TABLE IF EXISTS root; DROP TABLE IF EXISTS directory;
DROP TABLE IF EXISTS file; DROP TABLE IF EXISTS message; DROP TABLE IF EXISTS deletion;
DROP TABLE IF EXISTS measurement;
DROP TABLE IF EXISTS attachment;
)";

// Acknowledged deletions to keep, in case the daemon's data is restored to an older state.
constexpr int64_t kKeptDeletions = 100000;

std::string randomName() {
  std::random_device random;
  std::string name;
  for (int i = 0; i < 4; ++i) name += fmt::format("{:08x}", random());
  return name;
}

int64_t toNumber(const std::string& text) {
  return std::strtoll(text.c_str(), nullptr, 10);
}

DirectoryRow directoryOf(const Statement& row) {
  return {row.number(0), row.number(1),      row.text(2),        row.number(3),
          row.number(4), row.number(5) != 0, row.number(6) != 0, row.number(7) != 0};
}

FileRow fileOf(const Statement& row) {
  return {row.number(0),
          row.number(1),
          row.text(2),
          row.number(3),
          row.number(4),
          row.number(5),
          static_cast<FileKind>(row.number(6))};
}

}  // namespace

std::unique_ptr<Catalogue> Catalogue::open(const std::string& path, TLErrorOut error) {
  auto database = Database::open(path, error);
  if (database == nullptr) return nullptr;
  std::unique_ptr<Catalogue> catalogue(new Catalogue(std::move(database)));
  if (catalogue->prepare()) return catalogue;
  platform::setError(error, *catalogue->failure());
  return nullptr;
}

bool Catalogue::prepare() {
  begin();
  _database->execute(
      "CREATE TABLE IF NOT EXISTS setting (key TEXT PRIMARY KEY, value BLOB) "
      "WITHOUT ROWID");
  const std::string version = value("schema");
  const bool kept = version == kSchemaVersion ||
                    (version == kSchemaWithoutDates &&
                     _database->execute("ALTER TABLE message ADD COLUMN date INTEGER"));
  if (!kept) {
    _statements.clear();
    _database->execute(kDropAll);
  }
  _database->execute(kSchema);
  if (version != kSchemaVersion) setValue("schema", kSchemaVersion);
  if (!kept) setValue("id", randomName());
  _id = value("id");
  _acknowledged = toNumber(value("acknowledged"));
  return commit();
}

Statement& Catalogue::sql(const char* text) {
  const auto found = _statements.find(text);
  if (found != _statements.end()) return found->second;
  return _statements.emplace(text, _database->prepare(text)).first->second;
}

int64_t Catalogue::scalar(const char* text) {
  return first(sql(text), [](const Statement& row) { return row.number(0); }).value_or(0);
}

bool Catalogue::commit() {
  if (!failure()) _database->execute("COMMIT");
  if (failure()) rollback();
  return !failure();
}

// --- Settings

void Catalogue::setAcknowledged(int64_t sequence) {
  _acknowledged = sequence;
  setValue("acknowledged", std::to_string(sequence));
}

int64_t Catalogue::highestSequence() {
  const int64_t messages =
      scalar("SELECT MAX(sequence) FROM message WHERE sequence < 9223372036854775807");
  const int64_t deletions =
      scalar("SELECT MAX(sequence) FROM deletion WHERE sequence < 9223372036854775807");
  return std::max({_acknowledged, messages, deletions, int64_t{0}});
}

int64_t Catalogue::horizon() {
  return toNumber(value("horizon"));
}

bool Catalogue::forgetDeletions() {
  begin();
  sql("DELETE FROM deletion WHERE sequence <= ?").bind(_acknowledged).run();
  setValue("horizon", std::to_string(_acknowledged));
  return commit() && _database->execute("VACUUM; PRAGMA wal_checkpoint(TRUNCATE);");
}

void Catalogue::forgetOldDeletions() {
  Statement& count = sql("SELECT COUNT(*) FROM deletion WHERE sequence <= ?");
  count.bind(_acknowledged);
  const int64_t surplus =
      first(count, [](const Statement& row) { return row.number(0); }).value_or(0) - kKeptDeletions;
  if (surplus <= 0) return;
  Statement& nth = sql("SELECT sequence FROM deletion ORDER BY sequence LIMIT 1 OFFSET ?");
  nth.bind(surplus);
  const int64_t until = first(nth, [](const Statement& row) { return row.number(0); }).value_or(0);
  sql("DELETE FROM deletion WHERE sequence <= ?").bind(until).run();
  setValue("horizon", std::to_string(until));
}

std::string Catalogue::value(const char* key) {
  Statement& statement = sql("SELECT value FROM setting WHERE key = ?");
  statement.bindText(key);
  return first(statement, [](const Statement& row) { return row.text(0); }).value_or("");
}

void Catalogue::setValue(const char* key, const std::string& value) {
  sql("INSERT OR REPLACE INTO setting VALUES (?, ?)").bindText(key).bindBytes(value).run();
}

std::vector<std::string> Catalogue::roots() {
  return all(sql("SELECT path FROM root ORDER BY path"),
             [](const Statement& row) { return row.text(0); });
}

void Catalogue::addRoot(const std::string& path) {
  sql("INSERT OR IGNORE INTO root VALUES (?)").bindBytes(path).run();
}

void Catalogue::removeRoot(const std::string& path) {
  sql("DELETE FROM root WHERE path = ?").bindBytes(path).run();
}

// --- Directories

std::vector<DirectoryRow> Catalogue::directories() {
  return all(sql("SELECT id, parent, path, inode, modified, settled, plain, missing FROM directory "
                 "ORDER BY path"),
             directoryOf);
}

int64_t Catalogue::addDirectory(const DirectoryRow& row) {
  sql("INSERT INTO directory (parent, path, inode, modified, settled, plain, missing) "
      "VALUES (?, ?, ?, ?, ?, ?, ?)")
      .bind(row.parent)
      .bindBytes(row.path)
      .bind(row.inode)
      .bind(row.modified)
      .bind(row.settled ? 1 : 0)
      .bind(row.plain ? 1 : 0)
      .bind(row.missing ? 1 : 0)
      .run();
  return _database->lastInsertedID();
}

void Catalogue::updateDirectory(const DirectoryRow& row) {
  sql("UPDATE directory SET parent = ?, inode = ?, modified = ?, settled = ?, plain = ?, "
      "missing = ? WHERE id = ?")
      .bind(row.parent)
      .bind(row.inode)
      .bind(row.modified)
      .bind(row.settled ? 1 : 0)
      .bind(row.plain ? 1 : 0)
      .bind(row.missing ? 1 : 0)
      .bind(row.id)
      .run();
}

void Catalogue::removeDirectory(int64_t id) {
  sql("DELETE FROM directory WHERE id = ?").bind(id).run();
}

bool Catalogue::hasContent(int64_t directory) {
  Statement& statement =
      sql("SELECT EXISTS (SELECT 1 FROM file WHERE directory = ?1) OR "
          "EXISTS (SELECT 1 FROM directory WHERE parent = ?1)");
  statement.bind(directory);
  return first(statement, [](const Statement& row) { return row.number(0); }).value_or(0) != 0;
}

// --- Files

#define FILE_ROWS "SELECT id, directory, name, inode, size, modified, kind FROM file "

std::vector<FileRow> Catalogue::filesOf(int64_t directory) {
  return files(FILE_ROWS "WHERE directory = ?", directory);
}

std::vector<FileRow> Catalogue::filesWithInode(int64_t inode) {
  return files(FILE_ROWS "WHERE inode = ?", inode);
}

std::vector<FileRow> Catalogue::aliasesIn(int64_t directory) {
  return files(FILE_ROWS "WHERE kind = 4 AND directory = ?", directory);
}

std::optional<FileRow> Catalogue::file(int64_t id) {
  const std::vector<FileRow> found = files(FILE_ROWS "WHERE id = ?", id);
  return found.empty() ? std::nullopt : std::optional(found.front());
}

#undef FILE_ROWS

std::vector<FileRow> Catalogue::files(const char* text, int64_t value) {
  Statement& statement = sql(text);
  statement.bind(value);
  return all(statement, fileOf);
}

int64_t Catalogue::addFile(const FileRow& row) {
  sql("INSERT INTO file (directory, name, inode, size, modified, kind) VALUES (?, ?, ?, ?, ?, ?)")
      .bind(row.directory)
      .bindBytes(row.name)
      .bind(row.inode)
      .bind(row.size)
      .bind(row.modified)
      .bind(static_cast<int64_t>(row.kind))
      .run();
  return _database->lastInsertedID();
}

void Catalogue::updateFile(const FileRow& row) {
  sql("UPDATE file SET directory = ?, name = ?, inode = ?, size = ?, modified = ?, kind = ? "
      "WHERE id = ?")
      .bind(row.directory)
      .bindBytes(row.name)
      .bind(row.inode)
      .bind(row.size)
      .bind(row.modified)
      .bind(static_cast<int64_t>(row.kind))
      .bind(row.id)
      .run();
}

void Catalogue::removeFile(int64_t id) {
  for (const MessageRow& message : messagesOf(id)) removeMessage(message.id);
  sql("DELETE FROM file WHERE id = ?").bind(id).run();
}

// --- Messages

std::string defaultCatalogueDirectory() {
  const char* const state = std::getenv("XDG_STATE_HOME");
  if (state != nullptr && state[0] == '/') return platform::joinPath(state, "tallow");
  const char* const home = std::getenv("HOME");
  return platform::joinPath(home != nullptr ? home : "/", ".local/state/tallow");
}

std::string cataloguePath(const std::string& directory, const std::string& runtimeDirectory,
                          const std::string& protectionClass) {
  const std::string name = runtimeDirectory + '\0' + protectionClass;
  char* const sum = g_compute_checksum_for_data(
      G_CHECKSUM_SHA256, reinterpret_cast<const guchar*>(name.data()), name.size());
  const std::string path =
      platform::joinPath(directory, fmt::format("catalogue-{:.16}.sqlite", sum));
  g_free(sum);
  return path;
}

}  // namespace mailsync
