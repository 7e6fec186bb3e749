#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "cli/Identifier.h"
#include "platform/Files.h"
#include "querylang/TLQueryAdditions.h"
#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"
#include "tests/client/FakeDaemon.h"

using cli::ExitStatus;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::internal::CaptureStderr;
using testing::internal::CaptureStdout;
using testing::internal::GetCapturedStderr;
using testing::internal::GetCapturedStdout;

namespace {

class CommandsTest : public testing::Test {
 protected:
  // The client's user files go into a directory of the test.
  CommandsTest() {
    for (const char* const name : {"XDG_STATE_HOME", "XDG_RUNTIME_DIR", "XDG_CONFIG_HOME"}) {
      setenv(name, (home / name).c_str(), 1);
    }
    setenv("TALLOW_SESSION", "test", 1);
  }

  // Runs the program with the arguments and captures its output.
  ExitStatus run(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), {"tallow", "--runtime-dir", daemon.runtimeDirectory()});
    std::vector<const char*> argv;
    for (const std::string& argument : arguments) argv.push_back(argument.c_str());
    CaptureStdout();
    CaptureStderr();
    ExitStatus status = ExitStatus::failure;
    const auto options = cli::parseCommandLine(static_cast<int>(argv.size()), argv.data(), status);
    if (options) status = cli::runCommand(*options);
    output = GetCapturedStdout();
    errors = GetCapturedStderr();
    return status;
  }

  void answerWith(std::vector<std::shared_ptr<TLIndexableItem>> items) {
    rpc::BytesArray bytes;
    for (const auto& item : items) bytes.push_back(item->data());
    daemon.answer("SearchItemsForQuery", [bytes](rpc::Reply& reply) { reply.send({bytes}); });
  }

  // The query of the last search that reached the daemon.
  [[nodiscard]] std::shared_ptr<TLQuery> lastQuery() const {
    const std::string begin = "SearchItemsForQuery(<";
    const auto calls = daemon.calls();
    const auto last = std::find_if(calls.rbegin(), calls.rend(), [&begin](const std::string& one) {
      return one.starts_with(begin);
    });
    EXPECT_NE(last, calls.rend());
    const std::string call = last == calls.rend() ? begin : *last;
    auto query = std::make_shared<TLQuery>();
    EXPECT_TRUE(query->initWithData(call.substr(begin.size(), call.rfind(">, ") - begin.size())));
    return query;
  }
  static std::string printed(const TLQuery& query) {
    return platform::toUTF8(*query.originalQuery()) +
           TLQueryAdditions::_stringifyQueryTree(query.root().get(), 0, true);
  }

  static std::shared_ptr<TLIndexableItem> result(const char* identifier) {
    auto item = std::make_shared<TLIndexableItem>();
    item->setIdentifier(platform::fromUTF8(identifier));
    item->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, u"Invoice \x1b[31m\u202E");
    item->addAttributeWithKeyStringValue(TLAttributeKey::CONTENT_SNIPPET, u"your invoice\u2008due");
    item->addAttributeWithKeyDoubleValue(TLAttributeKey::MAIL_DATE_RECEIVED, 1704700800);
    item->addPersonsWithKey(TLAttributeKey::AUTHORS, {u"billing@example.org"});
    auto card = std::make_shared<TLCard>();
    card->setTextScore(1.5F);
    card->setLightScore(0.75F);
    card->setFreshness(0.5);
    item->setCard(card);
    return item;
  }

  const testsupport::TemporaryDirectory home;
  testsupport::FakeDaemon daemon;
  std::string output;
  std::string errors;
};

}  // namespace

// The typed text is sent without conditions, whatever it contains.
TEST_F(CommandsTest, WordsBecomeFreeTextAgain) {
  const std::vector<std::pair<std::vector<std::string>, TLString>> cases{
      {{"invoice", "li"}, u"invoice li"},
      {{"invoice "}, u"invoice "},
      {{"--", "--limit"}, u"--limit"},
      {{"it's", "a\\b", "\\"}, u"it's a\\b \\"},
      {{"bread or", "not", "f(x)", "- e-mail 10:30"}, u"bread or not f(x) - e-mail 10:30"},
      {{"*", "**a*"}, u"* **a*"},
      {{"*"}, u"*"},
      {{"true"}, u"true"},
      {{"') || a == 'b", "&&", "$time.now"}, u"') || a == 'b && $time.now"},
      {{"京都\t\n"}, u"\u4EAC\u90FD\t\n"},
      {{"caf\xE9"}, u"caf\uFFFD"},
      {{""}, u""},
  };
  for (const auto& [words, text] : cases) {
    std::vector<std::string> arguments{"search"};
    arguments.insert(arguments.end(), words.begin(), words.end());
    EXPECT_EQ(run(arguments), ExitStatus::nothingFound);
    EXPECT_EQ(errors, "tallow: no match\n");
    const auto sent = lastQuery();
    EXPECT_EQ(sent->originalQuery(), text);
    EXPECT_FALSE(sent->hasRoot() || sent->hasSearchParams());
    EXPECT_TRUE(sent->rawQuery()->starts_with(u"(kTLItemSubject == \"*"));
  }
  EXPECT_EQ(run({"search", "--limit", "0", "--class=work", "x"}), ExitStatus::nothingFound);
  EXPECT_THAT(daemon.calls().back(), testing::EndsWith(", 0, work, 9223372036854775807)"));
}

// Each alternative is a separate search; its exclusions are searched for only if it has results.
TEST_F(CommandsTest, OperatorsBecomeSeveralSearches) {
  const size_t before = daemon.calls().size();
  EXPECT_EQ(run({"search", "tea", "-milk", "OR", "from:tom"}), ExitStatus::nothingFound);
  EXPECT_EQ(daemon.calls().size(), before + 2);
  EXPECT_EQ(
      printed(*lastQuery()),
      "\nAND, \n\tOR, \n\t\tLEAF, STRING_EQUAL, AUTHORS, AUTHOR_EMAIL_ADDRESSES, X_FROM, tom");
  EXPECT_EQ(lastQuery()->searchParams()->intValueForKey("salt.maxTopK"), 1000);
  answerWith({result("file/m/a.eml")});
  EXPECT_EQ(run({"search", "tea", "-milk", "-sugar", "date:2024"}), ExitStatus::nothingFound);
  EXPECT_EQ(daemon.calls().size(), before + 5);
  EXPECT_EQ(run({"search", "tea", "date:2024"}), ExitStatus::done);
  EXPECT_EQ(errors, "");
  EXPECT_EQ(run({"search", "tea", "date:2023"}), ExitStatus::nothingFound);
  EXPECT_EQ(run({"search", "\"open", "is:blue", "date:2024"}), ExitStatus::done);
  EXPECT_EQ(errors,
            "tallow: the quote is not closed, so what follows it is taken as words\n"
            "tallow: \"blue\" is not read, unread, flagged, replied or junk, so \"is:blue\" is "
            "taken as words\n");
}

TEST_F(CommandsTest, ExpressionsFiltersAndParameters) {
  EXPECT_EQ(run({"search", "--query", "** == \"*a\" && kTLItemAuthors != b"}),
            ExitStatus::nothingFound);
  EXPECT_EQ(printed(*lastQuery()), "a\nLEAF, STRING_NOT_EQUAL, AUTHORS, b");
  EXPECT_EQ(lastQuery()->rawQuery(), u"** == \"*a\" && kTLItemAuthors != b");
  // Each filter is a separate condition.
  EXPECT_EQ(
      run({"search", "x", "--filter", "kTLItemAuthors = a || kTLItemAuthors = b", "y",
           "--filter=kTLItemSubject = c", "--param", "salt.maxTopK=5,ranking.freshnessWeight=1"}),
      ExitStatus::nothingFound);
  EXPECT_EQ(errors, "tallow: no match\n");
  EXPECT_EQ(printed(*lastQuery()),
            "x y\nAND, \n\tOR, \n\t\tLEAF, STRING_EQUAL, AUTHORS, a\n\t\tLEAF, STRING_EQUAL, "
            "AUTHORS, b\n\tLEAF, STRING_EQUAL, SUBJECT, c");
  EXPECT_EQ(lastQuery()->searchParams()->intValueForKey("salt.maxTopK"), 5);
  EXPECT_EQ(run({"search", "--query", "kTLItemSubject = a) || b", "--class", "c"}),
            ExitStatus::nothingFound);
  EXPECT_EQ(errors,
            "tallow: the expression ends before \"|| b\", the rest is ignored\ntallow: no match\n");
  EXPECT_EQ(run({"search", "x", "--filter", "none = a"}), ExitStatus::nothingFound);
  EXPECT_THAT(errors, HasSubstr("tallow: there is no attribute none\n"));
}

TEST_F(CommandsTest, InvalidExpressionsAreNotSent) {
  std::string deep;
  for (int i = 0; i < 200; ++i) deep += "kTLItemSubject = a || kTLItemAuthors = b && ";
  const std::vector<std::pair<std::vector<std::string>, std::string>> cases{
      {{"--query", "kTLItemSubject == 'a"}, "the expression cannot be read from \"'a\" on"},
      {{"--query", "kTLItemSubject =="}, "the expression cannot be read from its end on"},
      {{"--query", deep + "true"}, "nests && and || more than 254 deep"},
      {{"x", "--filter", ""}, "the expression cannot be read from its end on"},
      {{"x", "--filter", "true", "--filter", "a > 5"}, "cannot be read from \"5\" on"},
      {{"x", "--filter", deep + "true"}, "nests && and || more than 254 deep"},
      {{"x", "--param", "salt.maxTopK"}, "\"salt.maxTopK\" is no list of parameters"},
      {{"x", "--param", "a=1"}, "\"a=1\" is no list of parameters"},
      {{"x", "--query", "true"}, "a search is for WORDS, or for the expression of --query"},
      {{"--query", "true", "--filter", "true"}, "--filter goes with WORDS"},
  };
  for (const auto& [arguments, message] : cases) {
    for (const char* command : {"search", "explain"}) {
      std::vector<std::string> all{command};
      all.insert(all.end(), arguments.begin(), arguments.end());
      EXPECT_EQ(run(all), ExitStatus::failure) << message;
      EXPECT_THAT(errors, HasSubstr(message));
      EXPECT_EQ(output, "");
    }
  }
  EXPECT_TRUE(daemon.calls().empty());
}

TEST_F(CommandsTest, ExplainShowsEachStep) {
  EXPECT_EQ(run({"explain", "Invo", "li ", "--filter", "kTLItemAuthors = A || false", "--param",
                 "zoneScore.Subject=0.25"}),
            ExitStatus::nothingFound);
  for (const char* text : {
           "query parse tree\n  kTLItemSubject == \"*Invo li *\" || kTLItemTextContent ==",
           "query tree before optimization\n  AND, \n    OR, \n      LEAF, STRING_EQUAL, SUBJECT, "
           "*Invo li *\n",
           "query tree after optimization\n  (nothing)\n",
           "filter parse tree\n  (kTLItemAuthors = A || false)\n",
           "filter tree after optimization\n  LEAF, STRING_EQUAL, AUTHORS, A\n",
           "original query\n  ->Invo li <-\n",
           "terms\n  [\"invo li \" 2] nomatch:0.8 zones:{13:0.25,171:0.5,",
           "  [\"invo \" 1] nomatch:0 zones:",
           "  [\"a\" 1] nomatch:0 zones:{13:0,171:0,104:0,107:1,",
       }) {
    EXPECT_THAT(output, HasSubstr(text));
  }
  EXPECT_EQ(run({"explain", "--format=json", "--query", "** = a && true"}),
            ExitStatus::nothingFound);
  const auto json = nlohmann::json::parse(output);
  EXPECT_EQ(json["steps"]["parseTree"], "** = a && true");
  EXPECT_EQ(json["steps"]["treeBeforeOptimization"]["child"].size(), 2u);
  EXPECT_TRUE(json["steps"]["treeAfterOptimization"].is_null());
  EXPECT_EQ(json["query"]["originalQuery"], "a");
  EXPECT_EQ(json["terms"][0]["tokens"][0], nlohmann::json({{"token", "a"}, {"score", 1.0}}));
  EXPECT_EQ(json["terms"][0]["zones"][0]["name"], "SUBJECT");
  EXPECT_FALSE(json.contains("filterSteps"));
  daemon.failOnce("SearchItemsForQuery", {"TALIndexer", 3, "no terms"});
  EXPECT_EQ(run({"explain", "--query", "false"}), ExitStatus::nothingFound);
  EXPECT_THAT(output, HasSubstr("terms\n  (none)\n"));
  EXPECT_THAT(errors, HasSubstr("nothing in the expression can be looked up"));
  // The steps are shown even without the daemon.
  daemon.stop();
  EXPECT_EQ(run({"explain", "x"}), ExitStatus::unreachable);
  EXPECT_THAT(output, HasSubstr("->x<-"));
}

TEST_F(CommandsTest, ResultsInEveryFormat) {
  setenv("TZ", "UTC", 1);
  answerWith({result("mbox/m/in%20box?offset=7"), result("file/m/a.eml"), result("other:1")});
  EXPECT_EQ(run({"search", "invo"}), ExitStatus::done);
  EXPECT_THAT(output, testing::StartsWith("  1  2024-01-08 08:00  billing@example.org\n"
                                          "     Invoice \uFFFD[31m\n"
                                          "     your invoice due\n"
                                          "     mbox/m/in%20box?offset=7\n"
                                          "  2  2024-01-08 08:00"));
  EXPECT_EQ(run({"--color=always", "search", "invo"}), ExitStatus::done);
  EXPECT_THAT(output, HasSubstr("your \x1b[1;33minvoice\x1b[0m due\n"));
  EXPECT_EQ(run({"--format=files", "search", "invo"}), ExitStatus::done);
  EXPECT_EQ(output, "/m/in box:7\n/m/a.eml\nother:1\n");
  EXPECT_EQ(run({"search", "--format", "json", "invo"}), ExitStatus::done);
  const auto answer = nlohmann::json::parse(output);
  EXPECT_EQ(answer["schema"], 1);
  EXPECT_EQ(answer["total"], 3);
  EXPECT_EQ(answer["complete"], true);
  const auto& json = answer["results"];
  ASSERT_EQ(json.size(), 3u);
  EXPECT_EQ(json[1]["time"], "2024-01-08T08:00:00+00:00");
  EXPECT_EQ(json[1]["rank"], 2);
  EXPECT_EQ(json[1]["subject"], "Invoice \x1b[31m\u202E");
  EXPECT_EQ(json[1]["date"], 1704700800.0);
  EXPECT_EQ(json[1]["from"][0]["emailAddress"], "billing@example.org");
  EXPECT_EQ(output.find('\x1b'), std::string::npos);

  EXPECT_EQ(answer["changed"], nlohmann::json::array());

  daemon.answer("FetchReplacedWords", [](rpc::Reply& reply) {
    reply.send({rpc::TextRows{{"invocie", "inv\x1b", "spelling"}, {"dues", "due", "stem"}}});
  });
  EXPECT_EQ(run({"search", "--format", "json", "invocie dues"}), ExitStatus::done);
  EXPECT_EQ(errors, "tallow: showing results for inv\uFFFD, due...\n");
  EXPECT_EQ(nlohmann::json::parse(output)["changed"][1],
            nlohmann::json::parse(R"({"typed": "dues", "replacement": "due", "reason": "stem"})"));
  daemon.failOnce("FetchReplacedWords", {"X", 1, "an old daemon"});
  EXPECT_EQ(run({"search", "invo"}), ExitStatus::done);
  EXPECT_EQ(errors, "");

  EXPECT_EQ(run({"explain", "invo"}), ExitStatus::done);
  EXPECT_THAT(
      output,
      HasSubstr("   2      1.5000      0.7500     0.5000  2024-01-08 08:00  file/m/a.eml\n"));
  EXPECT_EQ(run({"explain", "--format=json", "invo"}), ExitStatus::done);
  EXPECT_EQ(nlohmann::json::parse(output)["results"][0]["textScore"], 1.5);
}

TEST_F(CommandsTest, CopiesOfAMessageAreOneResult) {
  const testsupport::TemporaryDirectory mail;
  std::vector<std::shared_ptr<TLIndexableItem>> items;
  for (const auto& [name, id] : {std::pair("a", "<1@x>"), {"b", "<2@x>"}, {"c", "<1@x>"}}) {
    const std::string path = mail / (std::string(name) + ".eml");
    platform::writeFileAtomically(path, fmt::format("Message-ID:\n {}\nSubject: s\n\n", id),
                                  nullptr);
    items.push_back(result(cli::fileIdentifier(path).c_str()));
  }
  answerWith(items);
  EXPECT_EQ(run({"search", "--count", "x"}), ExitStatus::done);
  EXPECT_EQ(output, "2\n");
  EXPECT_EQ(run({"search", "--format=message-ids", "--offset=1", "x"}), ExitStatus::done);
  EXPECT_EQ(output, "2@x\n");
  EXPECT_EQ(run({"search", "--format=files", "--print0", "--limit=1", "x"}), ExitStatus::done);
  EXPECT_EQ(output, mail / "a.eml" + '\0' + mail / "c.eml" + '\0');
  EXPECT_EQ(run({"search", "x"}), ExitStatus::done);
  EXPECT_THAT(output, HasSubstr("     also file/"));
  EXPECT_EQ(run({"search", "--format=json", "x", "--offset", "1"}), ExitStatus::done);
  const auto json = nlohmann::json::parse(output);
  EXPECT_EQ(json["total"], 2);
  EXPECT_EQ(json["results"][0]["rank"], 2);
  EXPECT_EQ(json["results"][0]["messageID"], "2@x");
  EXPECT_EQ(json["results"][0]["path"], mail / "b.eml");
  items[1]->addAttributeWithKeyDoubleValue(TLAttributeKey::CONTENT_CREATION_DATE, 1);
  items[1]->attributeForKey(TLAttributeKey::MAIL_DATE_RECEIVED)->setDoubleValue(1704800000);
  answerWith(items);
  EXPECT_EQ(run({"search", "--sort=date", "--format=message-ids", "x"}), ExitStatus::done);
  EXPECT_EQ(output, "2@x\n1@x\n");
  EXPECT_EQ(lastQuery()->searchParams()->intValueForKey("salt.maxTopK"), 1000);
}

// An option value that equals a command name is not taken for the command.
TEST_F(CommandsTest, OptionsMayPrecedeOrFollowTheCommand) {
  const std::vector<std::vector<std::string>> same{
      {"search", "--class=index", "--limit", "3", "--offset=1", "tea", "-milk"},
      {"--class", "index", "--offset", "1", "--limit", "3", "search", "tea", "-milk"},
      {"--limit=3", "search", "tea", "--class", "index", "-milk", "--offset=1"}};
  std::vector<std::string> calls;
  for (const auto& arguments : same) {
    EXPECT_EQ(run(arguments), ExitStatus::nothingFound);
    EXPECT_EQ(errors, "tallow: no match\n");
    calls.push_back(daemon.calls().back());
  }
  EXPECT_THAT(calls[0], HasSubstr(", 0, index, "));
  EXPECT_THAT(calls, testing::Each(calls[0]));
}

TEST_F(CommandsTest, IndexNamesTheItemsThatTheDaemonRefuses) {
  const testsupport::TemporaryDirectory mail;
  for (const char* name : {"a", "b", "poison", "c"}) {
    platform::writeFileAtomically(mail / (std::string(name) + ".eml"),
                                  fmt::format("Subject: {}\n\ntext\n", name), nullptr);
  }
  daemon.refuseItemsWith("poison", {"TALIndexer", 1, "index failed"});
  EXPECT_EQ(run({"index", mail.path()}), ExitStatus::failure);
  EXPECT_EQ(output, "3 messages indexed, 1 refused by the daemon\n");
  EXPECT_THAT(errors,
              HasSubstr("poison.eml: the daemon could not put the message into the index\n"));
  EXPECT_EQ(daemon.indexedItems().size(), 3u);
  EXPECT_EQ(daemon.calls().size(), 5u);
}

TEST_F(CommandsTest, IndexStopsAtAnErrorThatConcernsAll) {
  const testsupport::TemporaryDirectory mail;
  platform::writeFileAtomically(mail / "a.eml", "Subject: a\n\n", nullptr);
  daemon.failOnce("IndexItems", {"com.quill.tallow.TALIndexerManager", -2, "Indexer unavailable."});
  EXPECT_EQ(run({"index", mail.path()}), ExitStatus::failure);
  EXPECT_THAT(errors, HasSubstr("the index of this class cannot be opened now"));
  EXPECT_EQ(run({"index", mail.path()}), ExitStatus::done);
  EXPECT_EQ(run({"index", mail.path(), mail / "none"}), ExitStatus::failure);
  EXPECT_EQ(output, "1 messages indexed, 1 paths not read\n");
  const testsupport::TemporaryDirectory empty;
  EXPECT_EQ(run({"index", "--format=json", empty.path()}), ExitStatus::nothingFound);
  EXPECT_EQ(nlohmann::json::parse(output)["indexed"], 0);
}

TEST_F(CommandsTest, DeleteContinuesAfterAFailure) {
  daemon.failOnce("DeleteItemsWithIdentifiers", {"DocStore", 5, "unknown"});
  EXPECT_EQ(run({"delete", "file/a", "file/b"}), ExitStatus::failure);
  EXPECT_EQ(output, "deleted file/b\n");
  EXPECT_THAT(errors, HasSubstr("tallow: file/a: the daemon's store failed: unknown\n"));
  EXPECT_THAT(daemon.calls(), ElementsAre("DeleteItemsWithIdentifiers([file/a], tallow, default)",
                                          "DeleteItemsWithIdentifiers([file/b], tallow, default)"));
}

// The client searches for the folders first, because the daemon deletes folders only by exact name.
TEST_F(CommandsTest, DeleteTakesPathsAndFolders) {
  const std::string folder = home / "Mail dir";
  std::filesystem::create_directories(folder + "/cur");
  const std::string mail = folder + "/cur/1.a:2,S";
  platform::writeFileAtomically(mail, "Subject: s\n\n", nullptr);
  daemon.failOnce("DeleteItemsWithIdentifiers", {"DocStore", 12, "no document with URL tlw://x"});
  EXPECT_EQ(run({"delete", mail}), ExitStatus::nothingFound);
  EXPECT_EQ(errors, "tallow: " + mail + ": not in the index\n");
  EXPECT_EQ(run({"delete", mail}), ExitStatus::done);
  const std::string identifier = cli::fileIdentifier(folder + "/cur/1.a");
  EXPECT_EQ(daemon.calls().back(),
            "DeleteItemsWithIdentifiers([" + identifier + "], tallow, default)");
  std::vector<std::shared_ptr<TLIndexableItem>> items;
  for (const char* const place : {"", "/.Old", "2", "/.Old"}) {
    items.push_back(result("file/x"));
    items.back()->setDomainIdentifier(platform::fromUTF8(cli::percentEncodePath(folder + place)));
  }
  answerWith(items);
  EXPECT_EQ(run({"delete", folder + '/', "--format=json"}), ExitStatus::done);
  EXPECT_EQ(nlohmann::json::parse(output)[0]["messages"], 3);
  const std::string encoded = cli::percentEncodePath(folder);
  EXPECT_EQ(daemon.calls().back(), "DeleteItemsWithDomainIdentifiers([" + encoded + ", " + encoded +
                                       "/.Old], tallow, default)");
}

TEST_F(CommandsTest, ResetWithoutATerminalNeedsYes) {
  EXPECT_EQ(run({"reset"}), ExitStatus::failure);
  EXPECT_THAT(errors, HasSubstr("--yes"));
  EXPECT_TRUE(daemon.calls().empty());
  EXPECT_EQ(run({"reset", "--yes"}), ExitStatus::done);
  EXPECT_THAT(daemon.calls(), ElementsAre("DeleteAllItems(tallow, default)"));
}

TEST_F(CommandsTest, Diagnostics) {
  daemon.answer("FetchStatsForIndexer", [](rpc::Reply& reply) {
    reply.send({rpc::Dictionary{{"Count", int64_t{3}}, {"Seconds", 0.5}}});
  });
  EXPECT_EQ(run({"stats"}), ExitStatus::done);
  EXPECT_THAT(output, testing::MatchesRegex("Count +3\nSeconds +0.5\n"));
  EXPECT_EQ(run({"stats", "--format=json"}), ExitStatus::done);
  EXPECT_EQ(nlohmann::json::parse(output), nlohmann::json::parse(R"({"Count":3,"Seconds":0.5})"));
  daemon.answer("FetchStatsForIndexer", [](rpc::Reply& reply) {
    reply.send({rpc::Dictionary{{"TLDebugServiceDocStoreNumOfItems", int64_t{30}},
                                {"TLDebugServiceTextStoreNumOfItems", uint64_t{28}}}});
  });
  EXPECT_EQ(run({"stats"}), ExitStatus::done);
  EXPECT_THAT(output, HasSubstr("2 stored and not searchable"));
  EXPECT_EQ(run({"metrics"}), ExitStatus::done);
  EXPECT_EQ(output, "metrics\n");
  EXPECT_EQ(run({"ping", "hello"}), ExitStatus::done);
  EXPECT_EQ(output, "pong\n");
  EXPECT_EQ(run({"vacuum", "--class", "c"}), ExitStatus::done);
  EXPECT_EQ(daemon.calls().back(), "ForceVacuumAndCompact(c)");
  EXPECT_EQ(output, "The index has been compacted.\n");
  EXPECT_EQ(run({"vacuum", "--format=json"}), ExitStatus::done);
  EXPECT_EQ(nlohmann::json::parse(output), nlohmann::json({{"vacuum", true}}));
  daemon.failOnce("ForceVacuumAndCompact", {"TALIndexer", 4, "shutting down"});
  EXPECT_EQ(run({"vacuum"}), ExitStatus::failure);
  EXPECT_EQ(errors, "tallow: the daemon is about to end; try again in a moment\n");
}

TEST_F(CommandsTest, State) {
  EXPECT_EQ(run({"state", "--name", "phone"}), ExitStatus::nothingFound);
  EXPECT_EQ(daemon.calls().back(), "FetchLastClientState(phone, default)");
  std::string bytes = "v1";
  daemon.answer("FetchLastClientState", [&](rpc::Reply& reply) {
    reply.send({true, rpc::Bytes{bytes}});
  });
  EXPECT_EQ(run({"state"}), ExitStatus::done);
  EXPECT_EQ(output, "7631\nv1\n");
  bytes = std::string("\0\xFF", 2);
  EXPECT_EQ(run({"state"}), ExitStatus::done);
  EXPECT_EQ(output, "00ff\n");
  EXPECT_EQ(run({"state", "--format=json"}), ExitStatus::done);
  EXPECT_EQ(nlohmann::json::parse(output)["hex"], "00ff");
}

TEST_F(CommandsTest, ExitStatusOfIncorrectUsageAndOfAnAbsentDaemon) {
  const std::vector<std::vector<std::string>> kWrong{{},
                                                     {"search"},
                                                     {"index"},
                                                     {"frobnicate"},
                                                     {"ping", "a", "b"},
                                                     {"--format=xml", "ping"},
                                                     {"--format=files", "stats"},
                                                     {"--limit=-1", "search", "x"},
                                                     {"--color=blue", "ping"},
                                                     {"--no-such-option", "ping"}};
  for (const auto& arguments : kWrong) {
    EXPECT_EQ(run(arguments), ExitStatus::failure) << testing::PrintToString(arguments);
    EXPECT_FALSE(errors.empty());
    EXPECT_TRUE(output.empty());
  }
  EXPECT_EQ(run({"serach", "x"}), ExitStatus::failure);
  EXPECT_THAT(errors, HasSubstr("did you mean search?"));
  const std::vector<std::pair<std::vector<std::string>, std::string>> kReasons{
      {{"--format=xml", "ping"}, "\"xml\" is not one of files, json, message-ids, text\n"},
      {{"search", "x", "--sort", "size"}, "\"size\" is not one of date, relevance\n"},
      {{"search", "x", "--limit=2.5"}, "\"2.5\" is not a whole number from 0 on\n"},
      {{"screen", "x"}, "tallow: a screen needs a terminal\n"},
      {{"ping", "--wait=long"}, "\"long\" is not a number from 0 to 3600\n"},
      {{"show", "1", "--attachment=0"}, "\"0\" is not a whole number from 1 on\n"},
      {{"show", "1", "--attachment=1"}, "--attachment N and -o FILE go together\n"},
      {{"ping", "a", "b"}, "tallow: TEXT can be given only once\n"},
      {{"search", "x", "--sort"}, "tallow: --sort needs a value\n"},
      {{}, "tallow: a command is missing\nRun `tallow help` for"},
      {{"search", "x", "--sorted"}, "there is no option --sorted\nRun `tallow help search`"}};
  for (const auto& [arguments, reason] : kReasons) {
    EXPECT_EQ(run(arguments), ExitStatus::failure);
    EXPECT_THAT(errors, HasSubstr(reason));
    EXPECT_THAT(errors, testing::StartsWith("tallow: "));
  }
  EXPECT_EQ(run({"frobnicate"}), ExitStatus::failure);
  EXPECT_THAT(errors, Not(HasSubstr("did you mean")));
  EXPECT_EQ(run({"--help"}), ExitStatus::done);
  EXPECT_EQ(run({"--version"}), ExitStatus::done);
  EXPECT_EQ(run({"search", "--help"}), ExitStatus::done);
  const std::string help = output;
  EXPECT_EQ(run({"help", "search"}), ExitStatus::done);
  EXPECT_EQ(output, help);
  EXPECT_TRUE(daemon.calls().empty());
  daemon.stop();
  for (const char* command : {"ping", "stats", "metrics", "vacuum", "state"}) {
    EXPECT_EQ(run({command}), ExitStatus::unreachable) << command;
  }
  EXPECT_EQ(run({"search", "x"}), ExitStatus::unreachable);
  EXPECT_THAT(errors, HasSubstr("systemctl --user start tallowsearchd.socket"));
  EXPECT_EQ(run({"delete", "x"}), ExitStatus::unreachable);
  EXPECT_EQ(run({"index", TALLOW_SAMPLE_MAIL}), ExitStatus::unreachable);
}

// The catalogue's part is shown with and without a running daemon.
TEST_F(CommandsTest, SyncAndStatus) {
  const std::string mail = home / "mail";
  std::filesystem::create_directories(mail + "/cur");
  std::ofstream(mail + "/cur/1:2,S") << "Subject: a\n\nb\n";
  std::ofstream(mail + "/cur/2:2,") << "\n";
  EXPECT_EQ(run({"status"}), ExitStatus::done);
  EXPECT_THAT(output, HasSubstr("No mailbox is kept in step"));
  EXPECT_EQ(run({"sync", mail, "-n", "-v"}), ExitStatus::done);
  EXPECT_THAT(output, HasSubstr("send file" + mail + "/cur/1\n"));
  EXPECT_THAT(daemon.indexedItems(), testing::IsEmpty());
  // One message is empty; all others are indexed.
  EXPECT_EQ(run({"sync", mail}), ExitStatus::failure);
  EXPECT_EQ(output, "1 added, 1 failed\n");
  EXPECT_EQ(daemon.indexedItems().size(), 1U);
  EXPECT_EQ(run({"status"}), ExitStatus::done);
  EXPECT_THAT(output, HasSubstr("       1 of        2  " + mail + ", 1 failed\n"));
  EXPECT_THAT(output, HasSubstr("/cur/2:2,: the message is empty\n"));
  EXPECT_EQ(run({"status", "--format=json"}), ExitStatus::done);
  const auto json = nlohmann::json::parse(output)["classes"][0];
  EXPECT_EQ(json["mailboxes"]["folders"][0]["indexed"], 1);
  EXPECT_EQ(json["mailboxes"]["roots"][0], mail);
  daemon.stop();
  EXPECT_EQ(run({"status"}), ExitStatus::unreachable);
  EXPECT_THAT(output, HasSubstr(mail + ", 1 failed\n"));
  EXPECT_EQ(run({"sync"}), ExitStatus::unreachable);
}

TEST_F(CommandsTest, SyncTakesTheSettings) {
  setenv("XDG_STATE_HOME", (home / "state").c_str(), 1);
  setenv("XDG_CONFIG_HOME", (home / "config").c_str(), 1);
  for (const char* folder : {"in", "work", "old"}) {
    std::filesystem::create_directories(home / "mail/" + folder + "/cur");
    std::ofstream(home / "mail/" + folder + "/cur/1") << "Subject: " << folder << "\n\nb\n";
  }
  std::ofstream(home / "mail/in/cur/2") << "Subject: large\n\n" << std::string(2000, 'x');
  std::filesystem::create_directories(home / "config/tallow");
  const auto set = [&](const std::string& text) {
    std::ofstream(home / "config/tallow/config.toml") << text;
  };
  set("roots = ['" + (home / "mail") + "']\nexclude = ['old']\nlargest_mail = 1500\n[class]\n'" +
      (home / "mail/work") + "' = 'work'\n");
  EXPECT_EQ(run({"sync"}), ExitStatus::failure);
  EXPECT_EQ(output, "default: 1 added, 1 failed\nwork: 1 added\n");
  EXPECT_THAT(errors, HasSubstr("larger than the limit of 1500 bytes"));
  EXPECT_EQ(run({"sync", "--class=work", "--format=json"}), ExitStatus::done);
  EXPECT_EQ(nlohmann::json::parse(output)["class"], "work");
  EXPECT_EQ(run({"sync", home / "mail/work", "--class=default"}), ExitStatus::failure);
  EXPECT_THAT(errors, HasSubstr("has the class work"));
  set("\nroot = []");
  EXPECT_EQ(run({"watch"}), ExitStatus::failure);
  EXPECT_THAT(errors,
              HasSubstr("config.toml:2: there is no key \"root\"; did you mean \"roots\"?"));
}
