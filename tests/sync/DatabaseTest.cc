#include <gmock/gmock.h>

#include "sync/Database.h"
#include "tests/support/TemporaryDirectory.h"

// For instance of a catalogue whose tables somebody else has changed.
TEST(DatabaseTest, AStatementThatCannotBePreparedFails) {
  const testsupport::TemporaryDirectory directory;
  const auto database = mailsync::Database::open(directory / "db", nullptr);
  ASSERT_NE(database, nullptr);
  auto statement = database->prepare("SELECT name FROM absent WHERE id = ? AND name = ?");
  EXPECT_FALSE(statement.bind(1).bindBytes("a").run());
  EXPECT_EQ(mailsync::first(statement, [](auto& row) { return row.text(0); }), std::nullopt);
  ASSERT_TRUE(database->failure());
  EXPECT_THAT(database->failure()->message, testing::HasSubstr("no such table: absent"));
}
