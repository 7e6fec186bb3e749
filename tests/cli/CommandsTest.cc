#include "tests/cli/CommandsTest.h"

#include "cli/Identifier.h"

using testing::ElementsAre;

TEST_F(CommandsTest, IndexNamesTheItemsThatTheDaemonRefuses) {
  const testsupport::TemporaryDirectory mail;
  for (const std::string name : {"a", "b", "poison", "c"}) {
    mail.write(name + ".eml", "Subject: " + name + "\n\ntext\n");
  }
  daemon.refuseItemsWith("poison", {"TALIndexer", 1, "index failed"});
  EXPECT_EQ(outputOf({"index", mail.path()}, failure),
            "3 messages indexed, 1 refused by the daemon\n");
  EXPECT_THAT(errors,
              HasSubstr("poison.eml: the daemon could not put the message into the index\n"));
  EXPECT_EQ(daemon.indexedItems().size(), 3u);
  EXPECT_EQ(daemon.calls().size(), 5u);
}

TEST_F(CommandsTest, IndexStopsAtAnErrorThatConcernsAll) {
  const testsupport::TemporaryDirectory mail;
  mail.write("a.eml", "Subject: a\n\n");
  daemon.failOnce("IndexItems", {"com.quill.tallow.TALIndexerManager", -2, "Indexer unavailable."});
  EXPECT_THAT(errorsOf({"index", mail.path()}),
              HasSubstr("the index of this class cannot be opened now"));
  EXPECT_EQ(run({"index", mail.path()}), done);
  mail.write("b.eml", "\n\nno header");
  mail.write("notes", "no mail");
  EXPECT_EQ(outputOf({"index", mail.path(), mail / "none", mail / "notes"}, failure),
            "1 messages indexed, 1 unreadable, 2 paths not read, 1 other files ignored\n");
  const testsupport::TemporaryDirectory empty;
  EXPECT_EQ(jsonOf({"index", empty.path()}, nothingFound)["indexed"], 0);
}

TEST_F(CommandsTest, DeleteContinuesAfterAFailure) {
  daemon.failOnce("DeleteItemsWithIdentifiers", {"DocStore", 5, "unknown"});
  EXPECT_EQ(outputOf({"delete", "file/a", "file/b"}, failure), "deleted file/b\n");
  EXPECT_THAT(errors, HasSubstr("tallow: file/a: the daemon's store failed: unknown\n"));
  EXPECT_THAT(daemon.calls(), ElementsAre("DeleteItemsWithIdentifiers([file/a], tallow, default)",
                                          "DeleteItemsWithIdentifiers([file/b], tallow, default)"));
}

// The client searches for the folders first, because the daemon deletes folders only by exact name.
TEST_F(CommandsTest, DeleteTakesPathsAndFolders) {
  const std::string folder = home / "Mail dir";
  const std::string mail = home.write("Mail dir/cur/1.a:2,S", "Subject: s\n\n");
  daemon.failOnce("DeleteItemsWithIdentifiers", {"DocStore", 12, "no document with URL tlw://x"});
  EXPECT_EQ(errorsOf({"delete", mail}, nothingFound), "tallow: " + mail + ": not in the index\n");
  EXPECT_EQ(run({"delete", mail}), done);
  const std::string identifier = cli::fileIdentifier(folder + "/cur/1.a");
  EXPECT_EQ(daemon.calls().back(),
            "DeleteItemsWithIdentifiers([" + identifier + "], tallow, default)");
  std::vector<std::shared_ptr<TLIndexableItem>> items;
  for (const char* const place : {"", "/.Old", "2", "/.Old"}) {
    items.push_back(result("file/x"));
    items.back()->setDomainIdentifier(platform::fromUTF8(cli::percentEncodePath(folder + place)));
  }
  answerWith(items);
  EXPECT_EQ(jsonOf({"delete", folder + '/'})[0]["messages"], 3);
  const std::string encoded = cli::percentEncodePath(folder);
  EXPECT_EQ(daemon.calls().back(), "DeleteItemsWithDomainIdentifiers([" + encoded + ", " + encoded +
                                       "/.Old], tallow, default)");
}

TEST_F(CommandsTest, ResetWithoutATerminalNeedsYes) {
  EXPECT_THAT(errorsOf({"reset"}), HasSubstr("--yes"));
  EXPECT_TRUE(daemon.calls().empty());
  EXPECT_EQ(run({"reset", "--yes"}), done);
  EXPECT_THAT(daemon.calls(), ElementsAre("DeleteAllItems(tallow, default)"));
}

TEST_F(CommandsTest, Diagnostics) {
  daemon.answer("FetchStatsForIndexer", [](rpc::Reply& reply) {
    reply.send({rpc::Dictionary{{"Count", int64_t{3}}, {"Seconds", 0.5}}});
  });
  EXPECT_THAT(outputOf({"stats"}), testing::MatchesRegex("Count +3\nSeconds +0.5\n"));
  EXPECT_EQ(jsonOf({"stats"}), nlohmann::json::parse(R"({"Count":3,"Seconds":0.5})"));
  daemon.answer("FetchStatsForIndexer", [](rpc::Reply& reply) {
    reply.send({rpc::Dictionary{{"TLDebugServiceDocStoreNumOfItems", int64_t{30}},
                                {"TLDebugServiceTextStoreNumOfItems", uint64_t{28}}}});
  });
  EXPECT_THAT(outputOf({"stats"}), HasSubstr("2 stored and not searchable"));
  EXPECT_EQ(outputOf({"metrics"}), "metrics\n");
  EXPECT_EQ(outputOf({"ping", "hello"}), "pong\n");
  EXPECT_EQ(outputOf({"vacuum", "--class", "c"}), "The index has been compacted.\n");
  EXPECT_EQ(daemon.calls().back(), "ForceVacuumAndCompact(c)");
  EXPECT_EQ(jsonOf({"vacuum"}), nlohmann::json({{"vacuum", true}}));
  daemon.failOnce("ForceVacuumAndCompact", {"TALIndexer", 4, "shutting down"});
  EXPECT_EQ(errorsOf({"vacuum"}), "tallow: the daemon is about to end; try again in a moment\n");
}

TEST_F(CommandsTest, State) {
  EXPECT_EQ(run({"state", "--name", "phone"}), nothingFound);
  EXPECT_EQ(daemon.calls().back(), "FetchLastClientState(phone, default)");
  std::string bytes = "v1";
  daemon.answer("FetchLastClientState", [&](rpc::Reply& reply) {
    reply.send({true, rpc::Bytes{bytes}});
  });
  EXPECT_EQ(outputOf({"state"}), "7631\nv1\n");
  bytes = std::string("\0\xFF", 2);
  EXPECT_EQ(outputOf({"state"}), "00ff\n");
  EXPECT_EQ(jsonOf({"state"})["hex"], "00ff");
}

TEST_F(CommandsTest, ExitStatusOfIncorrectUsageAndOfAnAbsentDaemon) {
  const std::pair<Arguments, std::string> kReasons[] = {
      {{"search"}, "a search is for WORDS, or for the expression of --query\n"},
      {{"index"}, "PATH is required\nRun `tallow help index` for"},
      {{"--format=files", "stats"}, "are for search only\n"},
      {{"--limit=-1", "search", "x"}, "\"-1\" is not a whole number from 0 on\n"},
      {{"--color=blue", "ping"}, "\"blue\" is not one of always, auto, never\n"},
      {{"--no-such-option", "ping"}, "there is no option --no-such-option\n"},
      {{"serach", "x"}, "did you mean search?"},
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
    EXPECT_THAT(errorsOf(arguments), HasSubstr(reason));
    EXPECT_THAT(errors, testing::StartsWith("tallow: "));
    EXPECT_EQ(output, "");
  }
  EXPECT_THAT(errorsOf({"frobnicate"}), Not(HasSubstr("did you mean")));
  EXPECT_EQ(run({"--help"}), done);
  EXPECT_EQ(run({"--version"}), done);
  const std::string help = outputOf({"search", "--help"});
  EXPECT_EQ(outputOf({"help", "search"}), help);
  EXPECT_TRUE(daemon.calls().empty());
  daemon.stop();
  const Arguments commands[] = {
      {"ping"},  {"stats"},       {"metrics"},     {"vacuum"},
      {"state"}, {"search", "x"}, {"delete", "x"}, {"index", TALLOW_SAMPLE_MAIL}};
  for (const Arguments& command : commands) {
    EXPECT_THAT(errorsOf(command, unreachable),
                HasSubstr("systemctl --user start tallowsearchd.socket"));
  }
}

// The catalogue's part is shown with and without a running daemon.
TEST_F(CommandsTest, SyncAndStatus) {
  const std::string mail = home / "mail";
  home.write("mail/cur/1:2,S", "Subject: a\n\nb\n");
  home.write("mail/cur/2:2,", "\n");
  EXPECT_THAT(outputOf({"status"}), HasSubstr("No mailbox is kept in step"));
  EXPECT_THAT(outputOf({"sync", mail, "-n", "-v"}), HasSubstr("send file" + mail + "/cur/1\n"));
  EXPECT_THAT(daemon.indexedItems(), testing::IsEmpty());
  // One message is empty; all others are indexed.
  EXPECT_EQ(outputOf({"sync", mail}, failure), "1 added, 1 failed\n");
  EXPECT_EQ(daemon.indexedItems().size(), 1U);
  EXPECT_THAT(outputOf({"status"}), HasSubstr("       1 of        2  " + mail + ", 1 failed\n"));
  EXPECT_THAT(output, HasSubstr("/cur/2:2,: the message is empty\n"));
  const auto json = jsonOf({"status"})["classes"][0];
  EXPECT_EQ(json["mailboxes"]["folders"][0]["indexed"], 1);
  EXPECT_EQ(json["mailboxes"]["roots"][0], mail);
  daemon.stop();
  EXPECT_THAT(outputOf({"status"}, unreachable), HasSubstr(mail + ", 1 failed\n"));
  EXPECT_EQ(run({"sync"}), unreachable);
}

TEST_F(CommandsTest, SyncTakesTheSettings) {
  for (const std::string folder : {"in", "work", "old"}) {
    home.write("mail/" + folder + "/cur/1", "Subject: " + folder + "\n\nb\n");
  }
  home.write("mail/in/cur/2", "Subject: large\n\n" + std::string(2000, 'x'));
  constexpr const char* kSettings = "XDG_CONFIG_HOME/tallow/config.toml";
  home.write(kSettings, "roots = ['" + (home / "mail") +
                            "']\nexclude = ['old']\nlargest_mail = 1500\n[class]\n'" +
                            (home / "mail/work") + "' = 'work'\n");
  EXPECT_EQ(outputOf({"sync"}, failure), "default: 1 added, 1 failed\nwork: 1 added\n");
  EXPECT_THAT(errors, HasSubstr("larger than the limit of 1500 bytes"));
  EXPECT_EQ(jsonOf({"sync", "--class=work"})["class"], "work");
  EXPECT_THAT(errorsOf({"sync", home / "mail/work", "--class=default"}),
              HasSubstr("has the class work"));
  home.write(kSettings, "\nroot = []");
  EXPECT_THAT(errorsOf({"watch"}),
              HasSubstr("config.toml:2: there is no key \"root\"; did you mean \"roots\"?"));
}
