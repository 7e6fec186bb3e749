#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <set>

#include "platform/Files.h"
#include "tests/client/FakeDaemon.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/TemporaryDirectory.h"

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::StartsWith;

// Everyday use of indexed mail, with the program and a real daemon.
namespace {

class EverydayTest : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_TRUE(daemon.ready());
    std::filesystem::copy(TALLOW_SAMPLE_MAIL, mail, std::filesystem::copy_options::recursive);
    ASSERT_EQ(run("index " + mail), 0) << errors;
  }

  // Runs `tallow ARGUMENTS` in a shell and returns the exit status.
  int run(const std::string& arguments, const std::string& environment = "") {
    const std::string command = fmt::format(
        "cd {0} && env -u PAGER -u STATE_DIRECTORY XDG_RUNTIME_DIR={0}/run "
        "XDG_STATE_HOME={0}/state "
        "XDG_CONFIG_HOME={0}/config TALLOW_SESSION=test TZ=UTC {1} " TALLOW_PROGRAM
        " --runtime-dir {2} {3} >{0}/out 2>{0}/err </dev/null",
        directory.path(), environment, daemon.runtimeDirectory(), arguments);
    const int status = WEXITSTATUS(std::system(command.c_str()));
    output = read("out");
    errors = read("err");
    return status;
  }

  [[nodiscard]] std::string read(const std::string& name) const {
    return platform::readFile(directory / name, size_t{1} << 20, nullptr).value_or("(none)");
  }

  [[nodiscard]] int count(const std::string& words) {
    run("search --count " + words);
    return std::atoi(output.c_str());
  }

  const testsupport::TemporaryDirectory directory;
  const std::string mail = directory / "mail";
  const testsupport::DaemonProcess daemon{directory.path()};
  std::string output;
  std::string errors;
};

}  // namespace

TEST_F(EverydayTest, ShowsWhatTheLastSearchFound) {
  EXPECT_EQ(run("show 1"), 2);
  EXPECT_THAT(errors, HasSubstr("no search of this terminal is known"));
  ASSERT_EQ(run("search '\"corrected invoice\" ' --offset=1 --limit=1 --sort=date"), 0);
  EXPECT_THAT(output, StartsWith("  2  2024-01-11 10:03  Nordlys Energy\n"));
  EXPECT_EQ(run("--color=always show 2"), 0);
  EXPECT_THAT(output, HasSubstr("\x1b[2mFrom:     \x1b[0mNordlys Energy <"));
  EXPECT_THAT(output, HasSubstr("the \x1b[1;33mcorrected\x1b[0m \x1b[1;33minvoice\x1b[0m 4502"));
  EXPECT_EQ(run("show 1"), 1);
  EXPECT_EQ(run("show 2", "TALLOW_SESSION=other"), 2);
  // A search without results clears the ranks; output for other programs does not change them.
  EXPECT_EQ(run("search --format=files harbour"), 0);
  EXPECT_EQ(run("show 2"), 0);
  EXPECT_EQ(run("search nothingofthekind"), 1);
  EXPECT_EQ(run("show 2"), 1);
  EXPECT_EQ(run("show " + mail + "/archive.mbox:736"), 0);
  EXPECT_THAT(output, HasSubstr("Date:     Tue, 09 Jan 2024"));
  EXPECT_EQ(run("show " + mail + "/archive.mbox"), 2);
  EXPECT_THAT(errors, HasSubstr("this is a mailbox"));
  EXPECT_EQ(run("show file/gone other:1"), 2);
  EXPECT_EQ(run("show other:1"), 2);
}

TEST_F(EverydayTest, SavesAttachments) {
  platform::writeFileAtomically(directory / "a.eml",
                                "Subject: s\nMIME-Version: 1.0\nContent-Type: image/png; "
                                "name=\"../../evil.png\"\n\n\x1b[31m",
                                nullptr);
  EXPECT_EQ(run("show ./a.eml"), 0);
  EXPECT_THAT(output, HasSubstr("\n  1  ../../evil.png  image/png, 5 B\n"));
  EXPECT_EQ(run("show ./a.eml --attachment 1 -o b.png"), 0);
  EXPECT_EQ(read("b.png"), "\x1b[31m");
  platform::writeFileAtomically(directory / "b.png", "old", nullptr);
  EXPECT_EQ(run("show ./a.eml --attachment 1 -o b.png"), 2);
  EXPECT_EQ(read("b.png"), "old");
  EXPECT_EQ(run("show ./a.eml --attachment 1 -o b.png --force"), 0);
  EXPECT_EQ(read("b.png"), "\x1b[31m");
  // Links are neither followed nor replaced.
  std::filesystem::create_symlink(directory / "target", directory / "link");
  EXPECT_EQ(run("show ./a.eml --attachment 1 -o link"), 2);
  EXPECT_EQ(run("show ./a.eml --attachment 1 -o link --force"), 2);
  EXPECT_EQ(run("show ./a.eml --attachment 1 -o . --force"), 2);
  EXPECT_FALSE(std::filesystem::exists(directory / "target"));
  EXPECT_EQ(run("show ./a.eml --attachment 2 -o c"), 2);
  EXPECT_EQ(run("show ./a.eml --attachment 1 -o -"), 0);
  EXPECT_EQ(output, "\x1b[31m");
  EXPECT_EQ(run("show ./a.eml --raw"), 0);
  EXPECT_EQ(output, read("a.eml"));
}

TEST_F(EverydayTest, PagesOnATerminal) {
  const std::string shown = "show " + mail + "/archive.mbox:736";
  const auto onTerminal = [&](const std::string& pager) {
    const std::string command = fmt::format("PAGER='{}' " TALLOW_PROGRAM " {}", pager, shown);
    return std::system(("script -qec \"" + command + "\" " + directory / "typed" + " >" +
                        directory / "out </dev/null")
                           .c_str());
  };
  EXPECT_EQ(onTerminal("sed s/Subject/PAGED/"), 0);
  EXPECT_THAT(read("out"), HasSubstr("PAGED"));
  for (const char* const pager : {"no-such-pager-here", "true", ""}) {
    EXPECT_EQ(onTerminal(pager), 0) << pager;
    EXPECT_EQ(read("out").find("Subject") == std::string::npos, std::string_view(pager) == "true");
  }
}

TEST_F(EverydayTest, ResultsByConversation) {
  ASSERT_EQ(run("search --threads 'invoice 4471 '"), 0);
  EXPECT_THAT(output, HasSubstr("Re: Your invoice 4471 for December  (4 results: 1 2 3 4)\n"));
  EXPECT_EQ(run("search --threads --count 'invoice 4471 '"), 0);
  EXPECT_EQ(output, "1\n");
  EXPECT_EQ(run("show 4"), 0);
  EXPECT_EQ(run("search --threads --format=json --limit 0 e"), 0);
  const auto json = nlohmann::json::parse(output);
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
  EXPECT_EQ(run("delete " + mail + "/family"), 0);
  EXPECT_EQ(output, fmt::format("deleted {}/family: {} messages\n", mail, family));
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
  EXPECT_EQ(run("delete " + message), 0);
  EXPECT_EQ(output, "deleted " + message + '\n');
  EXPECT_EQ(run("delete " + message), 1);
}

TEST_F(EverydayTest, SavedSearches) {
  EXPECT_EQ(run("save"), 1);
  EXPECT_EQ(run("save bills subject:invoice -corrected"), 0);
  EXPECT_EQ(run("save @libraries from:library"), 0);
  EXPECT_EQ(run("save"), 0);
  EXPECT_EQ(output, "bills            subject:invoice -corrected\nlibraries        from:library\n");
  EXPECT_EQ(count("@bills"), count("subject:invoice -corrected"));
  EXPECT_EQ(count("@bills OR @libraries"), count("'(subject:invoice -corrected) OR from:library'"));
  EXPECT_EQ(count("invoice -@bills"), count("'invoice -(subject:invoice -corrected)'"));
  EXPECT_EQ(run("search @nothing"), 2);
  EXPECT_THAT(errors, HasSubstr("there is no saved search \"nothing\""));
  // Lines that are not searches are kept.
  const std::string file = directory / "config/tallow/searches";
  platform::writeFileAtomically(file, "# mine\n\nodd\nbills " + std::string("x\n"), nullptr);
  EXPECT_EQ(run("save bills harbour"), 0);
  EXPECT_EQ(read("config/tallow/searches"), "# mine\n\nodd\nbills harbour\n");
  EXPECT_EQ(run("save --delete bills"), 0);
  EXPECT_EQ(run("save --delete bills"), 1);
  EXPECT_EQ(read("config/tallow/searches"), "# mine\n\nodd\n");
  EXPECT_EQ(run("save 'a b' x"), 2);
}

TEST_F(EverydayTest, CompletesAddresses) {
  EXPECT_EQ(run("address samir"), 0);
  EXPECT_THAT(output, StartsWith("samir@example.com\tSamir Haddad\t"));
  EXPECT_EQ(run("address --mutt had sam@nowhere"), 1);
  EXPECT_EQ(output, "0 addresses\n");
  EXPECT_EQ(run("address --format=json -- example.org"), 0);
  const auto list = nlohmann::json::parse(output);
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
  EXPECT_FALSE(std::filesystem::exists(directory / "state/TallowSearch/work"));
  EXPECT_EQ(run("index " + mail + "/drafts" + state), 0);
  EXPECT_EQ(run("search toast" + state), 0);
}

TEST_F(EverydayTest, StatusOfAllClassesAndOfDeletedMail) {
  const std::string state = " --format=json --state-dir " + directory / "state";
  EXPECT_EQ(run("index --class work " + mail + "/drafts"), 0);
  const int family = count("folder:family");
  EXPECT_EQ(run("delete " + mail + "/family"), 0);
  const auto classes = [this](const std::string& arguments) {
    EXPECT_EQ(run("status" + arguments), 0) << errors;
    return nlohmann::json::parse(output).at("classes");
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
  platform::createDirectories(directory / "config/tallow", nullptr);
  platform::writeFileAtomically(
      directory / "config/tallow/config.toml",
      fmt::format("roots = ['{0}']\n[class]\n'{0}' = 'private'\n", mail + "/drafts"), nullptr);
  EXPECT_EQ(classes(state).size(), 2U);
  EXPECT_TRUE(classes(state + " --class private")[0].at("index").is_null());
  EXPECT_FALSE(std::filesystem::exists(directory / "state/TallowSearch/private"));
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
  EXPECT_EQ(run(search + "folder:family"), 0) << errors;
  EXPECT_EQ(output, "10 messages in " + place + '\n');
  EXPECT_THAT(targets(),
              testing::IsSupersetOf({mail + "/family/cur/1707297540.M002.harbour:2,RS .tallow:2,RS",
                                     mail + "/family/new/1707831480.M009.harbour .tallow"}));
  // Of a mailbox there are copies; those of compressed mail are not compressed.
  ASSERT_EQ(std::system(("gzip " + mail + "/drafts/harvest-toast.eml").c_str()), 0);
  ASSERT_EQ(run("index " + mail), 0);
  std::filesystem::remove(mail + "/family/new/1707831480.M009.harbour");
  EXPECT_EQ(run(search + "--format=json invoice OR toast OR folder:family"), 0) << errors;
  const auto counts = nlohmann::json::parse(output);
  EXPECT_EQ(counts["maildir"], place);
  EXPECT_EQ(counts["linked"], 9);
  EXPECT_EQ(counts["leftOut"], 2);  // the one that was removed, and the one that was compressed
  const std::string copies = directory / "copies";
  ASSERT_EQ(std::system(("cat " + place + "/.tallow-folder/* >" + copies).c_str()), 0);
  EXPECT_THAT(read("copies"), StartsWith("X-Tallow-Copy-Of: "));
  EXPECT_THAT(read("copies"), HasSubstr("X-Tallow-Copy-Of: mbox" + mail +
                                        "/archive.mbox?offset=0\nReceived: from"));
  EXPECT_THAT(read("copies"), HasSubstr("harvest-toast.eml.gz\nFrom: "));
  // The folder is not mail, whoever looks into it.
  EXPECT_EQ(run("sync --format=json " + directory / "folders"), 0) << errors;
  EXPECT_EQ(nlohmann::json::parse(output)["toSend"], 0);
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
  EXPECT_EQ(run(search), 0);
  EXPECT_EQ(output, "0 messages in " + place + '\n');
  EXPECT_TRUE(targets().empty());
  EXPECT_EQ(run("search --maildir=" + mail + " invoice"), 2);
  EXPECT_THAT(errors, HasSubstr("is not from a search"));
}

TEST_F(EverydayTest, WritesTheStatusAsAPage) {
  ASSERT_EQ(run("sync " + mail), 0) << errors;
  EXPECT_EQ(run("status --html page.html", "STATE_DIRECTORY=" + directory / "state"), 0) << errors;
  EXPECT_EQ(output, "wrote page.html\n");
  const std::string page = read("page.html");
  for (const std::string& text :
       {"<span class=\"path\">" + mail + "/family</span><span class=\"count\">10</span>",
        std::string("<title>2024-02: "), std::string("A sync adds one entry a day"),
        std::string("device unlocked")}) {
    EXPECT_THAT(page, HasSubstr(text));
  }
  // The former page is replaced; nothing else is.
  EXPECT_EQ(run("status --html page.html"), 0);
  fs::create_symlink("page.html", directory / "link");
  EXPECT_EQ(run("status --html link"), 2);
  EXPECT_THAT(errors, HasSubstr("link: this is not a plain file, and stays"));
  EXPECT_EQ(run("status --html ."), 2);
  EXPECT_EQ(run("status --html none/page.html"), 2);
  EXPECT_EQ(run("status --html page.html --format=json"), 2);
  EXPECT_NE(std::system(("ls " + directory / "page.html.* 2>/dev/null").c_str()), 0);
}

// The signal comes while the daemon has the first batch.
TEST(IndexTest, AnInterruptLeavesASummary) {
  const testsupport::TemporaryDirectory directory;
  testsupport::FakeDaemon daemon;
  const auto read = [&](const char* name) {
    return platform::readFile(directory / name, 1000, nullptr).value_or("");
  };
  daemon.answer("IndexItems", [&](rpc::Reply& reply) {
    kill(std::atoi(read("pid").c_str()), SIGINT);
    reply.send({});
  });
  const std::string command =
      fmt::format("exec sh -c 'echo $$ >{0}/pid; exec " TALLOW_PROGRAM
                  " --runtime-dir {1} index {2} {2} >{0}/out'",
                  directory.path(), daemon.runtimeDirectory(), TALLOW_SAMPLE_MAIL);
  EXPECT_EQ(WEXITSTATUS(std::system(command.c_str())), 2);
  EXPECT_THAT(read("out"), testing::EndsWith(" messages indexed, interrupted\n"));
}
