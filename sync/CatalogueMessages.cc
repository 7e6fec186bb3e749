#include <algorithm>
#include <map>

#include "platform/Paths.h"
#include "sync/Catalogue.h"

// The messages of the catalogue: what is sent, what waits, and what was deleted.
namespace mailsync {

namespace {

constexpr double kMicroseconds = 1e6;  // of a second

// The date to store: -1 for none, and for those that are no dates of mail, such as 1970-01-01.
int64_t usableDate(const std::optional<int64_t>& date) {
  constexpr int64_t kYear1980 = 315532800;
  constexpr int64_t kYear2100 = 4102444800;
  return date && *date >= kYear1980 && *date < kYear2100 ? *date : -1;
}

MessageRow messageOf(const Statement& row) {
  return {row.number(0), row.number(1), row.text(2),   row.text(3),
          row.number(4), row.text(5),   row.number(6), row.number(7) != 0};
}

}  // namespace

std::vector<MessageRow> Catalogue::messagesOf(int64_t file) {
  Statement& statement =
      sql("SELECT id, file, identifier, digest, position, flags, sequence, replace FROM message "
          "WHERE file = ?");
  statement.bind(file);
  return all(statement, messageOf);
}

std::optional<MessageRow> Catalogue::messageWithIdentifier(const std::string& identifier) {
  Statement& statement =
      sql("SELECT id, file, identifier, digest, position, flags, sequence, replace FROM message "
          "WHERE identifier = ?");
  statement.bindText(identifier);
  return first(statement, messageOf);
}

void Catalogue::addMessage(const MessageRow& row) {
  sql("INSERT INTO message (file, identifier, digest, position, flags, sequence, replace) "
      "VALUES (?, ?, ?, ?, ?, ?, ?)")
      .bind(row.file)
      .bindText(row.identifier)
      .bindText(row.digest)
      .bind(row.offset)
      .bindText(row.flags)
      .bind(row.sequence)
      .bind(row.replace ? 1 : 0)
      .run();
}

void Catalogue::setPlace(int64_t message, int64_t offset, const std::string& flags) {
  sql("UPDATE message SET position = ?, flags = ? WHERE id = ?")
      .bind(offset)
      .bindText(flags)
      .bind(message)
      .run();
}

void Catalogue::setDigest(int64_t message, const std::string& digest) {
  sql("UPDATE message SET digest = ? WHERE id = ?").bindText(digest).bind(message).run();
}

void Catalogue::setStale(int64_t message) {
  sql("UPDATE message SET replace = (replace OR sequence NOT IN (-1, 9223372036854775807)), "
      "sequence = 9223372036854775807, problem = NULL WHERE id = ?")
      .bind(message)
      .run();
}

void Catalogue::setAllStale() {
  sql("UPDATE message SET replace = (replace OR sequence != 9223372036854775807), "
      "sequence = 9223372036854775807 WHERE sequence != -1")
      .run();
}

void Catalogue::setFailed(int64_t message, const std::string& problem, bool deleted) {
  if (!deleted) noteDeletion(message);
  sql("UPDATE message SET sequence = -1, replace = 0, problem = ? WHERE id = ?")
      .bindText(problem)
      .bind(message)
      .run();
}

void Catalogue::noteDeletion(int64_t message) {
  sql("INSERT OR REPLACE INTO deletion SELECT identifier, 9223372036854775807 FROM message "
      "WHERE id = ? AND (replace OR sequence NOT IN (-1, 9223372036854775807))")
      .bind(message)
      .run();
}

void Catalogue::removeMessage(int64_t id) {
  noteDeletion(id);
  sql("DELETE FROM message WHERE id = ?").bind(id).run();
}

void Catalogue::retryFailed() {
  sql("UPDATE message SET sequence = 9223372036854775807, problem = NULL WHERE sequence = -1")
      .run();
}

// --- What is to be sent

int64_t Catalogue::waitingCount() {
  Statement& statement = sql("SELECT COUNT(*) FROM message WHERE sequence > ?");
  statement.bind(_acknowledged);
  return first(statement, [](const Statement& row) { return row.number(0); }).value_or(0);
}

std::vector<int64_t> Catalogue::waitingIDs(int64_t first) {
  Statement& statement = sql("SELECT id FROM message WHERE sequence > ? AND id >= ?");
  statement.bind(_acknowledged).bind(first);
  auto ids = all(statement, [](const Statement& row) { return row.number(0); });
  std::sort(ids.begin(), ids.end());
  return ids;
}

std::optional<WaitingMessage> Catalogue::waitingMessage(int64_t id) {
  Statement& statement = sql(
      "SELECT m.id, m.file, m.identifier, m.digest, m.position, m.flags, m.sequence, m.replace, "
      "f.kind, d.path, f.name FROM message m JOIN file f ON f.id = m.file "
      "JOIN directory d ON d.id = f.directory WHERE m.id = ?");
  statement.bind(id);
  return first(statement, [](const Statement& row) {
    return WaitingMessage{messageOf(row), static_cast<FileKind>(row.number(8)),
                          platform::joinPath(row.text(9), row.text(10))};
  });
}

void Catalogue::setSent(int64_t message, int64_t sequence, const std::string& digest,
                        std::optional<int64_t> date) {
  sql("UPDATE message SET sequence = ?, digest = ?, date = NULLIF(?, -1), replace = 0, "
      "problem = NULL WHERE id = ?")
      .bind(sequence)
      .bindText(digest)
      .bind(usableDate(date))
      .bind(message)
      .run();
}

int64_t Catalogue::waitingDeletionCount() {
  Statement& statement = sql("SELECT COUNT(*) FROM deletion WHERE sequence > ?");
  statement.bind(_acknowledged);
  return first(statement, [](const Statement& row) { return row.number(0); }).value_or(0);
}

std::vector<std::string> Catalogue::waitingDeletions() {
  Statement& statement = sql("SELECT identifier FROM deletion WHERE sequence > ?");
  statement.bind(_acknowledged);
  return all(statement, [](const Statement& row) { return row.text(0); });
}

void Catalogue::addDeletion(const std::string& identifier) {
  setDeletionSequence(identifier, kWaiting);
}

void Catalogue::setDeletionSequence(const std::string& identifier, int64_t sequence) {
  sql("INSERT OR REPLACE INTO deletion VALUES (?, ?)").bindText(identifier).bind(sequence).run();
}

void Catalogue::adopt(const std::vector<IndexedMessage>& inIndex, int64_t trusted) {
  _database->execute(
      "CREATE TEMP TABLE present (identifier TEXT PRIMARY KEY, date INTEGER) WITHOUT ROWID");
  for (const IndexedMessage& message : inIndex) {
    sql("INSERT OR IGNORE INTO present VALUES (?, NULLIF(?, -1))")
        .bindText(message.identifier)
        .bind(usableDate(message.date))
        .run();
  }
  // Messages sent after that are in the index in some version.
  sql("UPDATE message SET replace = 1 WHERE sequence > ? AND sequence < 9223372036854775807")
      .bind(std::min(trusted, _acknowledged))
      .run();
  // From now on an older state of the daemon cannot be used: what the daemon had then, and what was
  // deleted since, is no longer known.
  setAcknowledged(highestSequence() + 1);
  setValue("horizon", std::to_string(_acknowledged));
  sql("UPDATE message SET sequence = 9223372036854775807, "
      "replace = (replace AND identifier IN (SELECT identifier FROM present)) WHERE sequence >= 0 "
      "AND (replace OR identifier NOT IN (SELECT identifier FROM present))")
      .run();
  sql("UPDATE message SET sequence = ? WHERE sequence >= 0 AND NOT replace "
      "AND identifier IN (SELECT identifier FROM present)")
      .bind(_acknowledged)
      .run();
  sql("UPDATE message SET date = present.date FROM present "
      "WHERE present.identifier = message.identifier AND message.date IS NULL")
      .run();
  _database->execute("DELETE FROM deletion");
  sql("INSERT INTO deletion SELECT identifier, 9223372036854775807 FROM present "
      "WHERE identifier NOT IN (SELECT identifier FROM message WHERE sequence >= 0)")
      .run();
  _statements.clear();  // of the table to be dropped
  _database->execute("DROP TABLE present");
}

// --- What there is to tell

void Catalogue::addAttachments(const extract::Counts& counts) {
  Statement& statement =
      sql("INSERT INTO attachment VALUES (?, ?, ?) ON CONFLICT (type, outcome) "
          "DO UPDATE SET count = count + excluded.count");
  counts.forEach([&](extract::Kind kind, extract::Outcome outcome, uint64_t count) {
    statement.bindText(nameOf(kind)).bindText(nameOf(outcome));
    statement.bind(static_cast<int64_t>(count)).run();
  });
}

// Rows of another version, with other names, are left out.
extract::Counts Catalogue::attachments() {
  extract::Counts counts;
  Statement& statement = sql("SELECT count FROM attachment WHERE type = ? AND outcome = ?");
  for (size_t kind = 0; kind < counts.rows.size(); ++kind) {
    for (size_t outcome = 0; outcome < counts.rows[kind].size(); ++outcome) {
      statement.bindText(extract::kKindNames[kind]).bindText(extract::kOutcomeNames[outcome]);
      const auto count = first(statement, [](const Statement& row) { return row.number(0); });
      counts.rows[kind][outcome] = static_cast<uint64_t>(count.value_or(0));
    }
  }
  return counts;
}

std::vector<FolderCount> Catalogue::folderCounts() {
  Statement& statement =
      sql("SELECT CASE WHEN f.kind = 2 THEN CAST(d.path || '/' || f.name AS BLOB) ELSE d.path END, "
          "f.kind, COUNT(*), SUM(m.sequence BETWEEN 0 AND ?1), SUM(m.sequence > ?1), "
          "SUM(m.sequence = -1), MAX(d.missing) FROM message m JOIN file f ON f.id = m.file "
          "JOIN directory d ON d.id = f.directory GROUP BY 1, 2 ORDER BY 1");
  statement.bind(_acknowledged);
  std::map<std::string, FolderCount> folders;
  while (statement.step()) {
    std::string path = statement.text(0);
    if (static_cast<FileKind>(statement.number(1)) == FileKind::maildir) {
      path.resize(path.rfind('/'));  // the folder of "cur" and "new"
    }
    FolderCount& count = folders[path];
    count.messages += statement.number(2);
    count.indexed += statement.number(3);
    count.waiting += statement.number(4);
    count.failed += statement.number(5);
    count.missing = count.missing || statement.number(6) != 0;
  }
  statement.reset();
  std::vector<FolderCount> counts;
  for (auto& [path, count] : folders) {
    count.path = path;
    counts.push_back(std::move(count));
  }
  return counts;
}

std::vector<MonthCount> Catalogue::monthCounts() {
  Statement& statement =
      sql("SELECT COALESCE(strftime('%Y-%m', date, 'unixepoch', 'localtime'), ''), COUNT(*) "
          "FROM message WHERE sequence BETWEEN 0 AND ? GROUP BY 1 ORDER BY 1");
  statement.bind(_acknowledged);
  return all(statement, [](const Statement& row) {
    return MonthCount{row.text(0), row.number(1)};
  });
}

std::vector<Problem> Catalogue::problems(size_t most) {
  Statement& statement = sql(
      "SELECT m.identifier, d.path, f.name, m.problem FROM message m JOIN file f ON f.id = m.file "
      "JOIN directory d ON d.id = f.directory WHERE m.sequence = -1 ORDER BY m.id LIMIT ?");
  statement.bind(static_cast<int64_t>(most));
  return all(statement, [](const Statement& row) {
    return Problem{row.text(0), platform::joinPath(row.text(1), row.text(2)), row.text(3)};
  });
}

std::optional<MessagePlace> Catalogue::find(const std::string& identifier) {
  Statement& statement =
      sql("SELECT d.path, f.name, m.position, m.flags, m.sequence FROM message m "
          "JOIN file f ON f.id = m.file JOIN directory d ON d.id = f.directory "
          "WHERE m.identifier = ?");
  statement.bindText(identifier);
  return first(statement, [this](const Statement& row) {
    MessagePlace place{platform::joinPath(row.text(0), row.text(1)), std::nullopt, row.text(3),
                       row.number(4) >= 0 && row.number(4) <= _acknowledged};
    if (row.number(2) >= 0) place.offset = row.number(2);
    return place;
  });
}

// --- History

std::vector<Measurement> Catalogue::measurements() {
  return all(sql("SELECT * FROM measurement ORDER BY day"), [](const Statement& row) {
    return Measurement{row.number(0), row.number(1),
                       row.number(2), row.number(3),
                       row.number(4), static_cast<double>(row.number(5)) / kMicroseconds,
                       row.number(6), static_cast<double>(row.number(7)) / kMicroseconds};
  });
}

bool Catalogue::isMeasured(int64_t day) {
  Statement& statement = sql("SELECT 1 FROM measurement WHERE day = ?");
  statement.bind(day);
  return first(statement, [](const Statement& row) { return row.number(0); }).has_value();
}

void Catalogue::addMeasurement(const Measurement& measurement) {
  sql("INSERT OR REPLACE INTO measurement VALUES (?, ?, ?, ?, ?, ?, ?, ?)")
      .bind(measurement.day)
      .bind(measurement.messages)
      .bind(measurement.indexBytes)
      .bind(measurement.storeBytes)
      .bind(measurement.scans)
      .bind(static_cast<int64_t>(measurement.scanSeconds * kMicroseconds))
      .bind(measurement.merges)
      .bind(static_cast<int64_t>(measurement.mergeSeconds * kMicroseconds))
      .run();
  sql("DELETE FROM measurement WHERE day NOT IN "
      "(SELECT day FROM measurement ORDER BY day DESC LIMIT ?)")
      .bind(kMaxMeasurements)
      .run();
}

}  // namespace mailsync
