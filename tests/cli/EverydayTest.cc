#include <fmt/format.h>
#include <gmock/gmock.h>

#include <csignal>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <set>

#include "tests/client/FakeDaemon.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/ShellTest.h"

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::StartsWith;
using IndexTest = testsupport::ShellTest;

// Everyday use of indexed mail, with the program and a real daemon.
namespace {

class EverydayTest : public testsupport::ShellTest {
 protected:
  void SetUp() override {
    ASSERT_TRUE(daemon.ready());
    fs::copy(TALLOW_SAMPLE_MAIL, mail, fs::copy_options::recursive);
    environment = fmt::format(
        "-u PAGER -u STATE_DIRECTORY XDG_RUNTIME_DIR={0}/run XDG_STATE_HOME={0}/state "
        "XDG_CONFIG_HOME={0}/config TALLOW_SESSION=test TZ=UTC",
        directory.path());
    tallow = TALLOW_PROGRAM " --runtime-dir " + daemon.runtimeDirectory();
    ASSERT_EQ(run("index " + mail), 0) << errors;
  }

  [[nodiscard]] nlohmann::json jsonOf(const std::string& arguments) {
    return nlohmann::json::parse(outputOf("--format=json " + arguments));
  }
  [[nodiscard]] int count(const std::string& words) {
    run("search --count " + words);
    return std::atoi(output.c_str());
  }

  const std::string mail = directory / "mail";
  const testsupport::DaemonProcess daemon{directory.path()};
};

}  // namespace

TEST_F(EverydayTest, ShowsWhatTheLastSearchFound) {
  EXPECT_THAT(errorsOf("show 1"), HasSubstr("no search of this terminal is known"));
  EXPECT_THAT(outputOf("search '\"corrected invoice\" ' --offset=1 --limit=1 --sort=date"),
              StartsWith("  2  2024-01-11 10:03  Nordlys Energy\n"));
  EXPECT_THAT(outputOf("--color=always show 2"),
              HasSubstr("\x1b[2mFrom:     \x1b[0mNordlys Energy <"));
  EXPECT_THAT(output, HasSubstr("the \x1b[1;33mcorrected\x1b[0m \x1b[1;33minvoice\x1b[0m 4502"));
  EXPECT_EQ(run("show 1"), 1);
  EXPECT_EQ(run("show 2", "TALLOW_SESSION=other"), 2);
  // A search without results clears the ranks; output for other programs does not change them.
  EXPECT_EQ(run("search --format=files harbour"), 0);
  EXPECT_EQ(run("show 2"), 0);
  EXPECT_EQ(run("search nothingofthekind"), 1);
  EXPECT_EQ(run("show 2"), 1);
  EXPECT_THAT(outputOf("show " + mail + "/archive.mbox:736"),
              HasSubstr("Date:     Tue, 09 Jan 2024"));
  EXPECT_THAT(errorsOf("show " + mail + "/archive.mbox"), HasSubstr("this is a mailbox"));
  EXPECT_EQ(run("show file/gone other:1"), 2);
  EXPECT_EQ(run("show other:1"), 2);
}

TEST_F(EverydayTest, SavesAttachments) {
  write("a.eml",
        "Subject: s\nMIME-Version: 1.0\nContent-Type: image/png; name=\"../../evil.png\"\n\n"
        "\x1b[31m");
  EXPECT_THAT(outputOf("show ./a.eml"), HasSubstr("\n  1  ../../evil.png  image/png, 5 B\n"));
  EXPECT_EQ(run("show ./a.eml --attachment 1 -o b.png"), 0);
  EXPECT_EQ(read("b.png"), "\x1b[31m");
  write("b.png", "old");
  EXPECT_EQ(run("show ./a.eml --attachment 1 -o b.png"), 2);
  EXPECT_EQ(read("b.png"), "old");
  EXPECT_EQ(run("show ./a.eml --attachment 1 -o b.png --force"), 0);
  EXPECT_EQ(read("b.png"), "\x1b[31m");
  // Links are neither followed nor replaced.
  fs::create_symlink(directory / "target", directory / "link");
  for (const char* const wrong : {"1 -o link", "1 -o link --force", "1 -o . --force", "2 -o c"}) {
    EXPECT_EQ(run(std::string("show ./a.eml --attachment ") + wrong), 2) << wrong;
  }
  EXPECT_FALSE(fs::exists(directory / "target"));
  EXPECT_EQ(outputOf("show ./a.eml --attachment 1 -o -"), "\x1b[31m");
  EXPECT_EQ(outputOf("show ./a.eml --raw"), read("a.eml"));
}

TEST_F(EverydayTest, PagesOnATerminal) {
  const std::string shown = "show " + mail + "/archive.mbox:736";
  const auto onTerminal = [&](const std::string& pager) {
    return shell(
        fmt::format("script -qec \"PAGER='{}' " TALLOW_PROGRAM " {}\" typed", pager, shown));
  };
  EXPECT_EQ(onTerminal("sed s/Subject/PAGED/"), 0);
  EXPECT_THAT(output, HasSubstr("PAGED"));
  for (const char* const pager : {"no-such-pager-here", "true", ""}) {
    EXPECT_EQ(onTerminal(pager), 0) << pager;
    EXPECT_EQ(output.find("Subject") == std::string::npos, std::string_view(pager) == "true");
  }
}

TEST_F(EverydayTest, ResultsByConversation) {
  EXPECT_THAT(outputOf("search --threads 'invoice 4471 '"),
              HasSubstr("Re: Your invoice 4471 for December  (4 results: 1 2 3 4)\n"));
  EXPECT_EQ(outputOf("search --threads --count 'invoice 4471 '"), "1\n");
  EXPECT_EQ(run("show 4"), 0);
  const auto json = jsonOf("search --threads --limit 0 e");
  EXPECT_EQ(json["total"], json["threads"].size());
  std::set<int> ranks;
  for (const auto& thread : json["threads"]) {
    EXPECT_TRUE(thread["subject"].is_string());
    for (const auto& result : thread["results"]) ranks.insert(result["rank"].get<int>());
  }
  EXPECT_EQ(static_cast<int>(ranks.size()), count("e"));
  EXPECT_EQ(*ranks.rbegin(), static_cast<int>(ranks.size()));
}

TEST_F(EverydayTest, DeletesFoldersAndFiles) {
  const int family = count("folder:family");
  ASSERT_GT(family, 0);
  EXPECT_EQ(outputOf("delete " + mail + "/family"),
            fmt::format("deleted {}/family: {} messages\n", mail, family));
  EXPECT_EQ(count("folder:family"), 0);
  EXPECT_EQ(run("delete " + mail + "/family"), 1);
  EXPECT_EQ(errors, "tallow: " + mail + "/family: not in the index\n");
  EXPECT_EQ(run("delete " + mail + "/drafts/harvest-toast.eml " + mail + "/none"), 2);
  EXPECT_EQ(run("delete mail"), 0);
  EXPECT_EQ(count("folder:" + mail), 0);
}

// `index` identifies messages by place, `sync` by content.
TEST_F(EverydayTest, DeletesAMessageOfAMailboxByItsPlace) {
  const std::string message = mail + "/archive.mbox:736";
  EXPECT_EQ(run("delete " + message), 0);
  EXPECT_EQ(run("delete " + message), 1);
  EXPECT_EQ(run("sync " + mail), 0);
  EXPECT_EQ(outputOf("delete " + message), "deleted " + message + '\n');
  EXPECT_EQ(run("delete " + message), 1);
}

TEST_F(EverydayTest, SavedSearches) {
  EXPECT_EQ(run("save"), 1);
  EXPECT_EQ(run("save bills subject:invoice -corrected"), 0);
  EXPECT_EQ(run("save @libraries from:library"), 0);
  EXPECT_EQ(outputOf("save"),
            "bills            subject:invoice -corrected\nlibraries        from:library\n");
  EXPECT_EQ(count("@bills"), count("subject:invoice -corrected"));
  EXPECT_EQ(count("@bills OR @libraries"), count("'(subject:invoice -corrected) OR from:library'"));
  EXPECT_EQ(count("invoice -@bills"), count("'invoice -(subject:invoice -corrected)'"));
  EXPECT_THAT(errorsOf("search @nothing"), HasSubstr("there is no saved search \"nothing\""));
  // Lines that are not searches are kept.
  write("config/tallow/searches", "# mine\n\nodd\nbills x\n");
  EXPECT_EQ(run("save bills harbour"), 0);
  EXPECT_EQ(read("config/tallow/searches"), "# mine\n\nodd\nbills harbour\n");
  EXPECT_EQ(run("save --delete bills"), 0);
  EXPECT_EQ(run("save --delete bills"), 1);
  EXPECT_EQ(read("config/tallow/searches"), "# mine\n\nodd\n");
  EXPECT_EQ(run("save 'a b' x"), 2);
}

TEST_F(EverydayTest, CompletesAddresses) {
  EXPECT_THAT(outputOf("address samir"), StartsWith("samir@example.com\tSamir Haddad\t"));
  EXPECT_EQ(run("address --mutt had sam@nowhere"), 1);
  EXPECT_EQ(output, "0 addresses\n");
  const auto list = jsonOf("address -- example.org");
  EXPECT_EQ(list[0]["name"], "Mara Lindqvist");
  for (size_t i = 1; i < list.size(); ++i) EXPECT_LE(list[i]["mails"], list[0]["mails"]);
  EXPECT_EQ(run("address --limit=1 e"), 0);
  EXPECT_EQ(std::count(output.begin(), output.end(), '\n'), 1);
  EXPECT_EQ(run("address @"), 2);
}

TEST_F(EverydayTest, DoesNotCreateAClassWithoutMail) {
  const std::string state = " --state-dir " + directory / "state --class work";
  for (const char* const command : {"search x", "explain x", "address x", "delete x"}) {
    EXPECT_EQ(run(command + state), 1) << command;
    EXPECT_EQ(errors, "tallow: nothing has been indexed for class \"work\" yet\n");
  }
  EXPECT_FALSE(fs::exists(directory / "state/TallowSearch/work"));
  EXPECT_EQ(run("index " + mail + "/drafts" + state), 0);
  EXPECT_EQ(run("search toast" + state), 0);
}

TEST_F(EverydayTest, StatusOfAllClassesAndOfDeletedMail) {
  const std::string state = " --state-dir " + directory / "state";
  EXPECT_EQ(run("index --class work " + mail + "/drafts"), 0);
  const int family = count("folder:family");
  EXPECT_EQ(run("delete " + mail + "/family"), 0);
  const auto classes = [this](const std::string& arguments) {
    return jsonOf("status" + arguments).at("classes");
  };
  const auto all = classes(state);
  ASSERT_EQ(all.size(), 2U);
  EXPECT_EQ(all[0].at("class"), "default");
  EXPECT_EQ(all[0].at("index").at("deleted"), family);
  const double stored = all[0].at("index").at("messages");
  EXPECT_NEAR(all[0].at("index").at("deletedShare"), family / (stored + family), 1e-9);
  EXPECT_EQ(all[1].at("class"), "work");
  EXPECT_EQ(all[1].at("index").at("deleted"), 0);
  EXPECT_GT(all[1].at("files").at("indexBytes"), 0);
  const auto one = classes(state + " --class work");
  ASSERT_EQ(one.size(), 1U);
  EXPECT_EQ(one[0].at("index").at("messages"), all[1].at("index").at("messages"));
  // A class from the settings counts after its first sync; showing the status does not create it.
  write("config/tallow/config.toml",
        fmt::format("roots = ['{0}']\n[class]\n'{0}' = 'private'\n", mail + "/drafts"));
  EXPECT_EQ(classes(state).size(), 2U);
  EXPECT_TRUE(classes(state + " --class private")[0].at("index").is_null());
  EXPECT_FALSE(fs::exists(directory / "state/TallowSearch/private"));
  EXPECT_EQ(run("sync"), 0) << errors;
  EXPECT_EQ(classes(state).size(), 3U);
}

TEST_F(EverydayTest, LinksTheResultsForMailPrograms) {
  const std::string place = directory / "folders/found";
  const std::string search = "search --maildir=" + place + ' ';
  const auto targets = [&] {
    std::vector<std::string> found;
    for (const char* const part : {"cur", "new"}) {
      for (const auto& entry : fs::directory_iterator(place + '/' + part)) {
        found.push_back(fs::read_symlink(entry.path()).string() + " " +
                        entry.path().extension().string());
      }
    }
    return found;
  };
  EXPECT_EQ(outputOf(search + "folder:family"), "10 messages in " + place + '\n');
  EXPECT_THAT(targets(),
              testing::IsSupersetOf({mail + "/family/cur/1707297540.M002.harbour:2,RS .tallow:2,RS",
                                     mail + "/family/new/1707831480.M009.harbour .tallow"}));
  // Of a mailbox there are copies; those of compressed mail are not compressed.
  ASSERT_EQ(shell("gzip mail/drafts/harvest-toast.eml"), 0);
  ASSERT_EQ(run("index " + mail), 0);
  fs::remove(mail + "/family/new/1707831480.M009.harbour");
  const auto counts = jsonOf(search + "invoice OR toast OR folder:family");
  EXPECT_EQ(counts["maildir"], place);
  EXPECT_EQ(counts["linked"], 9);
  EXPECT_EQ(counts["leftOut"], 2);  // the one that was removed, and the one that was compressed
  EXPECT_THAT(outputOfShell("cat " + place + "/.tallow-folder/*"),
              StartsWith("X-Tallow-Copy-Of: "));
  EXPECT_THAT(output, HasSubstr("X-Tallow-Copy-Of: mbox" + mail +
                                "/archive.mbox?offset=0\nReceived: from"));
  EXPECT_THAT(output, HasSubstr("harvest-toast.eml.gz\nFrom: "));
  // The folder is not mail, whoever looks into it.
  EXPECT_EQ(jsonOf("sync " + directory / "folders")["toSend"], 0);
  EXPECT_EQ(run("index " + place), 2);
  // Each search takes the links of the one before; one that fails takes nothing.
  EXPECT_EQ(run(search + "--limit=2 invoice"), 0);
  EXPECT_EQ(targets().size(), 2U);
  EXPECT_EQ(run(search + "@nothing"), 2);
  EXPECT_EQ(run(search + "--count x"), 2);
  EXPECT_EQ(targets().size(), 2U);
  EXPECT_EQ(run(search + "nothingofthekind"), 1);
  EXPECT_TRUE(targets().empty());
  EXPECT_EQ(run(search + "folder:family"), 0);
  EXPECT_EQ(outputOf(search), "0 messages in " + place + '\n');
  EXPECT_TRUE(targets().empty());
  EXPECT_THAT(errorsOf("search --maildir=" + mail + " invoice"), HasSubstr("is not from a search"));
}

TEST_F(EverydayTest, WritesTheStatusAsAPage) {
  ASSERT_EQ(run("sync " + mail), 0) << errors;
  EXPECT_EQ(outputOf("status --html page.html", "STATE_DIRECTORY=" + directory / "state"),
            "wrote page.html\n");
  const std::string page = read("page.html");
  EXPECT_THAT(page, HasSubstr("<span class=\"path\">" + mail +
                              "/family</span><span class=\"count\">10</span>"));
  for (const char* text : {"<title>2024-02: ", "A sync adds one entry a day", "device unlocked"}) {
    EXPECT_THAT(page, HasSubstr(text));
  }
  // The former page is replaced; nothing else is.
  EXPECT_EQ(run("status --html page.html"), 0);
  fs::create_symlink("page.html", directory / "link");
  EXPECT_THAT(errorsOf("status --html link"),
              HasSubstr("link: this is not a plain file, and stays"));
  for (const char* const wrong : {".", "none/page.html", "page.html --format=json"}) {
    EXPECT_EQ(run(std::string("status --html ") + wrong), 2) << wrong;
  }
  EXPECT_NE(shell("ls page.html.*"), 0);
}

// The signal comes while the daemon has the first batch.
TEST_F(IndexTest, AnInterruptLeavesASummary) {
  testsupport::FakeDaemon daemon;
  daemon.answer("IndexItems", [&](rpc::Reply& reply) {
    kill(std::atoi(read("pid").c_str()), SIGINT);
    reply.send({});
  });
  EXPECT_EQ(shell(fmt::format("sh -c 'echo $$ >pid; exec " TALLOW_PROGRAM
                              " --runtime-dir {0} index {1} {1}'",
                              daemon.runtimeDirectory(), TALLOW_SAMPLE_MAIL)),
            2);
  EXPECT_THAT(output, testing::EndsWith(" messages indexed, interrupted\n"));
}
