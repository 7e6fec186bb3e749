#include <gmock/gmock.h>
#include <tallow/tallow.h>

#include <future>
#include <thread>

#include "records/TLAttributeKey.h"
#include "tests/client/FakeDaemon.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/TemporaryDirectory.h"

using tallow::ErrorKind;
using tallow::Item;
using tallow::Key;
using tallow::Query;
using testing::ElementsAre;
using testing::HasSubstr;

// The installed interface, with a real daemon.
namespace {

tallow::Settings settingsFor(const std::string& runtimeDirectory, const char* name = "test") {
  tallow::Settings settings(name);
  settings.setRuntimeDirectory(runtimeDirectory);
  return settings;
}

Item mail(const std::string& identifier, const std::string& subject) {
  Item item(identifier);
  item.setGroup("group/" + subject.substr(0, subject.find(' ')));
  item.addText(Key::subject, subject);
  item.addPersons(Key::authors, std::vector<tallow::Person>{{"Mara", "mara@example.org"}});
  item.addDate(Key::dateReceived, 1.7e9);
  item.addText(Key::textContent, "The fees are due.");
  return item;
}

class LibraryTest : public testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(daemon.ready()); }

  std::vector<std::string> found(const Query& query) {
    const auto items = client.search(query, tallow::Client::kNoMaximum, &error);
    std::vector<std::string> names;
    if (!items) return {"failed: " + error.message};
    for (const Item& item : *items) names.push_back(item.identifier());
    std::sort(names.begin(), names.end());
    return names;
  }

  const testsupport::TemporaryDirectory directory;
  const testsupport::DaemonProcess daemon{directory.path()};
  tallow::Client client{settingsFor(daemon.runtimeDirectory())};
  tallow::Error error;
};

}  // namespace

TEST_F(LibraryTest, FindsWhatItIndexedUntilItIsDeleted) {
  const std::vector<Item> items{mail("a", "harbour fees"), mail("b", "harbour repairs"),
                                mail("c", "roof repairs")};
  ASSERT_TRUE(client.index(items, &error)) << error.message;
  EXPECT_THAT(found(Query::words("harb")), ElementsAre("a", "b"));
  EXPECT_EQ(client.replacedWords(&error).value().size(), 0U);
  // A whole word that is nowhere is taken for a stem.
  EXPECT_THAT(found(Query::words("harb ")), ElementsAre("a", "b"));
  const auto replaced = client.replacedWords(&error);
  ASSERT_TRUE(replaced && replaced->size() == 1) << error.message;
  EXPECT_EQ(replaced->front().typed, "harb");
  EXPECT_EQ(replaced->front().reason, "stem");
  EXPECT_THAT(found(Query::words(std::string("harbour\0re", 10))), ElementsAre("b"));
  const auto only = Query::words("mara", "kTLItemSubject == \"repairs\"", &error);
  ASSERT_TRUE(only) << error.message;
  EXPECT_THAT(found(*only), ElementsAre("b", "c"));
  const auto either = Query::expression("kTLItemSubject == fees || kTLItemSubject == roof", &error);
  ASSERT_TRUE(either) << error.message;
  EXPECT_THAT(found(*either), ElementsAre("a", "c"));

  ASSERT_TRUE(client.remove(std::vector<std::string>{"a"}, &error)) << error.message;
  EXPECT_THAT(found(Query::words("harb")), ElementsAre("b"));
  EXPECT_FALSE(client.remove(std::vector<std::string>{"a"}, &error));
  EXPECT_EQ(error.kind, ErrorKind::refused);
  EXPECT_EQ(error.domain, "DocStore");
  ASSERT_TRUE(client.removeGroups(std::vector<std::string>{"group/roof"}, &error));
  EXPECT_THAT(found(Query::words("mara")), ElementsAre("b"));
  ASSERT_TRUE(client.removeAll(&error)) << error.message;
  EXPECT_THAT(found(Query::words("mara")), ElementsAre());
}

TEST_F(LibraryTest, FoundItemsHoldWhatListsShow) {
  const Item original = mail("a", "harbour fees");
  Item copy = original;
  copy.addText(Key::contentType, "message/rfc822");
  EXPECT_FALSE(original.text(Key::contentType));
  ASSERT_TRUE(client.index({&copy, 1}, &error)) << error.message;
  const auto items = client.search(Query::words("harbour"), 1, &error);
  ASSERT_TRUE(items && items->size() == 1) << error.message;
  const Item& item = items->front();
  EXPECT_EQ(item.text(Key::subject), "harbour fees");
  EXPECT_EQ(item.group(), "group/harbour");
  EXPECT_THAT(item.persons(Key::authors), ElementsAre(tallow::Person{"Mara", "mara@example.org"}));
  EXPECT_EQ(item.date(Key::dateReceived), 1.7e9);
  EXPECT_GT(item.score().value_or(0), 0);
  EXPECT_GT(item.textScore().value_or(0), 0);
  EXPECT_FALSE(item.flag(Key::read) || item.number(Key::priority) || item.bytes(Key::subject));
}

TEST_F(LibraryTest, StoresTheStateAfterTheChanges) {
  std::optional<std::string> state;
  ASSERT_TRUE(client.lastState(state, &error)) << error.message;
  EXPECT_FALSE(state);
  const Item item = mail("a", "harbour fees");
  const std::string bytes("\0\xff", 2);
  ASSERT_TRUE(client.update({&item, 1}, {}, bytes, &error)) << error.message;
  EXPECT_FALSE(client.update({&item, 1}, std::vector<std::string>{"unknown"}, "later", &error));
  ASSERT_TRUE(client.lastState(state, &error)) << error.message;
  EXPECT_EQ(state, bytes);
}

TEST_F(LibraryTest, RefusesWhatCannotBeSent) {
  const std::vector<std::string> hidden{std::string("a\0b", 3)};
  for (const auto& names : {hidden, std::vector<std::string>{"\xff"}}) {
    error = {};
    EXPECT_FALSE(client.remove(names, &error));
    EXPECT_EQ(error.kind, ErrorKind::invalid);
    EXPECT_FALSE(client.removeGroups(names, &error));
    EXPECT_FALSE(client.update({}, names, "", &error));
  }
  const std::string deep = std::string(2000, '(') + "a == b";
  for (const std::string& text : {std::string("kTLItemSubject =="), std::string("a == b"),
                                  std::string("kTLItemSubject == b)"), std::string(), deep,
                                  std::string("kTLItemSubject == b\0", 20)}) {
    error = {};
    EXPECT_FALSE(Query::expression(text, &error)) << text;
    EXPECT_EQ(error.kind, ErrorKind::invalid) << text;
    EXPECT_FALSE(Query::words("mara", text, nullptr)) << text;
  }
  EXPECT_FALSE(client.search(Query::words(""), 1, &error));
  EXPECT_EQ(error.kind, ErrorKind::refused);
}

TEST(LibraryWithoutDaemonTest, IsUnreachableUntilADaemonStarts) {
  const testsupport::TemporaryDirectory directory;
  tallow::Client client(settingsFor(directory / "run"));
  tallow::Error error;
  EXPECT_FALSE(client.search(Query::words("harbour"), 1, &error));
  EXPECT_EQ(error.kind, ErrorKind::unreachable);
  EXPECT_THAT(error.message, HasSubstr(directory / "run"));
  EXPECT_FALSE(client.removeAll(nullptr));
  const testsupport::DaemonProcess daemon(directory.path());
  EXPECT_TRUE(client.search(Query::words("harbour"), 1, &error)) << error.message;
}

TEST(LibraryWithoutDaemonTest, AnInterruptEndsACall) {
  // Before the daemon, whose thread may use them until it ends.
  std::promise<void> asked;
  std::promise<void> released;
  testsupport::FakeDaemon daemon;
  daemon.answer("DeleteAllItems", [&](rpc::Reply&) {
    asked.set_value();
    released.get_future().wait();
  });
  tallow::Client client(settingsFor(daemon.runtimeDirectory()));
  tallow::Error error;
  std::thread other([&] {
    asked.get_future().wait();
    client.interrupt();
  });
  EXPECT_FALSE(client.removeAll(&error));
  EXPECT_EQ(error.kind, ErrorKind::unreachable);
  released.set_value();
  other.join();
}

// Numbers of the wire cannot be wrong in one place only.
TEST(LibraryKeyTest, KeysAreThoseOfTheRecords) {
  const std::pair<Key, const char*> keys[] = {
      {Key::subject, "SUBJECT"},
      {Key::contentType, "CONTENT_TYPE"},
      {Key::keywords, "KEYWORDS"},
      {Key::messageID, "MAIL_MESSAGE_ID"},
      {Key::dateReceived, "MAIL_DATE_RECEIVED"},
      {Key::dateCreated, "CONTENT_CREATION_DATE"},
      {Key::htmlContent, "HTML_CONTENT_DATA"},
      {Key::accountIdentifier, "ACCOUNT_IDENTIFIER"},
      {Key::authors, "AUTHORS"},
      {Key::recipients, "RECIPIENTS"},
      {Key::additionalRecipients, "ADDITIONAL_RECIPIENTS"},
      {Key::hiddenAdditionalRecipients, "HIDDEN_ADDITIONAL_RECIPIENTS"},
      {Key::attachmentTypes, "ATTACHMENT_TYPES"},
      {Key::attachmentNames, "ATTACHMENT_NAMES"},
      {Key::conversationID, "CONVERSATION_ID"},
      {Key::mailboxes, "MAILBOXES"},
      {Key::read, "READ"},
      {Key::flagged, "FLAGGED"},
      {Key::repliedTo, "REPLIED_TO"},
      {Key::priority, "PRIORITY"},
      {Key::mailboxIdentifiers, "MAILBOX_IDENTIFIERS"},
      {Key::textContent, "TEXT_CONTENT"},
      {Key::contentSnippet, "CONTENT_SNIPPET"}};
  for (const auto& [key, name] : keys) {
    EXPECT_EQ(static_cast<int>(key), static_cast<int>(TLStringAsAttributeKey(name))) << name;
  }
}
