#include <fmt/format.h>
#include <gmock/gmock.h>

#include "cli/Identifier.h"
#include "cli/Threads.h"
#include "tests/support/TemporaryDirectory.h"

using cli::Thread;
using testing::ElementsAre;

namespace {

class ThreadsTest : public testing::Test {
 protected:
  void add(const std::string& header, double date) {
    const std::string path = directory.write(fmt::format("{}.eml", hits.size()), header + "\n\n");
    auto item = std::make_shared<TLIndexableItem>();
    item->setIdentifier(platform::fromUTF8(cli::fileIdentifier(path)));
    item->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, u"Boats\x1b of \u4EAC\u90FD");
    item->addAttributeWithKeyDoubleValue(TLAttributeKey::MAIL_DATE_RECEIVED, date);
    item->addPersonsWithKey(TLAttributeKey::AUTHORS, {u"a@example.org"});
    hits.push_back({item, {}});
  }

  const testsupport::TemporaryDirectory directory;
  cli::Hits hits;
  cli::MailFacts facts;
};

}  // namespace

TEST_F(ThreadsTest, GroupsMailsThatReferToTheSameMessage) {
  add("Message-ID: <reply@x>\nIn-Reply-To: Your message of Monday <first@x>", 1);
  add("Message-ID: <other@x>\nReferences: <>", 2);
  add("Message-ID: <a@y>\nReferences: <gone@y> <b@y>", 3);
  add("Message-ID: <first@x>", 4);
  add("Message-ID: <c@y>\nReferences: <gone@y>\n\t<d@y>", 5);
  add("Subject: no identifier", 6);
  add("Subject: Your message of Monday\nIn-Reply-To: Your message of Monday", 7);
  add("Message-ID: <last@x>\nReferences: <reply@x>\nIn-Reply-To: <other@x", 8);
  const auto threads = threadsOf(hits, facts);
  EXPECT_THAT(threads, ElementsAre(Thread{0, 3, 7}, Thread{1}, Thread{2, 4}, Thread{5}, Thread{6}));
  // Of too many references, the first and the last ones count.
  std::string middle;
  for (size_t i = 0; i < 2 * cli::kMaxReferences; ++i) middle += fmt::format(" <m{}@z>", i);
  add("References: <root@z>" + middle + " <end@z>", 9);
  add("Message-ID: <root@z>", 10);
  add("Message-ID: <m1@z>", 11);
  add("Message-ID: <end@z>", 12);
  EXPECT_EQ(threadsOf(hits, facts)[5], (Thread{8, 9, 11}));
}

TEST_F(ThreadsTest, PrintsOneLinePerThread) {
  setenv("TZ", "UTC", 1);
  add("Message-ID: <a@x>", 1704700800);
  add("Message-ID: <b@x>", 1704700800);
  add("Message-ID: <c@x>\nReferences: <a@x>", 1704700860);
  const auto threads = threadsOf(hits, facts);
  const cli::ThreadPage page{hits, threads, threads.size(), true};
  const cli::Palette plain(false);
  EXPECT_EQ(
      threadsText(page, "boats", plain, 0),
      "  1  2024-01-08 08:01  a@example.org         Boats\uFFFD of \u4EAC\u90FD  (2 results: 1 3)\n"
      "  2  2024-01-08 08:00  a@example.org         Boats\uFFFD of \u4EAC\u90FD\n");
  // The subject is shortened so that the line fits.
  const std::string narrow = threadsText(page, "", plain, 68);
  EXPECT_EQ(narrow.substr(0, narrow.find('\n')),
            "  1  2024-01-08 08:01  a@example.org         Boat…  (2 results: 1 3)");
}
