#include <fmt/format.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "cli/LastSearch.h"
#include "tests/support/TemporaryDirectory.h"

namespace fs = std::filesystem;

namespace {

class LastSearchTest : public testing::Test {
 protected:
  LastSearchTest() {
    setenv("XDG_RUNTIME_DIR", (home / "run").c_str(), 1);
    setenv("XDG_STATE_HOME", (home / "state").c_str(), 1);
    nameSession("a");
  }
  static void nameSession(const std::string& name) { setenv("TALLOW_SESSION", name.c_str(), 1); }

  const testsupport::TemporaryDirectory home;
};

}  // namespace

TEST_F(LastSearchTest, EachSessionHasItsOwn) {
  EXPECT_FALSE(cli::lastSearch());
  cli::keepLastSearch({"tea \x1b", {{3, "file/a"}, {7, "other:\xFF"}}});
  nameSession("../b/" + std::string(300, 'x'));
  EXPECT_FALSE(cli::lastSearch());
  cli::keepLastSearch({"milk", {}});
  EXPECT_EQ(cli::lastSearch()->words, "milk");
  nameSession("a");
  EXPECT_EQ(cli::lastSearch()->words, "tea \x1b");
  EXPECT_EQ(cli::lastSearch()->results,
            (std::map<size_t, std::string>{{3, "file/a"}, {7, "other:\uFFFD"}}));
  const std::string place = home / "state/tallow/searches";
  for (const auto& entry : fs::directory_iterator(place)) {
    EXPECT_EQ(entry.status().permissions(), fs::perms::owner_read | fs::perms::owner_write);
  }
  // The daemon's directory is used if it exists, and not created.
  EXPECT_FALSE(fs::exists(home / "run"));
  fs::create_directories(home / "run/tallow");
  EXPECT_FALSE(cli::lastSearch());
  cli::keepLastSearch({"milk", {{1, "file/b"}}});
  EXPECT_TRUE(fs::exists(home / "run/tallow/searches/named-a"));
}

TEST_F(LastSearchTest, BoundsAndDamage) {
  for (size_t i = 0; i < cli::kMaxSessions + 5; ++i) {
    nameSession(fmt::format("s{}", i));
    cli::keepLastSearch({"x", {}});
  }
  const std::string place = home / "state/tallow/searches";
  EXPECT_EQ(static_cast<size_t>(std::distance(fs::directory_iterator(place), {})),
            cli::kMaxSessions);
  EXPECT_TRUE(cli::lastSearch());
  cli::LastSearch many{"x"};
  for (size_t i = 0; i < 2 * cli::LastSearch::kMaxResults; ++i) many.results[i] = "file/x";
  cli::keepLastSearch(many);
  EXPECT_EQ(cli::lastSearch()->results.size(), cli::LastSearch::kMaxResults);
  for (const char* const text :
       {"", "{}", "[1", R"({"words":1,"results":[]})", R"({"words":"","results":[[-1,2]]})"}) {
    std::ofstream(place + "/named-a") << text;
    nameSession("a");
    EXPECT_FALSE(cli::lastSearch()) << text;
  }
}
