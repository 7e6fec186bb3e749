#include <fmt/format.h>
#include <gmock/gmock.h>

#include <filesystem>
#include <regex>

#include "platform/Files.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/TmuxTest.h"

// The settings of packaging/mail-programs in the programs that they are for: search, read, reply
// without sending, and search again. Skipped where a program is missing, but not where CI=true
// (scripts/ci-packages.list).

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::Not;

namespace {

class MailProgramsTest : public testsupport::TmuxTest {
 protected:
  // Indexes the sample mail. The program finds `tallow`, and an editor that only keeps its file.
  void prepare() {
    ASSERT_TRUE(daemon.ready());
    if (!fs::exists(mail)) fs::copy(TALLOW_SAMPLE_MAIL, mail, fs::copy_options::recursive);
    write("bin/editor", "#!/bin/sh\ncp \"$1\" \"$HOME/reply\"\n");
    fs::create_symlink(TALLOW_PROGRAM, directory / "bin/tallow");
    fs::permissions(directory / "bin/editor", fs::perms::owner_all);
    variables = fmt::format(
        "PATH={0}/bin:$PATH RUNTIME_DIRECTORY={1} STATE_DIRECTORY={0}/state TERM=xterm-256color",
        directory.path(), daemon.runtimeDirectory());
    tallow = TALLOW_PROGRAM " --runtime-dir " + daemon.runtimeDirectory();
    ASSERT_EQ(run("index " + mail), 0) << errors;
  }

  // One of the files that are tested.
  [[nodiscard]] static std::string settings(const std::string& name) {
    return platform::readFile(std::string(TALLOW_MAIL_PROGRAMS) + '/' + name, 100000, nullptr)
        .value_or("");
  }
  void configureAerc(const std::string& editor) const {
    fs::create_directory(mail + "/family/tmp");
    write("config/aerc/accounts.conf",
          fmt::format("[Mail]\nsource = maildir://{}\ndefault = family\n"
                      "from = Mara <mara.lindqvist@example.org>\noutgoing = /bin/false\n",
                      mail) +
              settings("aerc-accounts.conf"));
    fs::permissions(directory / "config/aerc/accounts.conf",
                    fs::perms::owner_read | fs::perms::owner_write);
    write("config/aerc/aerc.conf",
          fmt::format("[general]\nunsafe-accounts-conf=true\n[compose]\neditor={}\n{}", editor,
                      settings("aerc.conf")));
    write("config/aerc/binds.conf",
          settings("aerc-binds.conf") +
              "n = :next-tab<Enter>\n<Enter> = :view<Enter>\n"
              "g = :select 0<Enter>\nc = :compose<Enter>\n[view]\nr = :reply -q<Enter>\n");
  }

  // What the editor was given, once it has the text.
  [[nodiscard]] std::string awaitReply(const std::string& text) const {
    awaitThat([&](const std::string&) { return read("reply").find(text) != std::string::npos; },
              "a reply with " + text);
    return read("reply");
  }
  [[nodiscard]] size_t links() const {
    size_t count = 0;
    for (const char* const part : {"cur", "new"}) {
      const auto names = platform::listDirectory(folder + '/' + part, nullptr);
      count += names ? names->size() : 0;
    }
    return count;
  }

  const std::string mail = directory / "mail";
  const std::string folder = directory / ".cache/tallow/folders/search";
  const testsupport::DaemonProcess daemon{directory.path()};
};

}  // namespace

TEST_F(MailProgramsTest, Neomutt) {
  NEED_PROGRAMS("tmux", "neomutt")
  prepare();
  write("muttrc",
        fmt::format("set from=mara.lindqvist@example.org realname=Mara sendmail=/bin/false\n"
                    "set folder={0} spoolfile={0}/family editor={1}/bin/editor edit_headers=yes "
                    "include=yes fast_reply=yes sleep_time=0\nsource {2}/tallow.muttrc\n",
                    mail, directory.path(), TALLOW_MAIL_PROGRAMS));
  start("neomutt -F " + directory / "muttrc", 110, 30);
  await("[Msgs:10 ");
  // In the open folder.
  press("M-s", "Limit to messages matching: ~I");
  enter("first invoice", "[Msgs:1/10 ");
  await("First invoice for the shelves");
  // In all folders.
  press("S", "Search:");
  enter("invoice for", "search [Msgs:7 ");
  await("Your invoice 4471");
  EXPECT_EQ(links(), 7U);
  // The links are gone with the next search, and neomutt asks nothing about them.
  press("S", "Search:");
  enter("brackets brass", "search [Msgs:1 ");
  EXPECT_EQ(links(), 1U);
  press("Enter", "Dear Mara,");
  press("r");
  EXPECT_THAT(awaitReply("> Dear Mara"), HasSubstr("\nTo: Samir Haddad <samir@example.com>\n"));
  await("Aborted unmodified message");
}

TEST_F(MailProgramsTest, Aerc) {
  NEED_PROGRAMS("tmux", "aerc")
  prepare();
  configureAerc(directory / "bin/editor");
  outputOfShell(variables + " HOME=" + directory.path() + " tallow search --maildir=" + folder);
  start("aerc", 120, 30);
  await("Elena Ruiz");
  press("n", "(no messages)");
  // The open folder shows the results of each search.
  for (const auto& [words, found] : {std::pair("oarlock fixed", "Oarlock fixed"),
                                     {"harbour", "Minutes of the rowing club"},
                                     {"nothingofthekind", "(no messages)"},
                                     {"brackets brass", "First invoice for the shelves"}}) {
    press("S", "Search:");
    enter(words, found);
  }
  awaitThat([&](const std::string&) { return links() == 1; }, "one link");
  press("g Enter", "From: \"Samir Haddad\"");
  press("r");
  EXPECT_THAT(awaitReply("> Dear Mara"), HasSubstr("Samir Haddad wrote"));
  await("Send this email?");
  EXPECT_THAT(screen(), HasSubstr("To: \"Samir Haddad\" <samir@example.com>"));
}

// Who is written to is completed from the mail.
TEST_F(MailProgramsTest, AercCompletesAddresses) {
  NEED_PROGRAMS("tmux", "aerc")
  prepare();
  write("bin/waiting", "#!/bin/sh\nexec sleep 1000\n");
  fs::permissions(directory / "bin/waiting", fs::perms::owner_all);
  configureAerc(directory / "bin/waiting");
  start("aerc", 120, 30);
  await("Elena Ruiz");
  press("c", "To:");
  type("sami", "samir@example.com");
}

TEST_F(MailProgramsTest, Emacs) {
  NEED_PROGRAMS("tmux", "emacs")
  prepare();
  start(fmt::format("emacs -nw -Q -l {}/tallow.el -f tallow-search", TALLOW_MAIL_PROGRAMS), 110,
        40);
  await("Search mail:");
  enter("randonn\u00E9e", "2024-02-09 11:10 Ren\u00E9 Dufour");
  press("Enter", "Bonjour,");
  await("From:     Ren\u00E9 Dufour <rene.dufour@example.com>");
  press("r", "To: Ren\u00E9 Dufour <rene.dufour@example.com>");
  await("Subject: Re: Randonn\u00E9e dimanche");
  await("> Bonjour,");
}

// Nothing of a mail changes the list, and the file compiles without a warning.
TEST_F(MailProgramsTest, EmacsWithHostileMail) {
  NEED_PROGRAMS("tmux", "emacs")
  write("mail/a.eml",
        "From: \"a\x1b[2J\u202E\" <a@example.org>\nSubject: hostile\x07\u202E\u2066 " +
            std::string(100000, 'm') + "\nReply-To: b@example.org\n\nhostile\n");
  prepare();
  outputOfShell("cp " TALLOW_MAIL_PROGRAMS
                "/tallow.el . && emacs -Q --batch --eval "
                "'(setq byte-compile-error-on-warn t)' -f batch-byte-compile tallow.el");
  start("emacs -nw -Q -l " + directory / "tallow.elc -f tallow-search", 110, 40);
  await("Search mail:");
  enter("hostile", "1 of 1 mails");
  awaitThat(
      [](const std::string& seen) {
        return std::regex_search(seen, std::regex("\n +a \\[2J +hostile +m+[$]\n"));
      },
      "the row of the mail");
  press("r", "To: b@example.org");
}
