#include <fcntl.h>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <csignal>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <random>
#include <set>

#include "cli/Identifier.h"
#include "platform/Files.h"
#include "platform/Text.h"
#include "sync/MailSync.h"
#include "sync/MessageDigest.h"
#include "tests/support/Seed.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/sync/StoringDaemon.h"

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testsupport::StoringDaemon;

namespace {

// Repeated syncs of a mailbox of the test. `age` sets the times of files and directories back, each
// to a value not used before, so that changes can be detected.
class MailSyncTest : public testing::Test {
 protected:
  MailSyncTest() {
    settings.runtimeDirectory = daemon.runtimeDirectory();
    settings.protectionClass = "default";
    settings.name = "tallow";
    settings.catalogueDirectory = directory / "state";
    settings.lockPatience = std::chrono::milliseconds(0);
    for (const char* folder : {"a", "b"}) makeFolder(folder);
  }

  void makeFolder(const std::string& folder) const {
    for (const char* sub : {"cur", "new", "tmp"})
      fs::create_directories(mail + '/' + folder + '/' + sub);
  }
  static std::string message(const std::string& subject) {
    return fmt::format(
        "From: a@example.org\nDate: Mon, 8 Jan 2024 08:00:00 +0000\n"
        "Subject: {}\n\nText of {}\n",
        subject, subject);
  }
  void put(const std::string& path, const std::string& content) const {
    std::ofstream(mail + '/' + path, std::ios::binary) << content;
  }
  void add(const std::string& path, const std::string& subject) const {
    put(path, message(subject));
  }
  static std::string mboxOf(const std::vector<std::string>& subjects) {
    std::string text;
    for (const std::string& subject : subjects) {
      text += "From a@example.org Mon Jan  8 08:00:00 2024\n" + message(subject) + '\n';
    }
    return text;
  }
  void move(const std::string& from, const std::string& to) const {
    fs::rename(mail + '/' + from, mail + '/' + to);
  }
  void age() {
    std::vector<std::string> paths{mail};
    for (const auto& entry : fs::recursive_directory_iterator(mail)) paths.push_back(entry.path());
    for (const std::string& path : paths) {
      struct stat info {};
      if (stat(path.c_str(), &info) == 0 && info.st_mtime > 1'500'000'000) {
        const timespec time{1'000'000'000 + ++tick, 0};
        const timespec times[2] = {time, time};
        utimensat(AT_FDCWD, path.c_str(), times, 0);
      }
    }
  }

  bool sync(const std::vector<std::string>& paths = {}) {
    complaints.clear();
    plan.clear();
    error.reset();
    report = {};
    const mailsync::SyncObserver observer{
        [&](const std::string& where, const std::string& reason) {
          complaints.push_back(where + ": " + reason);
        },
        [](uint64_t, uint64_t, const mailsync::DeliveryCounts&) {}, [] { return false; },
        [&](const char* action, const std::string& what) {
          plan.push_back(std::string(action) + ' ' + what);
        }};
    return mailsync::syncMail(settings, paths.empty() ? std::vector{mail} : paths, observer, report,
                              &error);
  }

  // "FOLDER: SUBJECT" of each message in the index.
  [[nodiscard]] std::multiset<std::string> indexed() const {
    std::multiset<std::string> found;
    for (const auto& [identifier, item] : daemon.content().items) {
      const std::string folder =
          platform::toUTF8(item->stringValuesForKey(TLAttributeKey::MAILBOX_IDENTIFIERS)->front());
      found.insert(folder.substr(mail.size() + 1) + ": " +
                   platform::toUTF8(*item->stringValueForKey(TLAttributeKey::SUBJECT)));
    }
    return found;
  }
  [[nodiscard]] std::string cataloguePath() const {
    return mailsync::cataloguePath(settings.catalogueDirectory, settings.runtimeDirectory,
                                   settings.protectionClass);
  }

  testsupport::TemporaryDirectory directory;
  const std::string mail = directory / "mail";
  StoringDaemon daemon;
  mailsync::SyncSettings settings;
  mailsync::SyncReport report;
  std::optional<TLError> error;
  std::vector<std::string> complaints;
  std::vector<std::string> plan;
  int64_t tick = 0;
};

using Lines = std::multiset<std::string>;

}  // namespace

TEST_F(MailSyncTest, SendsOnlyWhatHasChanged) {
  add("a/new/1", "one");
  add("a/cur/2:2,S", "two");
  age();
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed(), (Lines{"a: one", "a: two"}));
  EXPECT_EQ(daemon.received(), 2U);
  ASSERT_TRUE(sync());
  EXPECT_EQ(report.scan.entered, 0U);
  // Moves and flag changes send nothing, and the identifier stays the same.
  move("a/new/1", "a/cur/1:2,");
  move("a/cur/2:2,S", "a/cur/2:2,FRS");
  age();
  ASSERT_TRUE(sync());
  EXPECT_EQ(daemon.received(), 2U);
  EXPECT_EQ(report.scan.moves, 1U);
  EXPECT_EQ(report.scan.flagChanges, 1U);
  const auto catalogue = mailsync::openCatalogue(settings, nullptr);
  const auto place = catalogue->find(cli::maildirIdentifier(mail + "/a/cur/2:2,FRS"));
  ASSERT_TRUE(place);
  EXPECT_EQ(place->path, mail + "/a/cur/2:2,FRS");
  EXPECT_EQ(place->flags, "FRS");
  EXPECT_TRUE(place->indexed);
  // A move to another folder sends the message again.
  move("a/cur/1:2,", "b/cur/1:2,");
  // New content under the same name.
  fs::remove(mail + "/a/cur/2:2,FRS");
  add("a/cur/2:2,FRS", "rewritten");
  age();
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed(), (Lines{"b: one", "a: rewritten"}));
  EXPECT_EQ(report.delivery.replaced, 1U);
}

TEST_F(MailSyncTest, MessagesOfAnMboxKeepTheirIdentity) {
  put("box.mbox", mboxOf({"one", "two", "same", "same", "three"}));
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed(), (Lines{"box.mbox: one", "box.mbox: two", "box.mbox: same", "box.mbox: same",
                              "box.mbox: three"}));
  const auto before = daemon.content().items;
  put("box.mbox", mboxOf({"two", "same", "three", "four"}));
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed(),
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
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed(), (Lines{"b: one"})) << first;
}

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
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed().size(), 2U);
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
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed().size(), 2U);
  settings.pruneMissing = true;
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed().size(), 0U);
}

TEST_F(MailSyncTest, NamesOfAnyBytesAndTenThousandRenames) {
  add("a/cur/caf\xE9:2,S", "latin");
  for (int i = 0; i < 10000; ++i) put(fmt::format("b/cur/{}:2,", i), "Subject: x\n\n");
  ASSERT_TRUE(sync());
  EXPECT_EQ(daemon.content().items.size(), 10001U);
  for (int i = 0; i < 10000; ++i)
    move(fmt::format("b/cur/{}:2,", i), fmt::format("b/cur/{}:2,S", i));
  ASSERT_TRUE(sync());
  EXPECT_EQ(report.scan.flagChanges, 10000U);
  EXPECT_EQ(report.toSend + report.toDelete, 0U);
}

TEST_F(MailSyncTest, ReportsFailedMessagesAndDoesNotCountThemAsSent) {
  add("a/cur/1", "one");
  add("a/cur/2", "poison");
  put("a/cur/3", "\n\n");
  daemon.refuse("poison");
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed(), (Lines{"a: one"}));
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
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed().size(), 1U);
  settings.retryFailed = true;
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed(), (Lines{"a: one", "a: poison"}));
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
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed(), (Lines{"a: one", "box: three", "b: four"}));
  EXPECT_EQ(daemon.received(), 4U);
  for (const char* suffix : {"-wal", "-shm"}) fs::remove(cataloguePath() + suffix);
  std::ofstream(cataloguePath(), std::ios::binary) << std::string(8192, 'x');
  ASSERT_TRUE(sync()) << platform::printable(error);
  EXPECT_EQ(daemon.received(), 4U);
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
  ASSERT_TRUE(sync());
  EXPECT_EQ(indexed(), (Lines{"a: one", "a: two"}));
}

TEST_F(MailSyncTest, FullDiskLosesNothing) {
  add("a/cur/1", "one");
  ASSERT_TRUE(sync());
  Lines expected{"a: one"};
  for (int i = 0; i < 2000; ++i) {
    add(fmt::format("b/cur/{}", i), fmt::format("s{}", i));
    expected.insert(fmt::format("b: s{}", i));
  }
  // Files of this process cannot grow, which has the effect of a full disk.
  std::signal(SIGXFSZ, SIG_IGN);
  rlimit before{};
  getrlimit(RLIMIT_FSIZE, &before);
  for (const rlim_t bytes : {rlim_t{100000}, rlim_t{300000}}) {
    const rlimit full{bytes, before.rlim_max};
    setrlimit(RLIMIT_FSIZE, &full);
    const bool done = sync();
    setrlimit(RLIMIT_FSIZE, &before);
    ASSERT_FALSE(done) << bytes;
    EXPECT_EQ(error->domain, mailsync::kCatalogueDomain);
  }
  ASSERT_TRUE(sync()) << platform::printable(error);
  EXPECT_EQ(indexed(), expected);
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
