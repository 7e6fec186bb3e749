#include "tests/sync/MailSyncTest.h"

#include <ctime>

#include "cli/Identifier.h"
#include "sync/MessageDigest.h"

// Names may have any bytes.
TEST_F(MailSyncTest, SendsOnlyWhatHasChanged) {
  add("a/new/1", "one");
  add("a/cur/\xE9:2,S", "two");
  age();
  EXPECT_EQ(synced(), (Lines{"a: one", "a: two"}));
  EXPECT_EQ(daemon.received(), 2U);
  ASSERT_TRUE(sync());
  EXPECT_EQ(report.scan.entered, 0U);
  // Moves and flag changes send nothing, and the identifier stays the same.
  move("a/new/1", "a/cur/1:2,");
  move("a/cur/\xE9:2,S", "a/cur/\xE9:2,FRS");
  age();
  ASSERT_TRUE(sync());
  EXPECT_EQ(daemon.received(), 2U);
  EXPECT_EQ(report.scan.moves, 1U);
  EXPECT_EQ(report.scan.flagChanges, 1U);
  const auto catalogue = mailsync::openCatalogue(settings, nullptr);
  const auto place = catalogue->find(cli::maildirIdentifier(mail + "/a/cur/\xE9:2,FRS"));
  ASSERT_TRUE(place);
  EXPECT_EQ(place->path, mail + "/a/cur/\xE9:2,FRS");
  EXPECT_EQ(place->flags, "FRS");
  EXPECT_TRUE(place->indexed);
  // A move to another folder sends the message again.
  move("a/cur/1:2,", "b/cur/1:2,");
  // New content under the same name.
  fs::remove(mail + "/a/cur/\xE9:2,FRS");
  add("a/cur/\xE9:2,FRS", "rewritten");
  age();
  EXPECT_EQ(synced(), (Lines{"b: one", "a: rewritten"}));
  EXPECT_EQ(report.delivery.replaced, 1U);
}

TEST_F(MailSyncTest, MessagesOfAnMboxKeepTheirIdentity) {
  put("box.mbox", mboxOf({"one", "two", "same", "same", "three"}));
  EXPECT_EQ(synced(), (Lines{"box.mbox: one", "box.mbox: two", "box.mbox: same", "box.mbox: same",
                             "box.mbox: three"}));
  const auto before = daemon.content().items;
  put("box.mbox", mboxOf({"two", "same", "three", "four"}));
  EXPECT_EQ(synced(),
            (Lines{"box.mbox: two", "box.mbox: same", "box.mbox: three", "box.mbox: four"}));
  EXPECT_EQ(daemon.received(), 6U);
  // A mail program stores its state in the header.
  std::string text = mboxOf({"two", "same", "three", "four"});
  text.insert(text.find("Subject: two"), "Status: RO\nX-Status: F\n");
  put("box.mbox", text);
  ASSERT_TRUE(sync());
  EXPECT_EQ(daemon.received(), 6U);
  EXPECT_EQ(report.scan.flagChanges, 1U);
}

TEST_F(MailSyncTest, DigestsIgnoreStateFieldsOfMailPrograms) {
  const std::string plain = "Subject: a\nX: b\n\nStatus: R\n";
  EXPECT_EQ(
      mailsync::messageDigest(plain),
      mailsync::messageDigest("Subject: a\nSTATUS: RO\n more\nX: b\nx-uid: 7\n\nStatus: R\n"));
  EXPECT_NE(mailsync::messageDigest(plain), mailsync::messageDigest("Subject: a\nX: b\n\n"));
  EXPECT_NE(mailsync::messageDigest(plain), mailsync::messageDigest("Subject: a\n\nStatus: R\n"));
  EXPECT_EQ(mailsync::statusFlags("Status: RO\nX-Status: AF\n\nStatus: D"), "FRS");
  EXPECT_EQ(mailsync::statusFlags("Statu"), "");
}

TEST_F(MailSyncTest, FileWithTwoPathsCountsOnce) {
  add("a/cur/1:2,", "one");
  fs::create_hard_link(mail + "/a/cur/1:2,", mail + "/b/cur/9:2,");
  fs::create_symlink(mail + "/a/cur/1:2,", mail + "/link.eml");
  ASSERT_TRUE(sync({mail, mail + "/a/../a", mail + "/a"}));
  EXPECT_EQ(daemon.content().items.size(), 1U);
  // Either name can be the last one left.
  const auto first = cli::parseIdentifier(daemon.content().items.begin()->first)->path;
  fs::remove(mail + "/a/cur/1:2,");
  EXPECT_EQ(synced(), (Lines{"b: one"})) << first;
}

// Attachments are read when a message is sent, and counted; messages sent before are read again on
// request only.
TEST_F(MailSyncTest, AttachmentsOfMessagesThatAreSent) {
  const auto text = [this] {
    const auto item = daemon.content().items.begin()->second;
    return platform::toUTF8(*item->stringValueForKey(TLAttributeKey::TEXT_CONTENT));
  };
  const auto counted = [this] {
    std::vector<std::string> lines;
    const auto counts = mailsync::openCatalogue(settings, nullptr)->attachments();
    counts.forEach([&](auto kind, auto outcome, uint64_t count) {
      lines.push_back(fmt::format("{} {} {}", nameOf(kind), nameOf(outcome), count));
    });
    return lines;
  };
  put("a/cur/1",
      "Subject: s\nContent-Type: multipart/mixed; boundary=b\n\n--b\n\nBody\n"
      "--b\nContent-Type: text/html\nContent-Disposition: attachment\n\n<p>Attached\n"
      "--b\nContent-Type: application/pdf\n\nno PDF\n--b--\n");
  ASSERT_TRUE(sync());
  EXPECT_EQ(text(), "Body");
  EXPECT_THAT(counted(), testing::IsEmpty());
  settings.extractProgram = TALLOW_EXTRACT_PROGRAM;
  ASSERT_TRUE(sync());
  EXPECT_EQ(text(), "Body");
  settings.reread = true;
  for (int i = 1; i <= 2; ++i) {
    ASSERT_TRUE(sync());
    EXPECT_EQ(report.delivery.replaced, 1U);
    EXPECT_EQ(daemon.content().items.size(), 1U);
    EXPECT_THAT(text(), testing::StartsWith("Body\nAttached"));
    EXPECT_THAT(counted(),
                ElementsAre(fmt::format("pdf damaged {}", i), fmt::format("html extracted {}", i)));
  }
}

// It does not wait for the disk either.
TEST_F(MailSyncTest, WithoutChangesTheCatalogueIsNotWritten) {
  EXPECT_EQ(mailsync::lastSync(settings), std::nullopt);
  add("a/cur/1", "one");
  age();
  ASSERT_TRUE(sync());
  ASSERT_TRUE(sync());
  struct stat before {};
  struct stat after {};
  ASSERT_EQ(stat(cataloguePath().c_str(), &before), 0);
  ASSERT_TRUE(sync());
  ASSERT_EQ(stat(cataloguePath().c_str(), &after), 0);
  EXPECT_EQ(before.st_mtim.tv_sec, after.st_mtim.tv_sec);
  EXPECT_EQ(before.st_mtim.tv_nsec, after.st_mtim.tv_nsec);
  EXPECT_NEAR(static_cast<double>(mailsync::lastSync(settings).value_or(0)),
              static_cast<double>(std::time(nullptr)), 60);
}

TEST_F(MailSyncTest, ADryRunChangesNothing) {
  add("a/cur/1", "one");
  ASSERT_TRUE(sync());
  fs::remove(mail + "/a/cur/1");
  add("a/cur/2", "two");
  settings.dryRun = true;
  for (int i = 0; i < 2; ++i) {
    ASSERT_TRUE(sync());
    EXPECT_THAT(plan, ElementsAre("send " + cli::fileIdentifier(mail + "/a/cur/2"),
                                  "delete " + cli::fileIdentifier(mail + "/a/cur/1")));
    EXPECT_EQ(indexed(), (Lines{"a: one"}));
  }
}

// The dates are known even if another catalogue has sent the mail.
TEST_F(MailSyncTest, KeepsAHistory) {
  bool known = false;
  mailsync::Measurement one;
  settings.measure = [&] { return known ? std::optional(one) : std::nullopt; };
  for (const char* const name : {"1", "2", "3"}) {
    add(std::string("a/cur/") + name, name);
    ASSERT_TRUE(sync());
    known = true;
    ++one.messages;
    const auto catalogue = mailsync::openCatalogue(settings, nullptr);
    const auto days = catalogue->measurements();
    ASSERT_EQ(days.size(), *name == '1' ? 0U : 1U);
    for (const auto& day : days) EXPECT_EQ(day.messages, 1);
  }
  fs::remove_all(settings.catalogueDirectory);
  ASSERT_TRUE(sync());
  const auto months = mailsync::openCatalogue(settings, nullptr)->monthCounts();
  ASSERT_EQ(months.size(), 1U);
  EXPECT_EQ(months.front().month + fmt::format(": {}", months.front().messages), "2024-01: 3");
}
