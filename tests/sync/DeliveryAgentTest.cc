#include <atomic>
#include <cstdio>
#include <thread>

#include "parameters/TLParamsManager.h"
#include "tests/sync/WatchProcessSupport.h"

// The watch with a delivery agent that sorts mail into two folders, during searches.

namespace {

constexpr const char* kAgent = "/usr/bin/procmail";
constexpr int kMails = 200;
constexpr int kDeliverers = 4;
constexpr int kSearchers = 2;

class DeliveryAgentTest : public testsupport::WatchProcessTest {
 protected:
  void SetUp() override {
    NEED_PROGRAMS(kAgent)
    write(
        "rules",
        fmt::format("SHELL=/bin/sh\nMAILDIR={0}\nDEFAULT={0}/a/\n:0\n* ^Subject:.*7$\nb/\n", mail));
  }

  void deliverByAgent(int number) const {
    FILE* const agent = popen(fmt::format("{} {}", kAgent, rules).c_str(), "w");
    ASSERT_NE(agent, nullptr);
    fmt::print(agent,
               "From: a@example.org\nMessage-ID: <{0}@example.org>\nSubject: {0}\n\nparcel\n",
               number);
    EXPECT_EQ(pclose(agent), 0);
  }

  // The subjects of the mails found.
  [[nodiscard]] std::multiset<std::string> found() const {
    TLQuery query;
    query.setRawQuery(u"parcel");
    query.setOriginalQuery(u"parcel");
    query.setSearchParams(TLParamsManager::paramsFromString(u"salt.maxTopK=10000"));
    client::SearchServiceProxy service(daemon->runtimeDirectory());
    const auto items = service.searchItems(query, 0, "default", 10000, nullptr);
    std::multiset<std::string> subjects;
    EXPECT_TRUE(items);
    for (const auto& item : items.value_or(client::SearchServiceProxy::Items())) {
      subjects.insert(platform::toUTF8(*item->stringValueForKey(TLAttributeKey::SUBJECT)));
    }
    return subjects;
  }

  const std::string rules = directory / "rules";
};

}  // namespace

TEST_F(DeliveryAgentTest, FindsEveryMailExactlyOnce) {
  std::atomic<int> next{0};
  std::atomic<bool> ended{false};
  std::vector<std::thread> deliverers;
  std::vector<std::thread> searchers;
  for (int i = 0; i < kDeliverers; ++i) {
    deliverers.emplace_back([&] {
      for (int number = next++; number < kMails; number = next++) deliverByAgent(number);
    });
  }
  for (int i = 0; i < kSearchers; ++i) {
    searchers.emplace_back([&] {
      for (size_t before = 0; !ended;) {
        const auto subjects = found();
        EXPECT_EQ(std::set<std::string>(subjects.begin(), subjects.end()).size(), subjects.size());
        EXPECT_GE(subjects.size(), before);
        before = subjects.size();
      }
    });
  }
  for (std::thread& deliverer : deliverers) deliverer.join();
  waitUntilInStep();
  ended = true;
  for (std::thread& searcher : searchers) searcher.join();
  std::multiset<std::string> all;
  for (int number = 0; number < kMails; ++number) all.insert(std::to_string(number));
  EXPECT_EQ(found(), all);
  EXPECT_EQ(onDisk().size(), all.size());
  EXPECT_FALSE(std::filesystem::is_empty(mail + "/b/new"));
  EXPECT_EQ(watch->end(SIGTERM), 0);
}
