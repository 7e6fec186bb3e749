#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <map>
#include <random>

#include "docstore/TALSqliteDocStore.h"
#include "indexer/TALIndexer.h"
#include "inspect/Purge.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "platform/ProcessLock.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/salt/Model.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/FileSizeLimit.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Outcome.h"
#include "tests/support/Programs.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testsupport::outcomeOf;

constexpr int kMails = 80;
constexpr int kDeleted = 20;  // the first ones

// Three words that occur in this mail only, in its subject, its snippet and its body.
std::string rareWord(int mail, const char* where) {
  return fmt::format("q{}z{}vx{}kj", where, mail * 7919 % 104729, mail);
}

class PurgeTest : public testing::Test {
 protected:
  PurgeTest() {
    static_cast<void>(platform::ProcessLock::acquire(platform::processLockPath(state), nullptr));
    open();
    TALIndexer::Items items;
    std::mt19937 random(1);
    for (int i = 0; i < kMails; ++i) items.push_back(mail(i, random));
    EXPECT_EQ(outcomeOf([&](auto done) {
                indexer->addDocs(items, {}, "state", u"client", "mail", done);
              }),
              std::nullopt);
    EXPECT_EQ(
        outcomeOf([&](auto done) { indexer->forceRebuildTopKVocabWithCompletionHandler(done); }),
        std::nullopt);
    TALIndexer::Strings identifiers;
    for (int i = 0; i < kDeleted; ++i) identifiers.push_back(nameOf(i));
    EXPECT_EQ(
        outcomeOf([&](auto done) { indexer->deleteItemsByIdentifiers(identifiers, "mail", done); }),
        std::nullopt);
    answersBefore = answers();
    // As a kill leaves it: with logs.
    fs::copy(root, directory / "killed", fs::copy_options::recursive);
    close();
    fs::remove_all(root);
    fs::rename(directory / "killed", root);
  }

  static TLString nameOf(int i) { return platform::fromUTF8(fmt::format("mail-{}", i)); }

  static std::shared_ptr<TLIndexableItem> mail(int i, std::mt19937& random) {
    constexpr const char* kWords[] = {"harbour", "invoice", "meeting", "tea", "ferry", "window"};
    std::string body = rareWord(i, "snippet") + ' ';
    while (body.size() < 2000) body += kWords[random() % std::size(kWords)] + std::string(" ");
    auto item = std::make_shared<TLIndexableItem>();
    item->setIdentifier(nameOf(i));
    item->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT,
                                         platform::fromUTF8(rareWord(i, "subject") + " harbour"));
    item->addAttributeWithKeyStringValue(TLAttributeKey::TEXT_CONTENT,
                                         platform::fromUTF8(body + rareWord(i, "body")));
    return item;
  }

  void open() {
    store = std::make_shared<TALSqliteDocStore>(classPath + "/docstore/docstore.db");
    ASSERT_TRUE(store->openWithError(nullptr));
    indexer = std::make_unique<TALIndexer>(classPath + "/salt", "default", store, "");
  }
  void close() {
    indexer->shutdown();
    indexer.reset();
    store.reset();
  }

  // By query: identifier, ID in the store, and score of each result, in order.
  std::map<std::string, std::string> answers() {
    std::map<std::string, std::string> all;
    for (const char* text : {"harbour", "invoice tea", "h", "ferry ", "meeting window t", "harbuor",
                             "qsubject", "windows tea", "zebra", "qbodyz"}) {
      TLQuery query;
      query.setOriginalQuery(platform::fromUTF8(text));
      for (const auto& item : indexer->search(query, nullptr)) {
        const auto url = TALIndexer::documentURLForIdentifier(item->identifier(), "mail");
        all[text] +=
            fmt::format("{} {} {}\n", platform::printable(item->identifier()),
                        store->documentIDWithURL(*url, nullptr), item->card()->textScore());
      }
    }
    return all;
  }
  std::map<std::string, std::string> answersNow() {
    open();
    auto now = answers();
    std::string client;
    indexer->fetchLastClientStateforName(
        u"client", [&](const auto& bytes, const auto&) { client = bytes.value_or("(none)"); });
    EXPECT_EQ(client, "state");
    close();
    return now;
  }

  // How many words of deleted mails occur in any file of the state (including the vocabulary) or,
  // because tables are compressed, in a key or value of the index.
  size_t rareWordsLeft() {
    std::string bytes;
    for (const auto& entry : fs::recursive_directory_iterator(state)) {
      if (!entry.is_regular_file()) continue;
      bytes += entry.path().string() + '\n';
      bytes += platform::readFile(entry.path(), size_t{1} << 30, nullptr).value_or("") + '\n';
    }
    for (const auto& [key, value] : salttest::readKeys(classPath + "/salt")) {
      bytes += key + '\n' + value + '\n';
    }
    size_t left = 0;
    for (int i = 0; i < kDeleted; ++i) {
      for (const char* where : {"subject", "snippet", "body"}) {
        left += bytes.find(rareWord(i, where)) == std::string::npos ? 0 : 1;
      }
    }
    return left;
  }

  std::optional<inspect::PurgeReport> purge() {
    error.reset();
    return inspect::purge(
        state, "default", [](const char*) {}, &error);
  }

  // Purges in its own process, which `step` may end; returns the status from waitpid.
  int purgeInChild(const std::function<void(int number, std::string_view step)>& step) {
    const pid_t child = fork();
    if (child == 0) {
      int number = 0;
      std::optional<TLError> failure;
      const bool done =
          inspect::purge(
              state, "default", [&](const char* what) { step(number++, what); }, &failure)
              .has_value();
      _exit(done ? 0 : 1);
    }
    int status = 0;
    waitpid(child, &status, 0);
    return status;
  }

  testsupport::LogCapture log;
  testsupport::TemporaryDirectory directory;
  const std::string state = directory / "state";
  const std::string root = platform::dataRoot(state);
  const std::string classPath = root + "/default";
  std::shared_ptr<TALSqliteDocStore> store;
  std::unique_ptr<TALIndexer> indexer;
  std::map<std::string, std::string> answersBefore;
  std::optional<TLError> error;
};

}  // namespace

TEST_F(PurgeTest, RemovesDeletedMailAndKeepsAnswers) {
  EXPECT_GT(rareWordsLeft(), size_t{kDeleted});
  const auto estimate = inspect::estimatePurge(state, "default", &error);
  ASSERT_TRUE(estimate) << platform::printable(error);
  EXPECT_EQ(estimate->documents, uint64_t{kDeleted});
  EXPECT_LT(estimate->bytesAfter, estimate->bytesBefore);
  EXPECT_GT(rareWordsLeft(), size_t{kDeleted});  // it changes nothing

  // A document missing in the store is not found by any search.
  ASSERT_TRUE(
      salttest::addZone(*salttest::loadIndex(classPath + "/salt"), kMails + 9, 1, "orphanedword "));
  fs::create_directories(classPath + "/salt.damaged-1");
  const auto report = purge();
  ASSERT_TRUE(report) << platform::printable(error);
  EXPECT_EQ(report->documents, uint64_t{kDeleted + 1});
  EXPECT_LT(report->bytesAfter, report->bytesBefore);
  EXPECT_TRUE(report->hadSetAside);
  EXPECT_EQ(rareWordsLeft(), 0u);
  EXPECT_TRUE(salttest::scan(*salttest::loadIndex(classPath + "/salt"), "orphaned").empty());
  EXPECT_FALSE(fs::exists(platform::purgeDirectory(state)));
  EXPECT_EQ(answersNow(), answersBefore);
  EXPECT_THAT(answersBefore["harbuor"], HasSubstr("mail-"));

  open();  // IDs continue where they were
  std::mt19937 random(2);
  TALIndexer::Items again{mail(kMails, random), mail(0, random)};
  EXPECT_EQ(outcomeOf([&](auto done) { indexer->addDocs(again, "mail", done); }), std::nullopt);
  const auto url = TALIndexer::documentURLForIdentifier(nameOf(0), "mail");
  EXPECT_EQ(store->documentIDWithURL(*url, nullptr), uint32_t{kMails + 2});
  const auto words = indexer->topKVocabulary();
  ASSERT_NE(words, nullptr);
  EXPECT_FALSE(words->empty());
  close();
  const auto second = purge();
  ASSERT_TRUE(second) << platform::printable(error);
  EXPECT_EQ(second->documents, 0u);
}

TEST_F(PurgeTest, KillLeavesTheOldOrTheNewClass) {
  int kills = 0;
  for (;; ++kills) {
    const int status = purgeInChild([kills](int number, std::string_view) {
      if (number == kills) raise(SIGKILL);
    });
    if (WIFEXITED(status)) {
      EXPECT_EQ(WEXITSTATUS(status), 0);
      break;
    }
    ASSERT_EQ(WTERMSIG(status), SIGKILL);
    EXPECT_EQ(answersNow(), answersBefore) << kills;
  }
  EXPECT_GE(kills, 9);
  EXPECT_EQ(rareWordsLeft(), 0u);
  EXPECT_FALSE(fs::exists(platform::purgeDirectory(state)));
}

TEST_F(PurgeTest, TheDaemonRemovesTheRemainsOfAKilledPurge) {
  const int status = purgeInChild([](int, std::string_view step) {
    if (step == "removing the old files") raise(SIGKILL);
  });
  ASSERT_TRUE(WIFSIGNALED(status));
  ASSERT_TRUE(fs::exists(platform::purgeDirectory(state)));
  testsupport::DaemonProcess daemon(directory.path());
  ASSERT_TRUE(daemon.ready());
  EXPECT_FALSE(fs::exists(platform::purgeDirectory(state)));
  EXPECT_EQ(purge(), std::nullopt);
  EXPECT_EQ(error->code, EWOULDBLOCK);
  const auto client = [this](const std::string& arguments) {
    return testsupport::outputOf("XDG_STATE_HOME=" + directory.path() +
                                 " " TALLOW_PROGRAM " --state-dir " + state + " purge " +
                                 arguments + " 2>&1; echo status=$?");
  };
  EXPECT_THAT(client(""),
              AllOf(HasSubstr("systemctl --user stop 'tallowsearchd*'"), HasSubstr("status=3")));
  EXPECT_EQ(daemon.stop(), 0);
  EXPECT_THAT(client("--dry-run --format=json"),
              AllOf(HasSubstr("\"documents\": 0,"), HasSubstr("status=0")));
  EXPECT_THAT(client(""), AllOf(HasSubstr("0 deleted messages removed from the disk, "),
                                HasSubstr("status=0")));
}

// A failed write ends the purge, or the process, and leaves the old class.
TEST_F(PurgeTest, FullDiskChangesNothing) {
  for (const uint64_t bytes : {0, 1000, 20000, 60000, 150000}) {
    const int status = purgeInChild([bytes](int number, std::string_view) {
      if (number == 0) new testsupport::FileSizeLimit(bytes);
    });
    EXPECT_FALSE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << bytes;
    EXPECT_GT(rareWordsLeft(), size_t{kDeleted}) << bytes;
    EXPECT_EQ(answersNow(), answersBefore) << bytes;
  }
  EXPECT_TRUE(purge()) << platform::printable(error);
  EXPECT_EQ(answersNow(), answersBefore);
}

TEST_F(PurgeTest, RefusesClassesThatItCannotReplace) {
  const std::string salt = classPath + "/salt";
  const struct {
    const char* reason;
    std::function<void()> make;
  } cases[] = {
      {"notes.txt is no file of the daemon's",
       [&] { platform::writeFileAtomically(classPath + "/notes.txt", "mine", nullptr); }},
      {"salt is a symbolic link",
       [&] {
         fs::rename(salt, directory / "salt");
         fs::create_directory_symlink(directory / "salt", salt);
       }},
      {"docstore.db: No such file", [&] { fs::remove_all(classPath + "/docstore"); }},
      {"the index cannot be opened", [&] { fs::remove(salt + "/CURRENT"); }},
      {"lock: No such file", [&] { fs::remove(platform::processLockPath(state)); }},
  };
  const std::string kept = directory / "kept";
  fs::copy(root, kept, fs::copy_options::recursive);
  for (const auto& c : cases) {
    c.make();
    EXPECT_EQ(purge(), std::nullopt) << c.reason;
    ASSERT_TRUE(error) << c.reason;
    EXPECT_THAT(error->message, HasSubstr(c.reason));
    EXPECT_FALSE(fs::exists(platform::purgeDirectory(state)));
    fs::remove_all(root);
    fs::copy(kept, root, fs::copy_options::recursive);
  }
  EXPECT_EQ(answersNow(), answersBefore);
}
