#include <fmt/format.h>
#include <gmock/gmock.h>

#include <csignal>
#include <filesystem>
#include <memory>

#include "cli/Terminal.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/TmuxTest.h"

// The program in a real terminal, with a real daemon and the sample mail. Skipped if tmux is
// missing, except with CI=true (scripts/ci-packages.list).

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::Not;

namespace {

class ScreenProcessTest : public testsupport::TmuxTest {
 protected:
  void SetUp() override {
    NEED_PROGRAMS("tmux")
    fs::copy(TALLOW_SAMPLE_MAIL, mail, fs::copy_options::recursive);
    startDaemon();
  }

  void startDaemon() {
    daemon.reset();
    daemon = std::make_unique<testsupport::DaemonProcess>(directory.path());
    ASSERT_TRUE(daemon->ready());
    tallow = TALLOW_PROGRAM " --runtime-dir " + daemon->runtimeDirectory();
  }
  void index() { ASSERT_EQ(run("index " + mail), 0) << errors; }

  // Starts a shell in a terminal of this size, and the program in it.
  void open(int columns, int rows, const std::string& arguments = "") {
    startShell(columns, rows);
    enter(tallow + arguments, "Search:");
  }
  // The process ID of the program, a child of the shell.
  [[nodiscard]] pid_t process() const {
    const int shell = std::atoi(tmux("display-message -p -t t '#{pane_pid}'").c_str());
    return std::atoi(
        testsupport::outputOf(fmt::format("cat /proc/{0}/task/{0}/children", shell)).c_str());
  }
  // Expects that the program has ended with this status, and that the terminal is in line mode with
  // echo again.
  void expectRestored(int status = 0) const {
    awaitGone("Search:");
    enter("echo left=$?; stty -a | tr \" \" \"\\n\" | grep -cxE \"icanon|echo|isig|icrnl\"",
          fmt::format("left={}\n4\n", status));
  }

  const std::string mail = directory / "mail";
  std::unique_ptr<testsupport::DaemonProcess> daemon;
};

}  // namespace

TEST_F(ScreenProcessTest, ResultsChangeWithEachKey) {
  index();
  open(80, 24);
  await("F1 help");
  type("minutes of the row", "Minutes of the rowing club");
  await("1-1 of 1");
  await("Subject:  Minutes of the rowing club");  // the preview
  press("C-u");
  awaitGone("Minutes");
  type("photos", "Photos from the island");
  // Letters of any script, cursor movement, and deleting a word.
  press("C-u");
  type("京都", "京都");
  press("C-w");
  type("invoice zz", "no match");
  press("BSpace BSpace BSpace", "Your invoice 4471");
  press("C-a");
  type("x", "Search: xinvoice");
  press("C-a DC", "Your invoice 4471");
  // Pasted text goes into the line, even if its characters are keys.
  press("C-e C-u");
  tmux("set-buffer -- \"$(printf 'photos\\rfrom\\tthe\\033OA\\017')\" \\; paste-buffer -p -t t");
  await("Search: photos from the");
  await("Photos from the island");
  EXPECT_THAT(screen(), Not(HasSubstr("TALLOW_OPEN")));
}

TEST_F(ScreenProcessTest, MailsAreReadSortedAndFiltered) {
  index();
  open(120, 40);
  type("invoice", "Your invoice 4471");
  press("C-s", "newest first");
  press("C-t", "conversations");
  await("(4) ");
  press("C-f", "Folder:");
  press("C-u");
  enter("family", "in family");
  await("First invoice for the shelves");
  awaitGone("4471");
  press("Enter", "q back");
  await("Subject:  First invoice for the shelves");
  press("q", "Search: invoice");
  press("F1", "Ctrl-T");
  press("Escape", "Search: invoice");
  press("C-y", "copied " + mail + "/family/cur/");
  EXPECT_THAT(tmux("show-buffer"), HasSubstr(mail + "/family/cur/"));
}

TEST_F(ScreenProcessTest, MailIsOpenedByAProgram) {
  index();
  variables = fmt::format("TALLOW_OPEN='tee {}/opened <'", directory.path());
  open(80, 24, " screen oarlock fixed");
  await("1-1 of 1");
  press("C-o", "Search: oarlock");
  awaitThat([&](const std::string&) { return fs::exists(directory / "opened"); },
            "the mail being opened");
  await("1-1 of 1");
  EXPECT_THAT(read("opened"), HasSubstr("Subject: Oarlock fixed"));
  press("Escape");
  expectRestored();
}

TEST_F(ScreenProcessTest, DrawsAnySize) {
  index();
  open(80, 24);
  type("invoice", "Your invoice 4471");
  const auto resize = [&](int columns, int rows) {
    tmux(fmt::format("resize-window -t t -x {} -y {}", columns, rows));
  };
  resize(130, 30);
  // The preview is next to the list.
  awaitThat([&](const std::string& seen) { return seen.find("│ From:") != std::string::npos; },
            "the preview beside");
  resize(30, 5);
  awaitGone("│");
  await("invoice");
  resize(12, 2);
  awaitThat([&](const std::string& seen) { return seen.size() < 40; }, "two lines");
  resize(1, 1);
  awaitThat([&](const std::string& seen) { return seen.size() < 8; }, "one cell");
  press("Down Enter PPage q F1 q");
  resize(80, 24);
  await("Search: invoice");
  await("Your invoice 4471");
  press("Escape");
  expectRestored();
}

// No mail text may move what is shown next to it or below it.
TEST_F(ScreenProcessTest, HostileMailDoesNotBreakTheScreen) {
  fs::remove_all(mail);
  const std::string bad =
      "\x1b[2J\x1b]0;title\x07\u009B31m\u202Egnp.exe\u2066\u0645\u0631\u062D\u0628\u0627 "
      "\u05E9\u05DC\u05D5\u05DD "
      "z\u0301\u0302\u0303\u0304\u0305\u0306\u0307\u0308\u0309 "
      "\u4EAC\u90FD\u200D\u2764\uFE0F\U0001F44B\U0001F3FD "
      "\U0001F468\u200D\U0001F469\u200D\U0001F467 \xC3\x28 \xFF";
  write("mail/1.eml",
        fmt::format("From: \"{0}\" <a@example.org>\nSubject: hostile {0}{1:M>1000000}\n"
                    "Date: Mon, 08 Jan 2024 08:49:00 +0000\n\n"
                    "hostile\n{0}\n\n{1:\t>5000}{0}\x0E\x8D\n",
                    bad, ""));
  write("mail/2\n\x1b[2J\u202E.eml",
        "From: b@example.org\nSubject: hostile but plain\n"
        "Date: Mon, 08 Jan 2023 08:49:00 +0000\n\nhostile\n");
  index();
  open(90, 24);
  type("hostile", "1-2 of 2");
  await("hostile but plain");
  press("Down", "Subject:  hostile but plain");
  press("Up");
  awaitGone("Subject:  hostile but plain");
  await("Subject:  hostile");
  const auto seen = lines();
  ASSERT_EQ(seen.size(), 24u);
  EXPECT_THAT(seen[0], testing::StartsWith("Search: hostile"));
  EXPECT_THAT(seen[1], testing::StartsWith("2024-01-08 08:49"));
  EXPECT_THAT(seen[2], testing::StartsWith("2023-01-08 08:49 b@example.org"));
  EXPECT_EQ(seen[9].substr(0, 12), "────");
  EXPECT_THAT(seen[23], testing::StartsWith("F1 help"));
  EXPECT_THAT(seen[23], testing::EndsWith("1-2 of 2"));
  for (const std::string& line : seen) {
    EXPECT_EQ(cli::cleanForTerminal(line), line);
    EXPECT_LE(cli::columnsTaken(line), 90u);
  }
  EXPECT_EQ(tmux("display-message -p -t t '#{pane_title}'").find("title"), std::string::npos);
  press("Down C-y", "copied ");
  press("Enter", "q back");
  press("Escape", "Search: hostile");
  press("Escape");
  expectRestored();
}

TEST_F(ScreenProcessTest, WaitsForADaemonThatEnds) {
  index();
  daemon->signal(SIGKILL);
  daemon->wait();
  open(80, 24);
  type("oarlock", "tallowsearchd is not running; trying again");
  startDaemon();
  await("Oarlock fixed");
  awaitGone("not running");
  // A restart between two keys is not noticed.
  daemon->signal(SIGTERM);
  daemon->wait();
  startDaemon();
  type(" fixed", "Search: oarlock fixed");
  awaitGone("not running");
  await("1-1 of 1");
}

TEST_F(ScreenProcessTest, RestoresTheTerminal) {
  index();
  open(80, 24);
  type("invoice", "Your invoice 4471");
  press("C-z", "Stopped");
  await("ready>");
  press("C-l");
  enter("echo be''tween", "\nbetween");
  enter("fg", "Search: invoice");
  await("Your invoice 4471");
  press("C-c");
  expectRestored();
  // The exit statuses that a shell reports; SIGINT has the effect of Ctrl-C.
  for (const auto& [signal, status] : {std::pair(SIGTERM, 143), {SIGHUP, 129}, {SIGINT, 0}}) {
    press("C-l");
    enter(tallow, "Search:");
    ASSERT_EQ(kill(process(), signal), 0);
    expectRestored(status);
  }
}
