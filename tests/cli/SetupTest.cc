#include <fmt/format.h>
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <atomic>
#include <csignal>
#include <filesystem>
#include <memory>

#include "cli/Settings.h"
#include "tests/client/FakeDaemon.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/Programs.h"
#include "tests/support/TmuxTest.h"

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::UnorderedElementsAre;

// `tallow setup` with a home directory of the test, a systemctl that records what it is asked for,
// and a real daemon.
namespace {

// Units are running or enabled while a file of their name exists. With a file `fails`, no manager
// answers; with a file `runtime`, that directory of sockets is there once a unit is started.
constexpr const char* kSystemctl = R"shell(#!/bin/sh
d=$(dirname "$0")/..
echo "$*" >>$d/systemctl.log
[ -e $d/fails ] && { printf 'Failed to connect to bus: \033[31mNo medium found\nmore\n' >&2; exit 1; }
verb=$2 status=0
shift 2
for unit; do
  case $verb in
    start)
      touch "$d/active.$unit"
      [ -e $d/runtime ] && ln -sfn "$(cat $d/runtime)" $d/xdg/tallow
      ;;
    stop) rm -f "$d/active.$unit" ;;
    enable) touch "$d/enabled.$unit" ;;
    is-active) [ -e "$d/active.$unit" ] && echo active || { echo inactive; status=3; } ;;
    is-enabled) [ -e "$d/enabled.$unit" ] && echo enabled || { echo disabled; status=1; } ;;
  esac
done
exit $status
)shell";

constexpr const char* kUnset = "-u MAIL -u MAILDIR -u SUDO_USER -u RUNTIME_DIRECTORY";
constexpr const char* kSockets = "tallowsearchd.socket tallowsearchd-debug.socket";

class SetupTest : public testsupport::TmuxTest {
 protected:
  SetupTest() {
    fs::create_directories(directory / "bin");
    fs::create_directories(directory / "xdg");
    write("bin/systemctl", kSystemctl);
    fs::permissions(directory / "bin/systemctl", fs::perms::owner_all);
    fs::create_directory(home);
    variables = fmt::format(
        "HOME={0}/home XDG_RUNTIME_DIR={0}/xdg XDG_CONFIG_HOME={0}/config "
        "XDG_STATE_HOME={0}/client STATE_DIRECTORY={0}/state PATH={0}/bin:/usr/bin:/bin",
        directory.path());
    environment = kUnset + (' ' + variables);
    tallow = TALLOW_PROGRAM;
  }
  void TearDown() override {
    if (fs::exists(directory / "tmux")) TmuxTest::TearDown();
  }

  void startDaemon() {
    daemon = std::make_unique<testsupport::DaemonProcess>(directory.path());
    ASSERT_TRUE(daemon->ready());
    useDaemon(daemon->runtimeDirectory());
  }
  // Where `tallow` looks for the daemon of the user's units.
  void useDaemon(const std::string& runtime) const {
    fs::create_directory_symlink(runtime, directory / "xdg/tallow");
  }

  // What was asked of systemd since the last call, without questions.
  std::vector<std::string> unitCalls() const {
    std::istringstream log(read("systemctl.log"));
    std::vector<std::string> calls;
    for (std::string line; std::getline(log, line);) {
      if (line.find("--user is-") != 0) calls.push_back(line);
    }
    fs::remove(directory / "systemctl.log");
    return calls;
  }
  [[nodiscard]] std::vector<std::string> roots() const {
    const auto parsed = cli::parseSettings(read("config/tallow/config.toml"), "", home);
    const auto* const good = std::get_if<cli::Settings>(&parsed);
    if (good == nullptr) return {std::get<std::string>(parsed)};
    return good->roots;
  }

  void makeMaildir(const std::string& name, int mails) const {
    directory.makeMaildir(name);
    for (int i = 0; i < mails; ++i) {
      directory.write(fmt::format("{}/new/{}.M1.host", name, i),
                      fmt::format("From: a@example.org\nSubject: lighthouse {}\n\nText\n", i));
    }
  }
  static std::string mboxText(int mails) {
    std::string text;
    for (int i = 0; i < mails; ++i) {
      text += fmt::format(
          "From - Tue Jan 02 03:04:05 2024\nFrom: b@example.org\nSubject: mill {}\n\nGrain\n\n", i);
    }
    return text;
  }

  const std::string home = directory / "home";
  const std::string settings = directory / "config/tallow/config.toml";
  std::unique_ptr<testsupport::DaemonProcess> daemon;
};

}  // namespace

TEST_F(SetupTest, FindsMailWhereProgramsHaveIt) {
  makeMaildir("home/Maildir", 3);
  makeMaildir("home/Maildir/.Sent", 2);
  makeMaildir("home/by-aerc", 0);
  for (const char* const path : {"home/by-mbsync/inbox", "home/by-offlineimap/inbox",
                                 "home/by-mutt", "home/not-mine", "elsewhere", "outside"}) {
    makeMaildir(path, 1);
  }
  write("home/spool", mboxText(4));
  write("home/mail/2010/01", "From: old@example.org\nDate: x\n\nmessage in a file of its own\n");
  write("home/mail/2010/notes.txt", "no mail\n");
  fs::create_directory_symlink(directory / "elsewhere", home + "/Mail");
  fs::create_directory_symlink(directory / "elsewhere", home + "/mail/link");
  write("home/.mbsyncrc",
        "IMAPStore far\nPath ~/not-mine\n\n# a comment\nMaildirStore near\n  path "
        "\"~/by-mbsync/\"\n"
        "Inbox ~/by-mbsync/inbox\n\nChannel c\nFar :far:\n");
  write("home/.offlineimaprc",
        "[Repository Local]\ntype = Maildir\nlocalfolders = ~/by-offlineimap\n");
  write("home/.config/neomutt/neomuttrc",
        "set realname=\"x\" folder = '$HOME/by-mutt' # set folder=~/not-mine-either\n"
        "set folder=imaps://example.org/\nset spoolfile=+folder=~/not-mine\n");
  write("home/.muttrc", "set folder=~\n");
  write("home/.mutt/muttrc", "set folder=~/../outside\n");
  write("home/.config/aerc/accounts.conf",
        "[a]\nsource = maildir://~/by-aerc\n[b]\nsource = imaps://x\n");
  ASSERT_EQ(mkfifo((home + "/.neomuttrc").c_str(), 0600), 0);
  // The name of a profile is hostile, and another is not UTF-8.
  const std::string profile = "home/.thunderbird/ev\x1b[31mil\n\"]\\u202e\xE2\x80\xAEx";
  write(profile + "/Mail/Local Folders/Inbox", mboxText(2));
  write(profile + "/Mail/Local Folders/Inbox.msf", "// <!-- <mdb:mork:z v=\"1.4\"/> -->\n");
  write("home/.thunderbird/\xFF/ImapMail/x/Inbox", mboxText(1));
  write("home/.thunderbird/none/Mail/Local Folders/Trash", "");

  EXPECT_THAT(errorsOf("setup", "MAIL=" + home + "/spool"),
              HasSubstr("nothing has been changed; without a terminal, --yes does it"));
  EXPECT_EQ(run("setup --dry-run", "MAIL=" + home + "/spool"), 0) << errors;
  EXPECT_FALSE(fs::exists(settings));
  EXPECT_THAT(unitCalls(), IsEmpty());
  for (const char* const line :
       {"/Maildir: 5 mails in 2 folders\n", "/by-mbsync: 1 mail in 1 folder\n",
        "/by-offlineimap: 1 mail in 1 folder\n", "/by-mutt: 1 mail in 1 folder\n",
        "/by-aerc: 0 mails in 1 folder\n", "/spool: 4 mails in 1 folder\n",
        "/mail: 1 mail in 1 folder\n", "/Mail: 2 mails in 1 folder\n"}) {
    EXPECT_THAT(output, HasSubstr(line));
  }
  for (const char* const no : {"not-mine", "/none", "\x1b", "\xE2\x80\xAE"}) {
    EXPECT_THAT(output + errors, Not(HasSubstr(no)));
  }
  EXPECT_THAT(errors, HasSubstr("/elsewhere is outside of your home directory"));
  EXPECT_THAT(errors, HasSubstr("/outside is outside of your home directory"));
  EXPECT_THAT(errors, HasSubstr("/home holds your whole home directory"));
  EXPECT_THAT(errors, HasSubstr("is skipped: its name is not UTF-8"));

  // What is written is read as the same names.
  startDaemon();
  EXPECT_EQ(run("setup --yes", "MAIL=" + home + "/spool"), 0) << errors;
  EXPECT_THAT(roots(),
              UnorderedElementsAre(directory / profile + "/Mail", home + "/Maildir",
                                   home + "/by-aerc", home + "/by-mbsync", home + "/by-mutt",
                                   home + "/by-offlineimap", home + "/mail", home + "/spool"));
  EXPECT_THAT(read("config/tallow/config.toml"), Not(HasSubstr("\x1b")));
  EXPECT_THAT(output, HasSubstr("\n15 added\nDone. To search: tallow search WORDS\n"));
}

TEST_F(SetupTest, SetsUpOnceAndSaysSoAfterwards) {
  makeMaildir("home/Maildir", 2);
  startDaemon();
  fs::remove(directory / "xdg/tallow");
  write("runtime", daemon->runtimeDirectory());
  EXPECT_EQ(run("setup --yes"), 0) << errors;
  EXPECT_THAT(roots(), ElementsAre(home + "/Maildir"));
  EXPECT_EQ(fs::status(settings).permissions(), fs::perms(0600));
  EXPECT_EQ(fs::status(directory / "config/tallow").permissions(), fs::perms(0700));
  // The watch starts after the sync, whose lock it would wait for.
  EXPECT_THAT(
      unitCalls(),
      ElementsAre(fmt::format("--user start {}", kSockets), "--user stop tallow-watch.service",
                  fmt::format("--user enable {} tallow-watch.service", kSockets),
                  "--user start tallow-watch.service"));
  EXPECT_EQ(outputOf("search --count lighthouse"), "2\n");

  const std::string before = read("config/tallow/config.toml");
  EXPECT_THAT(outputOf("setup --yes"),
              HasSubstr("Already in the settings: " + home + "/Maildir\n"));
  EXPECT_THAT(output, HasSubstr("All is set up and at work"));
  EXPECT_THAT(unitCalls(), IsEmpty());
  EXPECT_EQ(read("config/tallow/config.toml"), before);
  EXPECT_THAT(outputOf("setup"), HasSubstr("All is set up."));
  // New mail is added; a watch that runs gets the new settings.
  makeMaildir("home/mail/lists", 1);
  EXPECT_EQ(run("setup --yes " + home + "/mail/../mail"), 0) << errors;
  EXPECT_THAT(roots(), UnorderedElementsAre(home + "/Maildir", home + "/mail"));
  EXPECT_THAT(unitCalls(), testing::IsSupersetOf({"--user stop tallow-watch.service",
                                                  "--user start tallow-watch.service"}));
  // A unit that was switched off comes back.
  fs::remove(directory / "enabled.tallow-watch.service");
  EXPECT_EQ(run("setup --yes"), 0) << errors;
  EXPECT_TRUE(fs::exists(directory / "enabled.tallow-watch.service"));
}

TEST_F(SetupTest, KeepsWhatTheSettingsSay) {
  for (const char* name : {"Maildir", "Mail/work", "mail", "elsewhere"}) {
    makeMaildir(std::string("home/") + name, 1);
  }
  const std::string text =
      "# mine\nroots = [ # all\n  \"~/Maildir\",\n]\nexclude = [\"~/mail\"]\n[class]\n"
      "\"~/elsewhere\" = \"work\"\n";
  write("dotfiles/config.toml", text);
  fs::create_directories(directory / "config/tallow");
  fs::create_symlink("../../dotfiles/config.toml", settings);
  startDaemon();
  EXPECT_EQ(run("setup --yes"), 0) << errors;
  EXPECT_TRUE(fs::is_symlink(settings));
  EXPECT_EQ(read("dotfiles/config.toml"),
            "# mine\nroots = [\"~/Mail\",  # all\n  \"~/Maildir\",\n]\nexclude = [\"~/mail\"]\n"
            "[class]\n\"~/elsewhere\" = \"work\"\n");
  // Settings that are wrong stay, and nothing else is done.
  fs::remove(directory / "systemctl.log");
  for (const char* const wrong : {"roots = [\n", "rots = []\n", "roots = \"x\"\n"}) {
    write("dotfiles/config.toml", wrong);
    EXPECT_THAT(errorsOf("setup --yes"), HasSubstr("config.toml:1: "));
    EXPECT_EQ(read("dotfiles/config.toml"), wrong);
  }
  EXPECT_THAT(unitCalls(), IsEmpty());
}

// Roots in the settings replace those that `tallow sync` knows.
TEST_F(SetupTest, TakesWhatWasSyncedBefore) {
  makeMaildir("home/Maildir", 1);
  makeMaildir("archive", 1);
  startDaemon();
  ASSERT_EQ(run("sync " + directory / "archive"), 0) << errors;
  EXPECT_EQ(run("setup --yes"), 0) << errors;
  EXPECT_THAT(roots(), UnorderedElementsAre(directory / "archive", home + "/Maildir"));
}

TEST_F(SetupTest, WorksWithoutSystemd) {
  makeMaildir("home/Maildir", 2);
  write("fails", "");
  EXPECT_EQ(run("setup --yes"), 75);
  EXPECT_THAT(errors, HasSubstr("the units of systemd cannot be used: Failed to connect to bus: "
                                "\uFFFD[31mNo medium found\n"));
  EXPECT_THAT(errors, HasSubstr("no daemon answers; start `tallowsearchd`"));
  EXPECT_THAT(unitCalls(), ElementsAre(fmt::format("--user start {}", kSockets)));
  startDaemon();
  EXPECT_EQ(run("setup --yes", "PATH=/nowhere"), 0) << errors;
  EXPECT_THAT(errors, HasSubstr("there is no systemctl"));
  EXPECT_THAT(output, HasSubstr("\n2 added\n`tallow watch` keeps the index in step"));
  // A daemon somewhere else is not that of the units.
  EXPECT_THAT(outputOf("setup --yes --runtime-dir " + daemon->runtimeDirectory()),
              HasSubstr("stay as they are"));
  EXPECT_THAT(unitCalls(), IsEmpty());
}

TEST_F(SetupTest, RefusesWhatCannotBeRight) {
  EXPECT_THAT(errorsOf("setup --yes"), HasSubstr("no mail was found"));
  makeMaildir("home/Maildir", 1);
  EXPECT_THAT(errorsOf("setup --yes " + home + "/Maildir " + home + "/none"),
              HasSubstr("/none: there is no such file or directory"));
  makeMaildir("home/a\xFF", 1);
  EXPECT_THAT(errorsOf("setup --yes " + home + "/a\xFF"), HasSubstr("which is not UTF-8"));
  EXPECT_EQ(run("setup --yes", "HOME="), 2);
  EXPECT_EQ(run("setup --yes --format=json"), 2);
  if (geteuid() == 0) {
    EXPECT_THAT(errorsOf("setup --yes", "SUDO_USER=mara"), HasSubstr("run it without sudo"));
  }
  EXPECT_FALSE(fs::exists(settings));
  // A place for the settings that cannot be written.
  write("config", "a file");
  EXPECT_THAT(errorsOf("setup --yes"), HasSubstr("/config"));
  EXPECT_THAT(unitCalls(), IsEmpty());
}

// Ctrl-C in the first sync leaves the rest to the watch.
TEST_F(SetupTest, AnInterruptLeavesTheRestToTheWatch) {
  makeMaildir("home/Maildir", 3);
  testsupport::FakeDaemon fake;
  useDaemon(fake.runtimeDirectory());
  std::atomic<bool> sent{false};
  for (const char* const member : {"IndexItems", "IndexItemsDeleteItemsWithIdentifiers"}) {
    fake.answer(member, [&](rpc::Reply& reply) {
      // A second signal would end it at once.
      if (!sent.exchange(true)) kill(std::atoi(read("pid").c_str()), SIGINT);
      reply.send({});
    });
  }
  EXPECT_EQ(
      shell("env " + environment + " sh -c 'echo $$ >pid; exec " TALLOW_PROGRAM " setup --yes'"), 0)
      << errors;
  EXPECT_THAT(output, testing::EndsWith("interrupted\ntallow-watch.service continues; `tallow "
                                        "status` shows how far.\n"));
  EXPECT_TRUE(fs::exists(directory / "active.tallow-watch.service"));
}

TEST_F(SetupTest, AsksOnATerminal) {
  NEED_PROGRAMS("tmux")
  makeMaildir("home/Mail", 1);
  makeMaildir("home/Maildir", 1);
  startDaemon();
  start(fmt::format("env {} PS1='ready> ' bash --norc --noprofile -i", kUnset), 100, 30);
  const auto open = [&](const char* answer, const char* after) {
    await("ready>");
    enter("clear");
    awaitGone("[");  // the question of the run before
    enter(TALLOW_PROGRAM " setup; echo status=$?", "or \"none\" [");
    enter(answer, after);
  };
  open("none", "status=2");
  EXPECT_THAT(screen(), HasSubstr("nothing has been changed"));
  EXPECT_FALSE(fs::exists(settings));
  open("3", "or \"none\" [all] 3\nWhich");  // asks again
  enter("2", "status=0");
  EXPECT_THAT(roots(), ElementsAre(home + "/Maildir"));
  // Later, the answer is none unless the user wants more.
  open("", "status=0");
  EXPECT_THAT(screen(), HasSubstr("Already in the settings: " + home + "/Maildir"));
  EXPECT_THAT(roots(), ElementsAre(home + "/Maildir"));
  open("all", "status=0");
  EXPECT_THAT(roots(), UnorderedElementsAre(home + "/Mail", home + "/Maildir"));
}
