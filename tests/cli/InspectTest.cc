#include <gmock/gmock.h>

#include <csignal>
#include <cstdio>
#include <filesystem>
#include <nlohmann/json.hpp>

#include "cli/Terminal.h"
#include "client/SearchServiceProxy.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "platform/ProcessLock.h"
#include "salt/Quarantine.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/ShellTest.h"

// The client and the program that it runs, on an index made by the test.
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::StartsWith;

class InspectTest : public testsupport::ShellTest {
 protected:
  InspectTest() {
    tallow = TALLOW_PROGRAM " --state-dir " + state;
    // The lock file that a daemon leaves.
    static_cast<void>(platform::ProcessLock::acquire(platform::processLockPath(state), nullptr));
    platform::createDirectories(platform::joinPath(platform::dataRoot(state), "default"), nullptr);
  }

  // All files of the state, with their contents.
  [[nodiscard]] std::map<std::string, std::string> files() const {
    std::map<std::string, std::string> all;
    for (const auto& entry : fs::recursive_directory_iterator(state)) {
      const bool file = entry.is_regular_file();
      all[entry.path()] = file ? read(fs::relative(entry, directory.path())) : "";
    }
    return all;
  }

  // An index with one zone of 8 words and one page of the given suffixes.
  void makeIndex(const std::vector<salt::SuffixMeta>& page) const {
    auto made = salttest::newIndex(index);
    ASSERT_TRUE(salttest::addZone(*made, 1, 1, "aa ab ba abcd", {}));
    const std::string first = made->GetSuffixText(page.front());
    made.reset();
    salttest::writePage(index, 1, first, page);
  }
  void makeLargeIndex() const {
    const auto made = salttest::newIndex(index);
    std::string text;
    while (text.size() < 20000) text += "word ";
    for (uint32_t docID = 1; docID <= 5; ++docID) {
      ASSERT_TRUE(salttest::addZone(*made, docID, 1, text, salttest::wordOffsets(text)));
    }
  }

  const std::string state = directory / "state";
  const std::string index = platform::textIndexPath(platform::dataRoot(state), "default");
};

const salt::SuffixMeta kFirst{1, 0, 1, 0, {}};
const salt::SuffixMeta kSecond{1, 3, 1, 1, {'b', ' '}};

}  // namespace

TEST_F(InspectTest, DumpMatchesTheIndexAndChangesNothing) {
  makeIndex({kFirst, kSecond});
  auto made = salttest::loadIndex(index);
  ASSERT_TRUE(salttest::addZone(*made, 2, 4, "\x1b[31m red \xe4\xba\xac\xe9\x83\xbd", {0, 6}));
  ASSERT_TRUE(salttest::addZone(*made, 3, 4, "fifteen bytes..\xe4\xba\xac", {0}));
  ASSERT_TRUE(made->DeleteDoc(2));
  const std::string dump = made->Dump();
  made.reset();
  platform::writeFileAtomically(index + "/notes.log", "a log of another kind", nullptr);
  platform::createDirectories(index + "/999999.ldb/000001.log", nullptr);
  const auto before = files();
  EXPECT_EQ(outputOf("dump"), cli::cleanLinesForTerminal(dump));
  EXPECT_THAT(output, HasSubstr("---- [2,4:0]: \"\uFFFD[31m red \u4eac\u90fd\"\n"));
  EXPECT_EQ(run("validate"), 0) << errors;
  EXPECT_EQ(errors, "");
  EXPECT_EQ(files(), before);
}

TEST_F(InspectTest, ValidateReportsTheLatestIndexSetAside) {
  makeIndex({kFirst, kSecond});
  EXPECT_EQ(run("validate"), 0);
  EXPECT_EQ(errors, "");
  ASSERT_TRUE(salt::setAside(index, nullptr));
  makeIndex({kFirst, kSecond});
  const auto second = salt::setAside(index, nullptr);
  ASSERT_TRUE(second);
  makeIndex({kFirst, kSecond});
  EXPECT_EQ(salt::indexesSetAside(index), std::vector{*second});
  EXPECT_EQ(run("validate"), 0);
  EXPECT_THAT(errors, HasSubstr("has been set aside: " + *second + "\n"));
}

TEST_F(InspectTest, TwoCrashesOfOneHourAreOneTooMany) {
  const std::pair<std::string, bool> cases[] = {
      {"", false},           {"10\n", false},           {"10\n3609\n", true},
      {"10\n3610\n", false}, {"10\n20\n5000\n", false}, {"10\nrubbish\n\n20", true},
  };
  for (const auto& [notes, twice] : cases) {
    ASSERT_TRUE(platform::writeFileAtomically(salt::crashNotesPath(index), notes, nullptr));
    EXPECT_EQ(salt::hasCrashedTwice(index), twice) << notes;
  }
}

TEST_F(InspectTest, ClosedPipeEndsTheDump) {
  makeLargeIndex();
  EXPECT_EQ(outputOfShell("{ " + tallow + " dump; echo $? >&2; } | head -n 1"),
            "SALT INDEX METRICS\n");
  EXPECT_EQ(errors, "2\n");
}

TEST_F(InspectTest, ValidateReportsEachFault) {
  const std::vector good{kFirst, kSecond};
  const std::string pageKey(
      "\x01"
      "aa ab ba abcd\0\x01\0\x01",
      18);
  const std::string shortPage("\x02", 1);
  const std::string otherOptions(48, '\0');
  const std::tuple<std::vector<salt::SuffixMeta>, std::function<void()>, int, std::string, int>
      cases[] = {
          {good, [] {}, 0, "", 0},
          {{kSecond, kFirst}, [] {}, 1, "SALT Validation failed: Out of order.", 0},
          {good, [&] { salttest::editMetrics(index, [](auto& m) { m.Pages = m.Suffixes = 9; }); },
           0, "SALT Validation failed: # of suffixes: 2 != 9.", 0},
          {good, [&] { salttest::editMetrics(index, [](auto& m) { m.CodeVersion = 305; }); }, 1,
           "SALT Loading failure: Mismatched code version.", 2},
          {good, [&] { salttest::editKey(index, pageKey, &shortPage); }, 1,
           "Assertion failed: s.size()", 2},
          {good, [&] { salttest::editKey(index, "\xFFOPTIONS", &otherOptions); }, 1,
           "Assertion failed: op.Valid()", 2},
      };
  for (const auto& [page, damage, status, line, dumpStatus] : cases) {
    makeIndex(page);
    damage();
    const auto before = files();
    EXPECT_EQ(run("validate"), status) << line;
    EXPECT_THAT(output, StartsWith(status == 0 ? "valid\n" : "not valid\n"));
    EXPECT_THAT(errors, HasSubstr(line));
    EXPECT_EQ(run("validate --format=json"), status) << line;
    EXPECT_EQ(nlohmann::json::parse(output).at("valid"), status == 0);
    EXPECT_EQ(run("dump"), dumpStatus) << line;
    EXPECT_EQ(files(), before) << line;
  }
}

TEST_F(InspectTest, CountsWhatItFinds) {
  makeIndex({kFirst, kSecond});
  auto made = salttest::loadIndex(index);
  ASSERT_TRUE(salttest::addZone(*made, 2, 4, "gone"));
  ASSERT_TRUE(made->DeleteDoc(2));
  made.reset();
  EXPECT_EQ(nlohmann::json::parse(outputOf("validate --format=json")),
            nlohmann::json::parse(R"({"valid": true, "documents": 1, "deletedDocuments": 1,
                "zones": 1, "textBytes": 13, "suffixes": 3, "hotSuffixes": 1, "pages": 1,
                "shards": 1})"));
}

TEST_F(InspectTest, RefusesAnIndexInUse) {
  makeIndex({kFirst});
  {
    testsupport::DaemonProcess daemon(directory.path());
    ASSERT_TRUE(daemon.ready());
    const auto before = files();
    for (const char* command : {"dump", "validate", "validate --class other"}) {
      EXPECT_EQ(run(command), 3) << command;
      EXPECT_EQ(output, "");
      EXPECT_THAT(errors, HasSubstr("tallowsearchd.lock is held by a running daemon"));
    }
    EXPECT_EQ(files(), before);
    daemon.signal(SIGKILL);
    daemon.wait();
  }
  EXPECT_EQ(run("validate"), 0);
}

// A daemon may start while the index is inspected; its changes are not visible.
TEST_F(InspectTest, DaemonCanStartDuringADump) {
  makeLargeIndex();
  const std::string dump = salttest::loadIndex(index)->Dump();
  FILE* const pipe = popen((TALLOW_INSPECT_PROGRAM " dump " + state + " default").c_str(), "r");
  std::string text(1, static_cast<char>(fgetc(pipe)));
  {
    const testsupport::DaemonProcess daemon(directory.path());
    ASSERT_TRUE(daemon.ready());
    client::SearchServiceProxy service(daemon.runtimeDirectory());
    ASSERT_TRUE(service.deleteAllItems("test", "default", nullptr));
  }
  EXPECT_NE(salttest::loadIndex(index)->Dump(), dump);
  char piece[4096];
  while (const size_t size = fread(piece, 1, sizeof piece, pipe)) text.append(piece, size);
  EXPECT_EQ(pclose(pipe), 0);
  EXPECT_EQ(text, dump);
}

TEST_F(InspectTest, FindsTheStateOfTheDaemonByItself) {
  makeIndex({kFirst});
  for (const char* base : {"state-home", "config-home", "home/.local/state", "home/.config"}) {
    platform::createDirectories(directory / base, nullptr);
    fs::create_directory_symlink(state, directory / base + "/tallow");
  }
  const std::string elsewhere = "HOME=" + directory / "no" + " XDG_STATE_HOME= XDG_CONFIG_HOME= ";
  const std::string places[] = {
      elsewhere + "STATE_DIRECTORY=" + state,
      elsewhere + "XDG_STATE_HOME=" + directory / "state-home",
      elsewhere + "XDG_CONFIG_HOME=" + directory / "config-home",
      elsewhere + "HOME=" + directory / "home",
  };
  for (const std::string& place : places) {
    outputOfShell("env -u STATE_DIRECTORY " + place + " " TALLOW_PROGRAM " validate");
  }
}

TEST_F(InspectTest, CreatesNothingWithoutAnIndex) {
  makeIndex({kFirst});
  const auto before = files();
  for (const char* command : {"validate", "dump"}) {
    for (const auto& [place, reason] :
         {std::pair(" --class none", "none/salt: No such file or directory"),
          {" --class ../TallowSearch/default", "must name one directory"}}) {
      EXPECT_THAT(errorsOf(std::string(command) + place), HasSubstr(reason));
    }
    EXPECT_EQ(shell(TALLOW_PROGRAM " --state-dir none " + std::string(command)), 2);
    EXPECT_THAT(errors, HasSubstr("tallowsearchd.lock: No such file or directory"));
  }
  EXPECT_EQ(run("dump --format=json"), 2);
  EXPECT_EQ(files(), before);
  EXPECT_FALSE(platform::fileExists(directory / "none"));
}
