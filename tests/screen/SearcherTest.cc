#include <gmock/gmock.h>

#include <clocale>
#include <filesystem>
#include <future>
#include <semaphore>

#include "screen/MailLoader.h"
#include "screen/Searcher.h"
#include "tests/client/FakeDaemon.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/ShellTest.h"

using mailscreen::Failure;
using mailscreen::Found;
using mailscreen::Mail;
using mailscreen::Search;
using testing::HasSubstr;

namespace {

class SearcherTest : public testsupport::ShellTest {
 protected:
  void SetUp() override {
    ASSERT_NE(std::setlocale(LC_CTYPE, "C.UTF-8"), nullptr);
    setenv("XDG_STATE_HOME", (directory / "client").c_str(), 1);
    setenv("XDG_CONFIG_HOME", (directory / "config").c_str(), 1);
  }

  [[nodiscard]] cli::Options options(const std::string& runtimeDirectory) const {
    cli::Options options;
    options.runtimeDirectory = runtimeDirectory;
    return options;
  }

  // What a worker thread, which rings when it has something, makes of this.
  auto resultOf(auto& worker, const auto& task) {
    worker.submit(task);
    bell.acquire();
    return worker.take().value();
  }
  Found find(mailscreen::Searcher& searcher, const Search& search) {
    return resultOf(searcher, search);
  }

  std::counting_semaphore<> bell{0};
};

// The daemon with the sample mail.
class SampleSearchTest : public SearcherTest {
 protected:
  void SetUp() override {
    SearcherTest::SetUp();
    ASSERT_TRUE(daemon.ready());
    std::filesystem::copy(TALLOW_SAMPLE_MAIL, mail, std::filesystem::copy_options::recursive);
    tallow = TALLOW_PROGRAM " --runtime-dir " + daemon.runtimeDirectory();
    ASSERT_EQ(run("index " + mail), 0) << errors;
  }
  Found find(const Search& search) { return SearcherTest::find(searcher, search); }

  const std::string mail = directory / "mail";
  const testsupport::DaemonProcess daemon{directory.path()};
  mailscreen::Searcher searcher{options(daemon.runtimeDirectory()), [this] { bell.release(); }};
};

constexpr auto kRelevance = cli::SortOrder::relevance;

}  // namespace

TEST_F(SearcherTest, ReportsReasonsOfFailures) {
  testsupport::FakeDaemon fake;
  mailscreen::Searcher searcher(options(fake.runtimeDirectory()), [this] { bell.release(); });
  fake.failOnce("SearchItemsForQuery", {"com.quill.tallow.TALIndexerManager", -2, "locked"});
  Found found = find(searcher, {"words", "", kRelevance, false, 0, 10});
  EXPECT_EQ(found.failure, Failure::refused);
  EXPECT_THAT(found.reason, HasSubstr("device is locked"));
  found = find(searcher, {"@bills", "", kRelevance, false, 0, 10});
  EXPECT_EQ(found.failure, Failure::query);
  EXPECT_THAT(found.reason, HasSubstr("there is no saved search \"bills\""));
  fake.stop();
  found = find(searcher, {"words", "", kRelevance, false, 0, 10});
  EXPECT_EQ(found.failure, Failure::unreachable);
  EXPECT_EQ(found.reason, "tallowsearchd is not running");
}

// A daemon that does not answer does not delay the end of the program.
TEST_F(SearcherTest, DestructorDoesNotWaitForAReply) {
  // Before the daemon, whose thread may use them until it ends.
  std::promise<void> called;
  std::promise<void> ended;
  testsupport::FakeDaemon fake;
  fake.answer("SearchItemsForQuery", [&](rpc::Reply& reply) {
    called.set_value();
    ended.get_future().wait();
    reply.send({rpc::BytesArray{}});
  });
  {
    mailscreen::Searcher searcher(options(fake.runtimeDirectory()), [] {});
    searcher.submit({"words", "", kRelevance, false, 0, 10});
    called.get_future().wait();
  }
  ended.set_value();
}

TEST_F(SampleSearchTest, RowsAreReadyToBeShown) {
  const Found found = find({"\"corrected invoice\"", "", cli::SortOrder::date, false, 0, 2});
  ASSERT_EQ(found.failure, Failure::none) << found.reason;
  ASSERT_EQ(found.rows.size(), 2u);
  const auto& row = found.rows[1];
  EXPECT_EQ(mailscreen::toUTF8(row.date), "2024-01-11 10:03");
  EXPECT_EQ(mailscreen::toUTF8(row.from), "Nordlys Energy");
  EXPECT_THAT(mailscreen::toUTF8(row.subject), HasSubstr("\x02invoice\x01"));
  EXPECT_EQ(row.folder, "archive");
  EXPECT_EQ(row.path, mail + "/archive.mbox");
  EXPECT_THAT(row.place, testing::StartsWith(row.path + ":"));
  EXPECT_THAT(found.words, testing::ElementsAre("corrected", "invoice"));
}

TEST_F(SampleSearchTest, PagesThreadsFoldersAndSavedSearches) {
  const Found all = find({"e", "", kRelevance, false, 0, 100});
  const Found second = find({"e", "", kRelevance, false, 5, 5});
  ASSERT_GT(all.rows.size(), 10u);
  EXPECT_TRUE(all.complete);
  ASSERT_EQ(second.rows.size(), 5u);
  EXPECT_EQ(second.rows[0].identifier, all.rows[5].identifier);

  const Found threads = find({"invoice 4471 ", "", kRelevance, true, 0, 10});
  ASSERT_EQ(threads.rows.size(), 4u);
  EXPECT_EQ(threads.total, 1u);
  EXPECT_EQ(threads.rows[0].together, 4u);
  EXPECT_TRUE(threads.rows[3].follows);

  const Found folder = find({"e OR a", "drafts", kRelevance, false, 0, 100});
  EXPECT_EQ(folder.rows.size(), 1u);
  for (const auto& row : folder.rows) EXPECT_EQ(row.folder, "drafts");
  EXPECT_EQ(find({"", "drafts", kRelevance, false, 0, 100}).rows.size(), 2u);

  write("config/tallow/searches", "toasts subject:toast\n");
  EXPECT_EQ(find({"@toasts", "", kRelevance, false, 0, 10}).rows.size(), 1u);
  EXPECT_EQ(find({"nothingofthekind @toasts", "", kRelevance, false, 0, 10}).rows.size(), 0u);
}

TEST_F(SampleSearchTest, LimitsMailsToRead) {
  mailscreen::MailLoader loader(options(daemon.runtimeDirectory()), [this] { bell.release(); });
  const auto load = [&](const std::string& identifier, bool whole) {
    return resultOf(loader, mailscreen::MailRequest{identifier, {"lo"}, whole});
  };
  write("mail/large.eml", "Subject: large\n\n" + std::string(200000, 'x') + "\nlost at the end\n");
  const std::string identifier = "file" + mail + "/large.eml";
  const Mail beginning = load(identifier, false);
  EXPECT_TRUE(beginning.cut);
  EXPECT_LE(beginning.text.size(), mailscreen::MailLoader::kPreviewText);
  const Mail whole = load(identifier, true);
  EXPECT_FALSE(whole.cut);
  EXPECT_THAT(mailscreen::toUTF8(whole.text), HasSubstr("\x02lost\x01 at the end"));
  EXPECT_THAT(mailscreen::toUTF8(load(identifier + "-gone", false).text),
              HasSubstr("No such file"));
  EXPECT_THAT(mailscreen::toUTF8(load("other:1", false).text), HasSubstr("no message"));
}
