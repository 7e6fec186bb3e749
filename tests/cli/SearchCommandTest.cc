#include <fmt/format.h>

#include "cli/Identifier.h"
#include "tests/cli/CommandsTest.h"

namespace {

std::vector<std::string> with(const std::string& command, std::vector<std::string> arguments) {
  arguments.insert(arguments.begin(), command);
  return arguments;
}

}  // namespace

// The typed text is sent without conditions, whatever it contains.
TEST_F(CommandsTest, WordsBecomeFreeTextAgain) {
  const std::pair<Arguments, TLString> cases[] = {
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
    EXPECT_EQ(errorsOf(with("search", words), nothingFound), "tallow: no match\n");
    const auto sent = lastQuery();
    EXPECT_EQ(sent->originalQuery(), text);
    EXPECT_FALSE(sent->hasRoot() || sent->hasSearchParams());
    EXPECT_TRUE(sent->rawQuery()->starts_with(u"(kTLItemSubject == \"*"));
  }
  EXPECT_EQ(run({"search", "--limit", "0", "--class=work", "x"}), nothingFound);
  EXPECT_THAT(daemon.calls().back(), testing::EndsWith(", 0, work, 9223372036854775807)"));
}

// Each alternative is a separate search; its exclusions are searched for only if it has results.
TEST_F(CommandsTest, OperatorsBecomeSeveralSearches) {
  const size_t before = daemon.calls().size();
  EXPECT_EQ(run({"search", "tea", "-milk", "OR", "from:tom"}), nothingFound);
  EXPECT_EQ(daemon.calls().size(), before + 2);
  EXPECT_EQ(
      printed(*lastQuery()),
      "\nAND, \n\tOR, \n\t\tLEAF, STRING_EQUAL, AUTHORS, AUTHOR_EMAIL_ADDRESSES, X_FROM, tom");
  EXPECT_EQ(lastQuery()->searchParams()->intValueForKey("salt.maxTopK"), 1000);
  answerWith({result("file/m/a.eml")});
  EXPECT_EQ(run({"search", "tea", "-milk", "-sugar", "date:2024"}), nothingFound);
  EXPECT_EQ(daemon.calls().size(), before + 5);
  EXPECT_EQ(errorsOf({"search", "tea", "date:2024"}, done), "");
  EXPECT_EQ(run({"search", "tea", "date:2023"}), nothingFound);
  EXPECT_EQ(errorsOf({"search", "\"open", "is:blue", "date:2024"}, done),
            "tallow: the quote is not closed, so what follows it is taken as words\n"
            "tallow: \"blue\" is not read, unread, flagged, replied or junk, so \"is:blue\" is "
            "taken as words\n");
}

TEST_F(CommandsTest, ExpressionsFiltersAndParameters) {
  EXPECT_EQ(run({"search", "--query", "** == \"*a\" && kTLItemAuthors != b"}), nothingFound);
  EXPECT_EQ(printed(*lastQuery()), "a\nLEAF, STRING_NOT_EQUAL, AUTHORS, b");
  EXPECT_EQ(lastQuery()->rawQuery(), u"** == \"*a\" && kTLItemAuthors != b");
  // Each filter is a separate condition.
  EXPECT_EQ(errorsOf({"search", "x", "--filter", "kTLItemAuthors = a || kTLItemAuthors = b", "y",
                      "--filter=kTLItemSubject = c", "--param",
                      "salt.maxTopK=5,ranking.freshnessWeight=1"},
                     nothingFound),
            "tallow: no match\n");
  EXPECT_EQ(printed(*lastQuery()),
            "x y\nAND, \n\tOR, \n\t\tLEAF, STRING_EQUAL, AUTHORS, a\n\t\tLEAF, STRING_EQUAL, "
            "AUTHORS, b\n\tLEAF, STRING_EQUAL, SUBJECT, c");
  EXPECT_EQ(lastQuery()->searchParams()->intValueForKey("salt.maxTopK"), 5);
  EXPECT_EQ(errorsOf({"search", "--query", "kTLItemSubject = a) || b"}, nothingFound),
            "tallow: the expression ends before \"|| b\", the rest is ignored\ntallow: no match\n");
  EXPECT_THAT(errorsOf({"search", "x", "--filter", "none = a"}, nothingFound),
              HasSubstr("tallow: there is no attribute none\n"));
}

TEST_F(CommandsTest, InvalidExpressionsAreNotSent) {
  std::string deep;
  for (int i = 0; i < 200; ++i) deep += "kTLItemSubject = a || kTLItemAuthors = b && ";
  const std::pair<Arguments, std::string> cases[] = {
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
      EXPECT_THAT(errorsOf(with(command, arguments)), HasSubstr(message));
      EXPECT_EQ(output, "");
    }
  }
  EXPECT_TRUE(daemon.calls().empty());
}

TEST_F(CommandsTest, ExplainShowsEachStep) {
  EXPECT_EQ(run({"explain", "Invo", "li ", "--filter", "kTLItemAuthors = A || false", "--param",
                 "zoneScore.Subject=0.25"}),
            nothingFound);
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
  const auto json = jsonOf({"explain", "--query", "** = a && true"}, nothingFound);
  EXPECT_EQ(json["steps"]["parseTree"], "** = a && true");
  EXPECT_EQ(json["steps"]["treeBeforeOptimization"]["child"].size(), 2u);
  EXPECT_TRUE(json["steps"]["treeAfterOptimization"].is_null());
  EXPECT_EQ(json["query"]["originalQuery"], "a");
  EXPECT_EQ(json["terms"][0]["tokens"][0], nlohmann::json({{"token", "a"}, {"score", 1.0}}));
  EXPECT_EQ(json["terms"][0]["zones"][0]["name"], "SUBJECT");
  EXPECT_FALSE(json.contains("filterSteps"));
  daemon.failOnce("SearchItemsForQuery", {"TALIndexer", 3, "no terms"});
  EXPECT_THAT(outputOf({"explain", "--query", "false"}, nothingFound),
              HasSubstr("terms\n  (none)\n"));
  EXPECT_THAT(errors, HasSubstr("nothing in the expression can be looked up"));
  // The steps are shown even without the daemon.
  daemon.stop();
  EXPECT_THAT(outputOf({"explain", "x"}, unreachable), HasSubstr("->x<-"));
}

TEST_F(CommandsTest, ResultsInEveryFormat) {
  setenv("TZ", "UTC", 1);
  answerWith({result("mbox/m/in%20box?offset=7"), result("file/m/a.eml"), result("other:1")});
  EXPECT_THAT(outputOf({"search", "invo"}),
              testing::StartsWith("  1  2024-01-08 08:00  billing@example.org\n"
                                  "     Invoice \uFFFD[31m\n"
                                  "     your invoice due\n"
                                  "     mbox/m/in%20box?offset=7\n"
                                  "  2  2024-01-08 08:00"));
  EXPECT_THAT(outputOf({"--color=always", "search", "invo"}),
              HasSubstr("your \x1b[1;33minvoice\x1b[0m due\n"));
  EXPECT_EQ(outputOf({"--format=files", "search", "invo"}), "/m/in box:7\n/m/a.eml\nother:1\n");
  const auto answer = jsonOf({"search", "invo"});
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
  EXPECT_EQ(jsonOf({"search", "invocie dues"})["changed"][1],
            nlohmann::json::parse(R"({"typed": "dues", "replacement": "due", "reason": "stem"})"));
  EXPECT_EQ(errors, "tallow: showing results for inv\uFFFD, due...\n");
  daemon.failOnce("FetchReplacedWords", {"X", 1, "an old daemon"});
  EXPECT_EQ(errorsOf({"search", "invo"}, done), "");

  EXPECT_THAT(
      outputOf({"explain", "invo"}),
      HasSubstr("   2      1.5000      0.7500     0.5000  2024-01-08 08:00  file/m/a.eml\n"));
  EXPECT_EQ(jsonOf({"explain", "invo"})["results"][0]["textScore"], 1.5);
}

TEST_F(CommandsTest, CopiesOfAMessageAreOneResult) {
  const testsupport::TemporaryDirectory mail;
  std::vector<std::shared_ptr<TLIndexableItem>> items;
  for (const auto& [name, id] : {std::pair("a", "<1@x>"), {"b", "<2@x>"}, {"c", "<1@x>"}}) {
    const std::string path =
        mail.write(std::string(name) + ".eml", fmt::format("Message-ID:\n {}\nSubject: s\n\n", id));
    items.push_back(result(cli::fileIdentifier(path).c_str()));
  }
  answerWith(items);
  EXPECT_EQ(outputOf({"search", "--count", "x"}), "2\n");
  EXPECT_EQ(outputOf({"search", "--format=message-ids", "--offset=1", "x"}), "2@x\n");
  EXPECT_EQ(outputOf({"search", "--format=files", "--print0", "--limit=1", "x"}),
            mail / "a.eml" + '\0' + mail / "c.eml" + '\0');
  EXPECT_THAT(outputOf({"search", "x"}), HasSubstr("     also file/"));
  const auto json = jsonOf({"search", "x", "--offset", "1"});
  EXPECT_EQ(json["total"], 2);
  EXPECT_EQ(json["results"][0]["rank"], 2);
  EXPECT_EQ(json["results"][0]["messageID"], "2@x");
  EXPECT_EQ(json["results"][0]["path"], mail / "b.eml");
  items[1]->addAttributeWithKeyDoubleValue(TLAttributeKey::CONTENT_CREATION_DATE, 1);
  items[1]->attributeForKey(TLAttributeKey::MAIL_DATE_RECEIVED)->setDoubleValue(1704800000);
  answerWith(items);
  EXPECT_EQ(outputOf({"search", "--sort=date", "--format=message-ids", "x"}), "2@x\n1@x\n");
  EXPECT_EQ(lastQuery()->searchParams()->intValueForKey("salt.maxTopK"), 1000);
}

// An option value that equals a command name is not taken for the command.
TEST_F(CommandsTest, OptionsMayPrecedeOrFollowTheCommand) {
  const Arguments same[] = {
      {"search", "--class=index", "--limit", "3", "--offset=1", "tea", "-milk"},
      {"--class", "index", "--offset", "1", "--limit", "3", "search", "tea", "-milk"},
      {"--limit=3", "search", "tea", "--class", "index", "-milk", "--offset=1"}};
  Arguments calls;
  for (const auto& arguments : same) {
    EXPECT_EQ(errorsOf(arguments, nothingFound), "tallow: no match\n");
    calls.push_back(daemon.calls().back());
  }
  EXPECT_THAT(calls[0], HasSubstr(", 0, index, "));
  EXPECT_THAT(calls, testing::Each(calls[0]));
}
