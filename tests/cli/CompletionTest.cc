#include <fmt/format.h>
#include <gmock/gmock.h>

#include <filesystem>
#include <sstream>

#include "tests/support/Programs.h"
#include "tests/support/TmuxTest.h"

namespace fs = std::filesystem;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsSupersetOf;
using testing::Not;

// The completions in real shells. Each test is skipped if its shell is missing, except with CI=true
// (scripts/ci-packages.list).
namespace {

class CompletionTest : public testsupport::TmuxTest {
 protected:
  CompletionTest() {
    fs::create_directories(directory / "bin");
    fs::create_symlink(TALLOW_PROGRAM, directory / "bin/tallow");
    fs::create_directories(directory / "work/inner");
    write("work/mail.mbox", "From x\n");
    // A saved search, which the shells ask `tallow` for.
    write("config/tallow/searches", "bills subject:invoice\n");
    tallow = TALLOW_PROGRAM;
    variables = fmt::format("PATH={}/bin:$PATH", directory.path());
  }
  void TearDown() override {
    if (fs::exists(directory / "tmux")) TmuxTest::TearDown();
  }

  void writeScript(const std::string& shell, const std::string& name) {
    write(name, outputOf("completion " + shell));
  }

  // Types this and Tab in an empty line, and waits for the text.
  void complete(const std::string& line, const std::string& expected) const {
    press("C-u");
    enter("clear");
    awaitThat([](const std::string& seen) { return seen.find("clear") == std::string::npos; },
              "an empty screen");
    type(line);
    press("Tab", expected);
  }

  // In both interactive shells.
  void expectCompletions() const {
    complete("tallow expl", "tallow explain");
    complete("tallow --format=json sea", "tallow --format=json search");
    complete("tallow --format j", "tallow --format json");
    complete("tallow search --so", "tallow search --sort");
    complete("tallow search --sort=d", "tallow search --sort=date");
    complete("tallow search harbour @bi", "tallow search harbour @bills");
    complete("tallow index ma", "tallow index mail.mbox");
    complete("tallow search --maildir in", "tallow search --maildir inner/");
    complete("tallow help pur", "tallow help purge");
    // An option of another command is none of this one.
    complete("tallow show --mai", "tallow show --mai");
    type("z", "tallow show --maiz");
  }
};

}  // namespace

TEST_F(CompletionTest, Bash) {
  NEED_PROGRAMS("bash", "tmux")
  writeScript("bash", "share/completions/tallow");
  variables += fmt::format(" BASH_COMPLETION_USER_DIR={}/share", directory.path());
  startShell(100, 20);
  // With the package bash-completion, which loads the script, and without it.
  const bool package = fs::exists("/usr/share/bash-completion/bash_completion");
  EXPECT_TRUE(package || !testsupport::isCI()) << "bash-completion is missing";
  enter(fmt::format("cd {}/work; bind \"set enable-bracketed-paste off\"; source {}; clear",
                    directory.path(),
                    package ? "/usr/share/bash-completion/bash_completion"
                            : directory / "share/completions/tallow"));
  awaitGone("source");
  expectCompletions();
  press("C-u");
  enter("complete -r tallow; source ../share/completions/tallow; clear");
  awaitGone("source");
  expectCompletions();
}

TEST_F(CompletionTest, Zsh) {
  NEED_PROGRAMS("zsh", "tmux")
  writeScript("zsh", "functions/_tallow");
  start("exec zsh -f -i", 100, 20);
  enter(
      fmt::format("PS1=\"ready> \"; cd {}/work; fpath=({}/functions $fpath); autoload -U compinit; "
                  "compinit -u -D; clear",
                  directory.path(), directory.path()),
      "ready>");
  awaitGone("compinit");
  expectCompletions();
  // A list shows what each is for.
  complete("tallow show --", "--attachment");
  await("Save the attachment with this number");
  EXPECT_THAT(screen(), Not(HasSubstr("--reread")));
}

TEST_F(CompletionTest, Fish) {
  NEED_PROGRAMS("fish")
  writeScript("fish", "config/fish/completions/tallow.fish");
  // The words that `complete -C` offers for a line, without their descriptions.
  const auto offered = [&](const std::string& line) {
    shell(fmt::format(
        "cd work && HOME={0} XDG_CONFIG_HOME={0}/config XDG_DATA_HOME={0} PATH={0}/bin:$PATH "
        "fish -c 'complete -C \"{1}\"'",
        directory.path(), line));
    std::istringstream lines(output);
    std::vector<std::string> words;
    for (std::string one; std::getline(lines, one);) words.push_back(one.substr(0, one.find('\t')));
    return words;
  };
  EXPECT_THAT(offered("tallow expl"), ElementsAre("explain"));
  EXPECT_THAT(offered("tallow --format json sea"), ElementsAre("search"));
  EXPECT_THAT(offered("tallow --format j"), ElementsAre("json"));
  EXPECT_THAT(offered("tallow search --so"), ElementsAre("--sort"));
  EXPECT_THAT(offered("tallow search --sort=d"), ElementsAre("--sort=date"));
  EXPECT_THAT(offered("tallow search harbour @bi"), ElementsAre("@bills"));
  EXPECT_THAT(offered("tallow index ma"), Contains("mail.mbox"));
  EXPECT_THAT(offered("tallow search ma"), Not(Contains("mail.mbox")));
  EXPECT_THAT(offered("tallow search --maildir in"), Contains("inner/"));
  EXPECT_THAT(offered("tallow help pur"), ElementsAre("purge"));
  EXPECT_THAT(offered("tallow show --m"), Not(Contains("--maildir")));
  EXPECT_THAT(offered("tallow show -"), IsSupersetOf({"--attachment", "-o", "--output", "--raw"}));
}

TEST_F(CompletionTest, OtherShellsAreRefused) {
  EXPECT_EQ(run("completion csh"), 2);
  EXPECT_EQ(run("completion bash >/dev/full"), 2);
}
