#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>

#include "cli/ChildProgram.h"
#include "cli/MailCount.h"
#include "cli/SettingsFile.h"
#include "cli/SetupDialog.h"
#include "tests/support/TemporaryDirectory.h"

using namespace std::chrono_literals;
using End = cli::ProgramRun::End;

TEST(Setup, AnswersAreNumbersOrWords) {
  using Some = std::vector<size_t>;
  using Chosen = std::optional<Some>;
  const struct {
    const char* answer;
    Chosen chosen;
  } kCases[] = {
      {"", Some{0, 1, 2}},  {"  ", Some{0, 1, 2}},   {"all", Some{0, 1, 2}},
      {"n", Some{}},        {"3, 1 3", Some{0, 2}},  {"2\r", Some{1}},
      {"0", std::nullopt},  {"4", std::nullopt},     {"1 x", std::nullopt},
      {"-1", std::nullopt}, {"all 1", std::nullopt}, {"99999999999999999999", std::nullopt},
  };
  for (const auto& c : kCases) EXPECT_EQ(cli::parseChoice(c.answer, 3, true), c.chosen) << c.answer;
  EXPECT_EQ(cli::parseChoice("", 3, false), Some{});
}

TEST(Setup, RootsAreAddedAndNothingElseChanges) {
  const struct {
    std::string before;
    const char* after;
  } kCases[] = {
      {"", "# Made by `tallow setup`; tallow-config(5) describes all keys.\nroots = [\"~/M\"]\n"},
      {"on_battery = true\n", "roots = [\"~/M\"]\non_battery = true\n"},
      {"[class]\n\"~/é\" = \"w\"\n", "roots = [\"~/M\"]\n[class]\n\"~/é\" = \"w\"\n"},
      {"roots = []", "roots = [\"~/M\"]"},
      {"# é\r\n  \"roots\" =\t[\r\n'~/a' # ]\r\n, ]",
       "# é\r\n  \"roots\" =\t[\"~/M\", \r\n'~/a' # ]\r\n, ]"},
      // What does not end as expected is left to the user.
      {"roots = 5", nullptr},
      {"unknown = 1", nullptr},
      {"roots = [\"a\"", nullptr},
  };
  for (const auto& c : kCases) {
    const auto after = cli::withRoots(c.before, {"/h/M"}, "/h");
    EXPECT_EQ(after, c.after == nullptr ? std::nullopt : std::optional<std::string>(c.after));
  }
  EXPECT_EQ(cli::rootsLine({"/h", "/hh", "/h/~\x01\x7F\u009B\u202E\"\\"}, "/h"),
            "roots = [\"/h\", \"/hh\", \"~/~\\u0001\\u007f\\u009b\\u202e\\\"\\\\\"]\n");
  EXPECT_FALSE(cli::fitsSettings("/h/\xC3("));
}

TEST(Setup, AProgramIsWaitedForWithinBounds) {
  const auto shell = [](const char* text, std::chrono::milliseconds patience = 1min) {
    return cli::runProgram({"sh", "-c", text}, patience);
  };
  cli::ProgramRun run = shell("echo out; echo err >&2; cat; exit 7");
  EXPECT_EQ(run.end, End::exited);
  EXPECT_EQ(run.status, 7);
  EXPECT_EQ(run.output, "out\nerr\n");
  EXPECT_EQ(shell("kill -9 $$").status, 128 + SIGKILL);
  // Ends with the program, even if another process still has its output open.
  run = shell("sleep 1000 & echo $!");
  EXPECT_EQ(run.end, End::exited);
  kill(std::atoi(run.output.c_str()), SIGKILL);
  run = shell("echo begun; exec sleep 1000", 300ms);
  EXPECT_EQ(run.end, End::timedOut);
  EXPECT_EQ(run.status, 128 + SIGKILL);
  EXPECT_EQ(shell("exec >&- 2>&-; exec sleep 1000", 50ms).end, End::timedOut);
  EXPECT_EQ(shell("head -c 1000000 /dev/zero").output.size(), cli::kMaxProgramOutput);
  run = cli::runProgram({"/none/such"}, 1min);
  EXPECT_EQ(run.end, End::notStarted);
  EXPECT_EQ(run.status, ENOENT);
}

TEST(Setup, MailIsCountedWithinBounds) {
  const testsupport::TemporaryDirectory directory;
  std::string deep = directory.path();
  for (size_t i = 0; i <= cli::MailCounter::kMaxDepth; ++i) deep += "/d";
  std::filesystem::create_directories(deep + "/cur");
  std::filesystem::create_directories(deep + "/new");
  EXPECT_FALSE(cli::MailCounter().count(directory.path()).complete);
  // Of a long mailbox the beginning is read.
  constexpr uint64_t kMails = 200000;
  const std::string mbox = directory / "mbox";
  std::ofstream file(mbox);
  for (uint64_t i = 0; i < kMails; ++i) {
    file << "From - Tue Jan 02 03:04:05 2024\nFrom: b@example.org\n\nText\n\n";
  }
  file.close();
  const cli::MailCount count = cli::MailCounter().count(mbox);
  EXPECT_TRUE(count.estimated);
  EXPECT_NEAR(static_cast<double>(count.mails), static_cast<double>(kMails), kMails / 10.0);
  EXPECT_THAT(cli::countText(count), testing::StartsWith("about "));
  EXPECT_FALSE(cli::MailCounter().count(directory / "none").unreadable.empty());
}
