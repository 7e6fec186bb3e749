// What goes wrong: with the mail, the catalogue, the disk and the daemon.

#include <ctime>
#include <fstream>
#include <random>

#include "platform/Files.h"
#include "sync/Database.h"
#include "tests/support/FileSizeLimit.h"
#include "tests/support/Seed.h"
#include "tests/sync/MailSyncTest.h"

TEST_F(MailSyncTest, MissingDirectoriesDeleteNothing) {
  add("a/cur/1", "one");
  add("b/cur/2", "two");
  ASSERT_TRUE(sync());
  fs::rename(mail + "/b", directory / "elsewhere");
  ASSERT_TRUE(sync());
  EXPECT_THAT(complaints, ElementsAre(HasSubstr("is not there")));
  EXPECT_EQ(indexed().size(), 2U);
  // An empty directory is left where a disk was mounted.
  fs::create_directories(mail + "/b/cur");
  EXPECT_EQ(synced().size(), 2U);
  fs::remove_all(mail + "/b");
  // The folder comes back.
  fs::rename(directory / "elsewhere", mail + "/b");
  ASSERT_TRUE(sync());
  EXPECT_THAT(complaints, ElementsAre());
  EXPECT_EQ(daemon.received(), 2U);
  // After a rename nothing of the old name is left.
  fs::rename(mail + "/b", mail + "/c");
  ASSERT_TRUE(sync());
  EXPECT_THAT(complaints, ElementsAre());
  EXPECT_EQ(indexed(), (Lines{"a: one", "c: two"}));
  fs::rename(mail, directory / "all");
  EXPECT_EQ(synced().size(), 2U);
  settings.pruneMissing = true;
  EXPECT_EQ(synced().size(), 0U);
}

TEST_F(MailSyncTest, ReportsFailedMessagesAndDoesNotCountThemAsSent) {
  add("a/cur/1", "one");
  add("a/cur/2", "poison");
  put("a/cur/3", "\n\n");
  daemon.refuse("poison");
  EXPECT_EQ(synced(), (Lines{"a: one"}));
  EXPECT_EQ(report.delivery.failed, 2U);
  EXPECT_THAT(complaints, testing::Contains(HasSubstr("/a/cur/2: the daemon could not put")));
  auto catalogue = mailsync::openCatalogue(settings, nullptr);
  std::vector<std::string> reasons;
  for (const auto& problem : catalogue->problems(10)) reasons.push_back(problem.reason);
  EXPECT_THAT(reasons,
              testing::UnorderedElementsAre(HasSubstr("could not put the message into the index"),
                                            "the message is empty"));
  catalogue.reset();
  daemon.refuse("");
  EXPECT_EQ(synced().size(), 1U);
  settings.retryFailed = true;
  EXPECT_EQ(synced(), (Lines{"a: one", "a: poison"}));
}

TEST_F(MailSyncTest, RefusesASecondSync) {
  ASSERT_TRUE(sync());
  const auto lock = platform::ProcessLock::acquire(cataloguePath() + ".lock", &error);
  ASSERT_TRUE(lock);
  EXPECT_FALSE(sync());
  EXPECT_EQ(error->domain, mailsync::kBusyDomain);
}

TEST_F(MailSyncTest, LostOrDamagedCatalogueSendsNothingAgain) {
  add("a/new/1", "one");
  put("box", mboxOf({"two", "three"}));
  ASSERT_TRUE(sync());
  fs::remove_all(settings.catalogueDirectory);
  move("a/new/1", "a/cur/1:2,S");
  put("box", mboxOf({"three"}));
  add("b/new/4", "four");
  EXPECT_EQ(synced(), (Lines{"a: one", "box: three", "b: four"}));
  EXPECT_EQ(daemon.received(), 4U);
  for (const char* suffix : {"-wal", "-shm"}) fs::remove(cataloguePath() + suffix);
  std::ofstream(cataloguePath(), std::ios::binary) << std::string(8192, 'x');
  ASSERT_TRUE(sync()) << platform::printable(error);
  EXPECT_EQ(daemon.received(), 4U);
}

// For instance of a catalogue whose tables somebody else has changed.
TEST(DatabaseTest, AStatementThatCannotBePreparedFails) {
  const testsupport::TemporaryDirectory directory;
  const auto database = mailsync::Database::open(directory / "db", nullptr);
  ASSERT_NE(database, nullptr);
  auto statement = database->prepare("SELECT name FROM absent WHERE id = ? AND name = ?");
  EXPECT_FALSE(statement.bind(1).bindBytes("a").run());
  EXPECT_EQ(mailsync::first(statement, [](auto& row) { return row.text(0); }), std::nullopt);
  ASSERT_TRUE(database->failure());
  EXPECT_THAT(database->failure()->message, HasSubstr("no such table: absent"));
}

// After a purge. A daemon restored to a state before the deletion is asked for its contents.
TEST_F(MailSyncTest, NamesOfDeletedMessagesCanBeForgotten) {
  add("a/cur/departed", "one");
  add("a/cur/2", "two");
  ASSERT_TRUE(sync());
  const StoringDaemon::Content before = daemon.content();
  fs::remove(mail + "/a/cur/departed");
  ASSERT_TRUE(sync());
  const auto names = [this] {
    const auto bytes = platform::readFile(cataloguePath(), size_t{1} << 20, nullptr);
    return bytes.value_or("").find("departed") != std::string::npos;
  };
  EXPECT_TRUE(names());
  EXPECT_TRUE(mailsync::forgetDeleted(settings, &error)) << platform::printable(error);
  EXPECT_FALSE(names());
  ASSERT_TRUE(sync());
  EXPECT_FALSE(report.compared);
  daemon.setContent(before);
  ASSERT_TRUE(sync());
  EXPECT_TRUE(report.compared);
  EXPECT_EQ(indexed(), (Lines{"a: two"}));
  EXPECT_EQ(daemon.received(), 2U);
}

// A time in the future proves nothing, because the clock may have been set back.
TEST_F(MailSyncTest, ATimeInTheFutureIsNotTrusted) {
  add("a/cur/1", "one");
  const timespec future{std::time(nullptr) + 3600, 0};
  const timespec times[2] = {future, future};
  const auto set = [&] { utimensat(AT_FDCWD, (mail + "/a/cur").c_str(), times, 0); };
  set();
  ASSERT_TRUE(sync());
  add("a/cur/2", "two");
  set();
  EXPECT_EQ(synced(), (Lines{"a: one", "a: two"}));
}

TEST_F(MailSyncTest, FullDiskLosesNothing) {
  add("a/cur/1", "one");
  ASSERT_TRUE(sync());
  Lines expected{"a: one"};
  for (int i = 0; i < 2000; ++i) {
    add(fmt::format("b/cur/{}", i), fmt::format("s{}", i));
    expected.insert(fmt::format("b: s{}", i));
  }
  for (const uint64_t bytes : {100000, 300000}) {
    const testsupport::FileSizeLimit full(bytes);
    ASSERT_FALSE(sync()) << bytes;
    EXPECT_EQ(error->domain, mailsync::kCatalogueDomain);
  }
  EXPECT_EQ(synced(), expected);
}

// Random histories of mailbox, daemon and catalogue. After each successful sync the index matches
// the mailbox.
TEST_F(MailSyncTest, IndexMatchesTheMailboxAfterRandomHistories) {
  const uint32_t begin = testsupport::firstSeed();
  for (uint32_t seed = begin; seed < begin + 12; ++seed) {
    std::mt19937 random(seed);
    // Without a catalogue, new content under the same file name cannot be noticed.
    const bool losesCatalogue = seed % 2 == 0;
    const auto below = [&](size_t count) { return static_cast<size_t>(random() % count); };
    std::vector<std::string> history;
    std::map<std::string, std::string> files;    // Maildir files: path and subject
    std::vector<std::string> box{"b0"};          // messages in the mbox file
    std::vector<StoringDaemon::Content> copies;  // saved states of the daemon
    int count = 0;
    fs::remove_all(mail);
    fs::remove_all(settings.catalogueDirectory);
    daemon.setContent({});
    for (const char* folder : {"a", "b"}) makeFolder(folder);
    put("box", mboxOf(box));
    const auto someFile = [&] {
      return std::next(files.begin(), static_cast<long>(below(files.size())));
    };
    const auto rename = [&](auto file, const std::string& to) {
      move(file->first, to);
      std::string subject = file->second;
      files.erase(file);
      files[to] = std::move(subject);
    };
    for (int step = 0; step < 60; ++step) {
      const size_t action = below(14);
      history.push_back(std::to_string(action));
      const std::string folder = below(2) == 0 ? "a" : "b";
      if (action < 3) {
        const std::string path = fmt::format("{}/new/{}", folder, ++count);
        files[path] = fmt::format("s{}", count);
        add(path, files[path]);
      } else if (action == 3 && !files.empty()) {
        const auto file = someFile();
        fs::remove(mail + '/' + file->first);
        files.erase(file);
      } else if (action == 4 && !files.empty()) {
        const auto file = someFile();
        const std::string name = fs::path(file->first).filename().string();
        const std::string base = name.substr(0, name.find(':'));
        rename(file, fmt::format("{}/cur/{}:2,{}", file->first.substr(0, 1), base,
                                 below(2) == 0 ? "S" : "FS"));
      } else if (action == 5 && !files.empty()) {
        rename(someFile(), fmt::format("{}/cur/{}:2,", folder, ++count));
      } else if (action == 6) {
        box.push_back(fmt::format("b{}", below(8)));
        put("box", mboxOf(box));
      } else if (action == 7 && box.size() > 1) {
        box.erase(box.begin() + static_cast<long>(below(box.size())));
        put("box", mboxOf(box));
      } else if (action == 8) {
        daemon.failAfter(below(2), static_cast<StoringDaemon::Fault>(1 + below(4)));
      } else if (action == 9 && below(3) == 0) {
        daemon.setContent({});
      } else if (action == 10 && !copies.empty()) {
        daemon.setContent(copies[below(copies.size())]);
      } else if (action == 11 && losesCatalogue && below(3) == 0) {
        fs::remove_all(settings.catalogueDirectory);
      } else if (action == 12 && !losesCatalogue && !files.empty()) {
        const auto file = someFile();
        file->second = fmt::format("changed{}", ++count);
        fs::remove(mail + '/' + file->first);
        add(file->first, file->second);
      }
      if (below(2) == 0) age();
      if (below(3) == 0) continue;
      history.emplace_back("sync");
      if (!sync()) {
        ASSERT_EQ(error->domain, "Test") << platform::printable(error);
        continue;
      }
      Lines expected;
      for (const auto& [path, subject] : files) expected.insert(path.substr(0, 1) + ": " + subject);
      for (const std::string& subject : box) expected.insert("box: " + subject);
      ASSERT_EQ(indexed(), expected) << "seed " << seed << ": " << testing::PrintToString(history);
      copies.push_back(daemon.content());
    }
  }
}
