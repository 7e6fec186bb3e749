#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <limits>
#include <thread>

#include "client/DebugServiceProxy.h"
#include "client/SearchServiceProxy.h"
#include "tests/client/FakeDaemon.h"

using client::DebugServiceProxy;
using client::EncodedItem;
using client::SearchServiceProxy;
using testing::ElementsAre;

namespace {

class ProxyTest : public testing::Test {
 protected:
  testsupport::FakeDaemon daemon;
  SearchServiceProxy search{daemon.runtimeDirectory()};
  DebugServiceProxy debug{daemon.runtimeDirectory()};
  std::optional<TLError> error;
};

}  // namespace

TEST_F(ProxyTest, CallsCarryTheirArguments) {
  const std::vector<EncodedItem> items{{"a", "abc"}, {"b", std::string(2000, 'b')}};
  const std::vector<std::string> texts{"x", "ü"};
  EXPECT_TRUE(search.indexItems(items, "me", "default", &error));
  EXPECT_TRUE(search.indexItems({}, "me", "default", &error));  // nothing to send
  EXPECT_TRUE(search.deleteItemsWithIdentifiers(texts, "me", "", &error));
  EXPECT_TRUE(search.deleteItemsWithDomainIdentifiers(texts, "", "c", &error));
  EXPECT_TRUE(search.deleteAllItems("me", "c", &error));
  EXPECT_TRUE(search.indexItems(items, texts, std::string("s\0t", 3), "me", "c", &error));
  EXPECT_TRUE(search.indexItems({}, {}, std::nullopt, "me", "c", &error));
  EXPECT_TRUE(debug.forceVacuumAndCompact("c", &error));
  EXPECT_THAT(
      daemon.calls(),
      ElementsAre("IndexItems([3 bytes, 2000 bytes], me, default)",
                  "DeleteItemsWithIdentifiers([x, ü], me, )",
                  "DeleteItemsWithDomainIdentifiers([x, ü], , c)", "DeleteAllItems(me, c)",
                  "IndexItemsDeleteItemsWithIdentifiers([3 bytes, 2000 bytes], [x, ü], true, <" +
                      std::string("s\0t", 3) + ">, me, c)",
                  "IndexItemsDeleteItemsWithIdentifiers([], [], false, <>, me, c)",
                  "ForceVacuumAndCompact(c)"));
  EXPECT_FALSE(error.has_value());
}

TEST_F(ProxyTest, SearchSendsTheQueryAndReadsTheItems) {
  TLIndexableItem item;
  item.setIdentifier(u"one");
  daemon.answer("SearchItemsForQuery", [bytes = item.data()](rpc::Reply& reply) {
    reply.send({rpc::BytesArray{bytes, ""}});
  });
  TLQuery query;
  query.setOriginalQuery(u"café ");
  const auto items = search.searchItems(query, 1, "default", search.kNoMaximum, &error);
  ASSERT_TRUE(items.has_value()) << error->message;
  ASSERT_EQ(items->size(), 2u);
  EXPECT_TRUE(items->at(0)->isEqual(item));
  EXPECT_THAT(daemon.calls(), ElementsAre("SearchItemsForQuery(<" + query.data() +
                                          ">, 1, default, 9223372036854775807)"));
}

TEST_F(ProxyTest, StateDistinguishesAbsentFromEmpty) {
  EXPECT_FALSE(search.fetchLastClientState("me", "c", &error).has_value());
  EXPECT_FALSE(error.has_value());
  daemon.answer("FetchLastClientState", [](rpc::Reply& reply) {
    reply.send({true, rpc::Bytes{}});
  });
  EXPECT_EQ(search.fetchLastClientState("me", "c", &error), "");
}

TEST_F(ProxyTest, StatisticsKeepTheirNumberTypes) {
  const rpc::Dictionary sent{{"z", int64_t{-1}},
                             {"a", uint64_t{7}},
                             {"m", std::numeric_limits<uint64_t>::max()},
                             {"d", 0.5}};
  daemon.answer("FetchStatsForIndexer", [&](rpc::Reply& reply) { reply.send({sent}); });
  const auto statistics = debug.fetchStatsForIndexer("me", "c", &error);
  ASSERT_TRUE(statistics.has_value()) << error->message;
  const client::Statistics expected{{"z", int64_t{-1}},
                                    {"a", int64_t{7}},
                                    {"m", std::numeric_limits<uint64_t>::max()},
                                    {"d", 0.5}};
  EXPECT_EQ(*statistics, expected);
  EXPECT_EQ(debug.ping("hello", &error), "pong");
  EXPECT_EQ(debug.fetchStatsForSalt("me", "c", &error), "metrics");
}

TEST_F(ProxyTest, PassesOnErrorsOfTheDaemon) {
  const TLError failure{"TALIndexer", -4, "shutting down"};
  daemon.failOnce("DeleteAllItems", failure);
  EXPECT_FALSE(search.deleteAllItems("me", "c", &error));
  EXPECT_EQ(error, failure);
  daemon.answer("ForceVacuumAndCompact", [](rpc::Reply& reply) {
    reply.sendFailure(rpc::kInvalidArgs, "argument 0 is bad");
  });
  EXPECT_FALSE(debug.forceVacuumAndCompact("c", &error));
  EXPECT_EQ(error->domain, rpc::kProtocolDomain);
  EXPECT_EQ(error->message, "argument 0 is bad (org.freedesktop.DBus.Error.InvalidArgs)");
  EXPECT_TRUE(search.deleteAllItems("me", "c", nullptr));  // the connection stays open
}

// With twice as many clients as there are places, each call evicts an idle connection, whose client
// must not notice, not even if it is just about to send a call.
TEST_F(ProxyTest, AClientDoesNotNoticeThatItsIdleConnectionWasEvicted) {
  constexpr size_t kThreads = 8;
  std::atomic<int> failed = 0;
  const auto work = [&] {
    std::vector<std::unique_ptr<DebugServiceProxy>> clients;
    for (size_t i = 0; i < 2 * rpc::kMaxConnections / kThreads; ++i) {
      clients.push_back(std::make_unique<DebugServiceProxy>(daemon.runtimeDirectory()));
    }
    for (int round = 0; round < 20; ++round) {
      for (const auto& one : clients) failed += one->ping("hello", nullptr) != "pong";
    }
  };
  std::vector<std::thread> threads;
  while (threads.size() < kThreads) threads.emplace_back(work);
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(failed, 0);
}

TEST_F(ProxyTest, RefusesTextThatDBusCannotCarry) {
  const std::vector<std::string> texts{"\xFF"};
  EXPECT_FALSE(search.deleteItemsWithIdentifiers(texts, "me", "c", &error));
  EXPECT_EQ(error->domain, rpc::kClientDomain);
  EXPECT_TRUE(daemon.calls().empty());
}

TEST_F(ProxyTest, SplitsALongListAndSendsTheStateWithTheLastCallUnlessOneFails) {
  constexpr size_t kHalf = size_t{33} << 20;
  std::vector<EncodedItem> items;
  for (const char* name : {"a", "b"}) items.push_back({name, std::string(kHalf, 'i')});
  daemon.failOnce("IndexItems", {"TALIndexer", 1, "index failed"});
  EXPECT_FALSE(search.indexItems(items, {}, "state", "me", "c", &error));
  EXPECT_EQ(error->message, "index failed");
  const std::vector<std::string> texts{"old"};
  EXPECT_TRUE(search.indexItems(items, texts, "state", "me", "c", &error))
      << platform::printable(error);
  EXPECT_THAT(
      daemon.calls(),
      ElementsAre("IndexItems([34603008 bytes], me, c)", "DeleteItemsWithIdentifiers([old], me, c)",
                  "IndexItems([34603008 bytes], me, c)",
                  "IndexItemsDeleteItemsWithIdentifiers([34603008 bytes], [], true, "
                  "<state>, me, c)"));
}

TEST_F(ProxyTest, AbsentDaemonHasItsOwnErrorDomain) {
  SearchServiceProxy nowhere("/nonexistent");
  EXPECT_FALSE(nowhere.deleteAllItems("me", "c", &error));
  EXPECT_TRUE(rpc::isUnreachable(error));
  SearchServiceProxy tooLong(std::string(200, 'd'));
  EXPECT_FALSE(tooLong.deleteAllItems("me", "c", &error));
  EXPECT_TRUE(rpc::isUnreachable(error));

  EXPECT_TRUE(search.deleteAllItems("me", "c", nullptr));
  daemon.stop();
  EXPECT_FALSE(search.deleteAllItems("me", "c", &error));
  EXPECT_TRUE(rpc::isUnreachable(error)) << platform::printable(error);
}

TEST_F(ProxyTest, DaemonThatEndsDuringACallIsUnreachable) {
  std::promise<void> called;
  daemon.answer("Ping", [&](rpc::Reply&) { called.set_value(); });  // drops the reply
  std::thread stopper([&] {
    called.get_future().wait();
    daemon.stop();
  });
  EXPECT_FALSE(debug.ping("hello", &error).has_value());
  stopper.join();
  EXPECT_TRUE(rpc::isUnreachable(error)) << platform::printable(error);
}

TEST_F(ProxyTest, WaitsForTheSocketUntilPatienceRunsOut) {
  const testsupport::TemporaryDirectory directory;
  const std::string runtime = directory / "later";
  DebugServiceProxy hasty(runtime, std::chrono::milliseconds(1));
  EXPECT_FALSE(hasty.ping("", &error).has_value());
  EXPECT_TRUE(rpc::isUnreachable(error));
  std::thread starter([&] {
    // A directory that is created only now is noticed as well.
    EXPECT_EQ(rename(daemon.runtimeDirectory().c_str(), runtime.c_str()), 0);
  });
  DebugServiceProxy patient(runtime, std::chrono::minutes(1));
  EXPECT_EQ(patient.ping("", &error), "pong");
  starter.join();
}

TEST_F(ProxyTest, AfterAnInterruptNothingBegins) {
  EXPECT_FALSE(search.fetchLastClientState("me", "c", &error));
  ASSERT_FALSE(error.has_value()) << error->message;
  search.interrupt();
  EXPECT_FALSE(search.fetchLastClientState("me", "c", &error));
  EXPECT_TRUE(rpc::isUnreachable(error));
  EXPECT_FALSE(search.fetchLastClientState("me", "c", &error));
  EXPECT_TRUE(rpc::isUnreachable(error));
  EXPECT_EQ(daemon.calls().size(), 1u);
}
