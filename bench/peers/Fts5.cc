#include "bench/peers/Fts5.h"

#include <fmt/format.h>

#include <array>
#include <stdexcept>

#include "bench/Queries.h"
#include "html/TALHTMLParsing.h"

namespace peers {

namespace {

void appendPersons(const TLIndexableItem& item, TLAttributeKey key, std::string& text) {
  const auto* persons = item.personValuesForKey(key);
  if (persons == nullptr) return;
  for (const auto& person : *persons) {
    for (const auto* part : {&person->name(), &person->emailAddress()}) {
      if (!*part) continue;
      if (!text.empty()) text += ' ';
      text += platform::toUTF8(**part);
    }
  }
}

// The text that the daemon indexes, with markup removed in the same way.
std::string bodyOf(const TLIndexableItem& item) {
  const auto& html = item.bytesValueForKey(TLAttributeKey::HTML_CONTENT_DATA);
  if (!html) {
    return platform::toUTF8(
        platform::orEmpty(item.stringValueForKey(TLAttributeKey::TEXT_CONTENT)));
  }
  const auto text = TALPlainTextFromHTMLData(*html, UINT64_MAX, nullptr, platform::kEncodingUTF8);
  return platform::toUTF8(platform::orEmpty(text));
}

std::array<std::string, 4> columnsOf(const TLIndexableItem& item) {
  using Key = TLAttributeKey;
  std::array<std::string, 4> columns;
  auto& [subject, sender, recipients, body] = columns;
  subject = platform::toUTF8(platform::orEmpty(item.stringValueForKey(Key::SUBJECT)));
  appendPersons(item, Key::AUTHORS, sender);
  for (const Key key :
       {Key::RECIPIENTS, Key::ADDITIONAL_RECIPIENTS, Key::HIDDEN_ADDITIONAL_RECIPIENTS}) {
    appendPersons(item, key, recipients);
  }
  body = bodyOf(item);
  return columns;
}

// Quotes each word, so that none is an operator.
std::string matchFor(const std::string& query) {
  std::string match;
  for (const std::string& word : bench::wordsOfQuery(query)) {
    match += fmt::format("{}\"{}\"", match.empty() ? "" : " AND ", word);
  }
  return match + '*';
}

}  // namespace

Fts5Database::Fts5Database(const std::string& path) {
  sqlite3* database = nullptr;
  const int code = sqlite3_open(path.c_str(), &database);
  _database.reset(database);
  check(code, SQLITE_OK);
  // Syncs no more than the daemon does.
  execute("PRAGMA journal_mode=WAL; PRAGMA synchronous=OFF;");
  execute(
      "CREATE VIRTUAL TABLE IF NOT EXISTS mail USING fts5(subject, sender, recipients, body, "
      "prefix='2 3', tokenize='unicode61');");
}

void Fts5Database::index(bench::ItemSpool& spool) {
  const Statement insert = prepare("INSERT INTO mail VALUES (?, ?, ?, ?);");
  for (std::vector<client::EncodedItem> batch; spool.next(batch);) {
    execute("BEGIN;");
    for (const client::EncodedItem& encoded : batch) {
      TLIndexableItem item;
      if (!item.initWithData(encoded.bytes)) throw std::runtime_error("an item does not parse");
      const auto columns = columnsOf(item);
      for (size_t i = 0; i < columns.size(); ++i) {
        check(sqlite3_bind_text64(insert.get(), static_cast<int>(i) + 1, columns[i].data(),
                                  columns[i].size(), SQLITE_STATIC, SQLITE_UTF8),
              SQLITE_OK);
      }
      check(sqlite3_step(insert.get()), SQLITE_DONE);
      check(sqlite3_reset(insert.get()), SQLITE_OK);
    }
    execute("COMMIT;");
  }
}

void Fts5Database::optimize() {
  execute("INSERT INTO mail(mail) VALUES ('optimize');");
}

void Fts5Database::checkpoint() {
  execute("PRAGMA wal_checkpoint(TRUNCATE);");
}

size_t Fts5Database::search(const std::string& query) {
  const std::string match = matchFor(query);
  const Statement select =
      prepare("SELECT subject, sender FROM mail WHERE mail MATCH ?1 ORDER BY rank LIMIT ?2;");
  check(
      sqlite3_bind_text64(select.get(), 1, match.data(), match.size(), SQLITE_STATIC, SQLITE_UTF8),
      SQLITE_OK);
  check(sqlite3_bind_int64(select.get(), 2, bench::kMaxResults), SQLITE_OK);
  size_t rows = 0;
  int code = SQLITE_ROW;
  while ((code = sqlite3_step(select.get())) == SQLITE_ROW) {
    sqlite3_column_text(select.get(), 0);
    sqlite3_column_text(select.get(), 1);
    ++rows;
  }
  check(code, SQLITE_DONE);
  return rows;
}

void Fts5Database::execute(const char* sql) {
  check(sqlite3_exec(_database.get(), sql, nullptr, nullptr, nullptr), SQLITE_OK);
}

Fts5Database::Statement Fts5Database::prepare(const char* sql) {
  sqlite3_stmt* statement = nullptr;
  check(sqlite3_prepare_v2(_database.get(), sql, -1, &statement, nullptr), SQLITE_OK);
  return Statement(statement);
}

void Fts5Database::check(int code, int expected) {
  if (code != expected) {
    throw std::runtime_error(fmt::format("SQLite: {}", sqlite3_errmsg(_database.get())));
  }
}

}  // namespace peers
