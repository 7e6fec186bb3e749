#include <fmt/ranges.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <csignal>
#include <cstdlib>
#include <fstream>
#include <regex>
#include <set>
#include <thread>

#include "client/DebugServiceProxy.h"
#include "client/SearchServiceProxy.h"
#include "daemon/TALIndexerManager.h"
#include "parameters/TLParamsManager.h"
#include "platform/Files.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/daemon/DaemonSupport.h"
#include "tests/support/RawMessages.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

using client::EncodedItem;
using testsupport::DaemonProcess;
using testsupport::mail;
using testsupport::mails;
using testsupport::search;
using Outcome = std::optional<TLError>;

class DaemonProcessTest : public testing::Test {
 protected:
  testsupport::TemporaryDirectory directory;
};

class EndingSignal : public DaemonProcessTest, public testing::WithParamInterface<int> {};

// The methods of an interface in an introspection text, each with its arguments in order.
std::set<std::string> methods(const std::string& xml, const std::string& interface) {
  const size_t from = xml.find("<interface name=\"" + interface + "\"");
  if (from == std::string::npos) return {};
  const std::string body = xml.substr(from, xml.find("</interface>", from) - from);
  const std::regex tag("<(method|arg) ([^>]*)>");
  const std::regex attribute("\\w+=\"[^\"]*\"");
  std::vector<std::string> found;
  for (std::sregex_iterator next(body.begin(), body.end(), tag), end; next != end; ++next) {
    if ((*next)[1] == "method") found.emplace_back();
    const std::string text = (*next)[2];
    const std::set<std::string> attributes(
        std::sregex_token_iterator(text.begin(), text.end(), attribute), {});
    found.back() += fmt::format("{} ", fmt::join(attributes, " "));
  }
  return {found.begin(), found.end()};
}

std::string introspect(const std::string& socketPath, const std::string& objectPath) {
  const std::string call =
      testsupport::rawCall(objectPath, "org.freedesktop.DBus.Introspectable", "Introspect", "", "");
  return testsupport::answerTo(call, socketPath, "</node>");
}

}  // namespace

TEST_P(EndingSignal, ShutsDownDuringABatchAndASearchWithoutLosingAcknowledgedMail) {
  int acknowledged = 0;
  {
    DaemonProcess daemon(directory.path());
    ASSERT_TRUE(daemon.ready());
    client::SearchServiceProxy first(daemon.runtimeDirectory());
    ASSERT_TRUE(first.indexItems(mails("first", 50), "test", "default", nullptr));
    std::thread indexing([&] {
      client::SearchServiceProxy service(daemon.runtimeDirectory());
      for (int batch = 0;
           service.indexItems(mails(fmt::format("b{}x", batch), 20), "test", "default", nullptr);
           ++batch) {
        acknowledged += 20;
      }
    });
    std::thread searching([&] {
      client::SearchServiceProxy service(daemon.runtimeDirectory());
      Outcome error;
      TLQuery query;
      query.setOriginalQuery(u"wo");
      while (!error) static_cast<void>(service.searchItems(query, 0, "default", 50, &error));
    });
    EXPECT_TRUE(daemon.waitForLog("Finished indexItems numDocuments=20"));
    EXPECT_TRUE(daemon.waitForLog("Finished searchItemsForQuery"));
    daemon.signal(GetParam());
    EXPECT_EQ(daemon.wait(), 0);
    indexing.join();
    searching.join();
    const std::string log = daemon.log();
    for (const char* line : {"Received signal", "Starting shutdown...", "Indexer has shut down",
                             "SearchService has shut down", "Stopping main run loop."}) {
      EXPECT_NE(log.find(line), std::string::npos) << line;
    }
  }
  EXPECT_GT(acknowledged, 0);
  const DaemonProcess again(directory.path());
  client::SearchServiceProxy service(again.runtimeDirectory());
  TLQuery query;
  query.setOriginalQuery(u"word");
  query.setSearchParams(TLParamsManager::paramsFromString(u"salt.maxTopK=1000000"));
  const auto items =
      service.searchItems(query, 0, "default", client::SearchServiceProxy::kNoMaximum, nullptr);
  ASSERT_TRUE(items);
  EXPECT_GE(static_cast<int>(items->size()), 50 + acknowledged);
}

INSTANTIATE_TEST_SUITE_P(Signals, EndingSignal, testing::Values(SIGHUP, SIGINT, SIGPIPE, SIGTERM));

TEST_F(DaemonProcessTest, TheCommandLineNeverStartsADaemon) {
  const auto run = [this](const std::string& arguments) {
    const std::string command =
        fmt::format("{} {} >{}/out 2>&1", TALLOW_DAEMON_PROGRAM, arguments, directory.path());
    const int status = std::system(command.c_str());
    return std::pair(WEXITSTATUS(status),
                     platform::readFile(directory / "out", 4096, nullptr).value_or(""));
  };
  EXPECT_THAT(run("--help"), testing::Pair(0, testing::HasSubstr("Usage: tallowsearchd")));
  EXPECT_THAT(run("--version"), testing::Pair(0, testing::StartsWith("tallowsearchd ")));
  EXPECT_THAT(run("--verison"), testing::Pair(2, testing::HasSubstr("--verison")));
  EXPECT_THAT(run("--help more"), testing::Pair(2, testing::HasSubstr("argument: more")));
}

TEST_F(DaemonProcessTest, AllOperationsWorkOverTheSockets) {
  DaemonProcess daemon(directory.path());
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  client::DebugServiceProxy debug(daemon.runtimeDirectory());
  const std::vector<EncodedItem> items{mail("a", "Lunch"), mail("b", "Lunch")};
  ASSERT_TRUE(service.indexItems(items, {}, "state", "client", "default", nullptr));
  EXPECT_EQ(service.fetchLastClientState("client", "default", nullptr), "state");
  EXPECT_EQ(service.fetchLastClientState("other", "default", nullptr), std::nullopt);
  EXPECT_EQ(search(service, "lun"), 2);
  const std::vector<std::string> gone{"a"};
  EXPECT_TRUE(service.deleteItemsWithIdentifiers(gone, "client", "default", nullptr));
  EXPECT_EQ(search(service, "lun"), 1);
  EXPECT_TRUE(service.deleteItemsWithDomainIdentifiers(gone, "client", "default", nullptr));
  EXPECT_EQ(debug.fetchStatsForIndexer("n", "default", nullptr)->size(), 18u);
  EXPECT_NE(debug.fetchStatsForSalt("n", "default", nullptr)->find("---- Docs: 1\n"),
            std::string::npos);
  EXPECT_TRUE(debug.forceVacuumAndCompact("default", nullptr));
  EXPECT_TRUE(service.deleteAllItems("client", "default", nullptr));
  EXPECT_EQ(search(service, "lun"), 0);
  EXPECT_THAT(*debug.ping("hello", nullptr),
              testing::AllOf(testing::StartsWith("Received hello\nCmd: "),
                             testing::HasSubstr(
                                 "Persistent path: " + directory / "state/TallowSearch" + "\n")));
  daemon.signal(SIGUSR1);
  EXPECT_TRUE(
      daemon.waitForLog("default index stats: {\"DocStoreNumItems\":0,\"SaltNumItems\":0}"));
}

TEST_F(DaemonProcessTest, RefusesInvalidBytesNamingArgumentAndIndex) {
  const DaemonProcess daemon(directory.path());
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  Outcome error;
  const std::vector<EncodedItem> items{mail("a", "fine"), {"bad", std::string("\x0A\x7F", 2)}};
  EXPECT_FALSE(service.indexItems(items, "test", "default", &error));
  EXPECT_NE(error->message.find("argument 0 (items), index 1"), std::string::npos)
      << error->message;
  EXPECT_EQ(search(service, "fine"), 0);
  const std::vector<EncodedItem> nameless{mail("b", "fine"), mail("", "fine")};
  EXPECT_FALSE(service.indexItems(nameless, "test", "default", &error));
  EXPECT_EQ(*error, (TLError{"TALIndexer", 1, "document has no identifier"}));
  EXPECT_EQ(search(service, "fine"), 0);
  const std::string name = rpc::kSearchServiceName;
  testsupport::RawBody body;
  body.bytes("\x0A\x7F").number64(0).text("default").number64(1);
  const std::string call = testsupport::rawCall(rpc::objectPath(name), name, "SearchItemsForQuery",
                                                "aytsx", body.content());
  EXPECT_THAT(testsupport::answerTo(call, daemon.socketOf(name)),
              testing::HasSubstr("argument 0 (query): the bytes are no TLQuery"));
  EXPECT_EQ(search(service, "fine"), 0);
}

TEST_F(DaemonProcessTest, HandlesUnusualItemsAndQueries) {
  const DaemonProcess daemon(directory.path());
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  const auto odd = [](const std::string& identifier, const std::string& marker) {
    auto item = std::make_unique<TLIndexableItem>();
    item->setIdentifier(platform::fromUTF8(identifier));
    item->addAttributeWithKeyStringValue(TLAttributeKey::X_FROM, platform::fromUTF8(marker));
    return item;
  };
  const auto html = odd("html", "odd");
  html->addAttributeWithKeyBytesValue(TLAttributeKey::HTML_CONTENT_DATA,
                                      std::string(10 << 20, '<'));
  const auto separators = odd("separators", "odd");
  separators->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, TLString(1000, u'-'));
  const auto unknown = odd("unknown", "odd");
  unknown->addAttributeWithKeyStringValue(static_cast<TLAttributeKey>(9999), u"nowhere");
  unknown->addAttributeWithKeyStringValue(static_cast<TLAttributeKey>(-5), u"nowhere");
  const auto surrogates = odd("surrogates", "odd");
  surrogates->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT,
                                             TLString(3, char16_t(0xD800)));
  EncodedItem invalid = client::encode(*odd("invalid", "odd"));
  invalid.bytes +=
      std::string("\x0A\x06\x08\x0D\x1A\x02\xFF\xC0", 8);  // a subject of invalid UTF-8
  const std::vector<EncodedItem> items{client::encode(*html), client::encode(*separators),
                                       client::encode(*unknown), client::encode(*surrogates),
                                       invalid};
  Outcome error;
  EXPECT_TRUE(service.indexItems(items, "test", "default", &error)) << platform::printable(error);
  EXPECT_EQ(search(service, "odd"), 5);
  EXPECT_EQ(search(service, "nowhere"), 0);
  EXPECT_EQ(search(service, "?!"), 3);
  const std::vector<EncodedItem> large{mail("large", "odd", std::string(300000, 'x'))};
  EXPECT_FALSE(service.indexItems(large, "test", "default", &error));
  EXPECT_EQ(*error, (TLError{"TALIndexer", 1, "index failed"}));

  TLQuery query;
  query.setOriginalQuery(u"odd");
  query.setSearchParams(std::make_shared<TLParameters>());
  for (const char16_t* key : {u"salt.maxTopK", u"zoneScore.Subject", u"nosuch", u""}) {
    auto wrong = std::make_shared<TLParamKeyValue>();
    wrong->setKey(key);
    wrong->setBoolValue(true);
    query.searchParams()->addKeyvalue(wrong);
  }
  EXPECT_TRUE(service.searchItems(query, ~uint64_t{0}, "default", -1, &error));
  EXPECT_EQ(search(service, "odd"), 5);
}

TEST_F(DaemonProcessTest, ClassesAreSeparateAndFollowTheLock) {
  DaemonProcess daemon(directory.path());
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  const std::vector<EncodedItem> items{mail("a", "word")};
  ASSERT_TRUE(service.indexItems(items, "test", SysFileProtectionComplete, nullptr));
  EXPECT_EQ(search(service, "word", "other"), 0);
  ASSERT_TRUE(platform::writeFileAtomically(daemon.socketOf("lock_status"), "1 1", nullptr));
  ASSERT_TRUE(daemon.waitForLog("Device locked with state: 1"));
  EXPECT_EQ(search(service, "word", SysFileProtectionComplete), -2);
  Outcome error;
  EXPECT_FALSE(service.indexItems(items, "test", SysFileProtectionComplete, &error));
  EXPECT_EQ(*error, (TLError{"com.quill.tallow.TALIndexerManager", -2, "Indexer unavailable."}));
  EXPECT_EQ(search(service, "word", "other"), 0);
  ASSERT_TRUE(platform::writeFileAtomically(daemon.socketOf("lock_status"), "0 1", nullptr));
  ASSERT_TRUE(daemon.waitForLog("Device unlocked with state: 0"));
  EXPECT_EQ(search(service, "word", SysFileProtectionComplete), 1);
  EXPECT_EQ(platform::listDirectory(directory / "state/TallowSearch", nullptr)->size(), 2u);
}

TEST_F(DaemonProcessTest, BeforeTheFirstUnlockAllClassesAreRefused) {
  ASSERT_TRUE(platform::createDirectories(directory / "run", nullptr));
  ASSERT_TRUE(platform::writeFileAtomically(directory / "run/lock_status", "1 0", nullptr));
  const DaemonProcess daemon(directory.path());
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  EXPECT_EQ(search(service, "word", "any"), -2);
  EXPECT_TRUE(platform::listDirectory(directory / "state/TallowSearch", nullptr)->empty());
}

TEST_F(DaemonProcessTest, ASecondDaemonEndsWithAMessage) {
  const DaemonProcess first(directory.path());
  ASSERT_TRUE(first.ready());
  DaemonProcess second(directory.path());
  EXPECT_FALSE(second.ready());
  EXPECT_EQ(second.wait(), 1);
  EXPECT_NE(second.log().find("tallowsearchd.lock is held by a running daemon"), std::string::npos);
  client::DebugServiceProxy debug(first.runtimeDirectory());
  EXPECT_TRUE(debug.ping("x", nullptr));
}

TEST_F(DaemonProcessTest, InterfacesMatchTheirDescriptions) {
  const DaemonProcess daemon(directory.path());
  for (const std::string name : {rpc::kSearchServiceName, rpc::kDebugServiceName}) {
    const auto file =
        platform::readFile(std::string(TALLOW_INTERFACES) + "/" + name + ".xml", 1 << 20, nullptr);
    ASSERT_TRUE(file) << name;
    const auto expected = methods(*file, name);
    EXPECT_GE(expected.size(), 4u);
    const std::string served = introspect(daemon.socketOf(name), rpc::objectPath(name));
    EXPECT_EQ(methods(served, name), expected);
    const auto beside = methods(*file, rpc::kSearchExplanationName);
    EXPECT_EQ(beside.size(), name == rpc::kSearchServiceName ? 1u : 0u);
    EXPECT_EQ(methods(served, rpc::kSearchExplanationName), beside);
  }
}
