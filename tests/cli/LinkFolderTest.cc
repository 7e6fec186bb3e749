#include <gmock/gmock.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <set>
#include <thread>

#include "cli/LinkFolder.h"
#include "cli/MailWalker.h"
#include "platform/Files.h"
#include "tests/support/TemporaryDirectory.h"

namespace fs = std::filesystem;
using cli::LinkedMail;
using cli::LinkFolder;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

namespace {

class LinkFolderTest : public testing::Test {
 protected:
  // Makes the folder with links to these files; returns the error, empty if there is none.
  [[nodiscard]] std::string make(const std::vector<std::string>& targets) const {
    return makeAt(place, targets);
  }
  [[nodiscard]] static std::string makeAt(const std::string& path,
                                          const std::vector<std::string>& targets) {
    std::optional<TLError> error;
    const auto folder = LinkFolder::begin(path, &error);
    for (const std::string& target : targets) {
      if (folder == nullptr) break;
      folder->addLink({"file" + target, 1707208920, "S", false}, target, &error);
    }
    if (folder != nullptr) folder->publish(&error);
    return error ? error->message : "";
  }

  // What the links of a part point to.
  [[nodiscard]] std::set<std::string> targets(const std::string& part = "cur") const {
    std::set<std::string> found;
    for (const auto& entry : fs::directory_iterator(place + '/' + part)) {
      if (entry.is_symlink()) found.insert(fs::read_symlink(entry.path()).string());
    }
    return found;
  }
  [[nodiscard]] std::set<std::string> namesIn(const std::string& path) const {
    std::set<std::string> found;
    for (const auto& entry : fs::directory_iterator(path)) found.insert(entry.path().filename());
    return found;
  }
  // The only name in a part.
  [[nodiscard]] std::string nameIn(const std::string& part) const {
    const auto names = namesIn(place + '/' + part);
    return names.size() == 1 ? *names.begin() : "";
  }
  static void write(const std::string& path, const std::string& text) {
    std::ofstream(path, std::ios::binary) << text;
  }

  const testsupport::TemporaryDirectory directory;
  const std::string above = directory / "a/b";
  const std::string place = above + "/found";
};

}  // namespace

TEST_F(LinkFolderTest, ANewFolderReplacesTheFormer) {
  EXPECT_EQ(make({"/m/1", "/m/2"}), "");
  EXPECT_THAT(targets(), ElementsAre("/m/1", "/m/2"));
  EXPECT_EQ(make({"/m/2", "/m/3\n\xff", "/m/3\n\xff"}), "");
  EXPECT_THAT(targets(), ElementsAre("/m/2", "/m/3\n\xff"));
  EXPECT_EQ(make({}), "");
  EXPECT_THAT(targets(), IsEmpty());
  EXPECT_THAT(namesIn(place), ElementsAre(".tallow-folder", "cur", "new", "tmp"));
  EXPECT_THAT(namesIn(above), ElementsAre("found"));
  EXPECT_TRUE(cli::isLinkFolder(place));
  EXPECT_FALSE(cli::isLinkFolder(above));
}

TEST_F(LinkFolderTest, NamesHaveOnlyWhatMaildirAllows) {
  std::optional<TLError> error;
  const auto folder = LinkFolder::begin(place + "//./", &error);
  ASSERT_NE(folder, nullptr) << error->message;
  EXPECT_EQ(folder->path(), place);
  EXPECT_TRUE(folder->addLink({"file/x\n/\xff", -5, "S:/\nFaS\x80", false}, "/m/1", &error));
  EXPECT_TRUE(folder->addLink({"file/y", 7, "FS", true}, "/m/2", &error));
  EXPECT_TRUE(folder->addCopy({"mbox/z", 8, "R", false}, "Subject: s\n\nt\n", &error));
  EXPECT_TRUE(folder->addCopy({"mbox/z", 8, "R", false}, "the same again", &error));
  EXPECT_TRUE(folder->publish(&error));
  EXPECT_THAT(namesIn(place + "/cur"),
              ElementsAre(testing::MatchesRegex("0\\.[0-9a-f]{16}\\.tallow:2,FSa"),
                          testing::MatchesRegex("8\\.[0-9a-f]{16}\\.tallow:2,R")));
  EXPECT_THAT(nameIn("new"), testing::MatchesRegex("7\\.[0-9a-f]{16}\\.tallow"));
  const std::string copy = place + "/cur/" + *namesIn(place + "/cur").rbegin();
  EXPECT_EQ(platform::readFile(copy, 100, nullptr), "Subject: s\n\nt\n");
}

// Mail programs rename links for flags, and delete them.
TEST_F(LinkFolderTest, TakesChangesOfMailPrograms) {
  ASSERT_EQ(make({"/m/1", "/m/2"}), "");
  const auto names = namesIn(place + "/cur");
  fs::rename(place + "/cur/" + *names.begin(), place + "/new/" + *names.begin() + "FT");
  fs::remove(place + "/cur/" + *names.rbegin());
  EXPECT_EQ(make({"/m/3"}), "");
  EXPECT_THAT(targets(), ElementsAre("/m/3"));
  EXPECT_THAT(targets("new"), IsEmpty());
}

// Each of these stays as it is, and so does the folder.
TEST_F(LinkFolderTest, LosesNothingOfOthers) {
  fs::create_directories(place);
  EXPECT_EQ(make({"/m/1"}), "");  // an empty directory is free
  const auto expectKept = [this](const std::string& path, const std::string& reason) {
    EXPECT_THAT(make({"/m/9"}), HasSubstr(reason)) << path;
    EXPECT_TRUE(fs::exists(fs::symlink_status(place + path))) << path;
    EXPECT_THAT(targets(), testing::Contains("/m/1")) << path;
    fs::remove_all(place + path);
  };
  for (const char* const path :
       {"/notes", "/cur/1.M1.host:2,S", "/tmp/1", "/new/1.0123456789abcdef.tallow",
        "/.tallow-folder/mine", "/.tallow-folder/0123456789abcdeg"}) {
    write(place + path, "of a person");
    expectKept(path, fs::path(path).filename().string() + " is not from a search");
  }
  fs::create_symlink("/m/5", place + "/cur/mine");
  expectKept("/cur/mine", "cur/mine is not from a search");
  fs::create_directory(place + "/cur/0.0123456789abcdef.tallow:2,");
  expectKept("/cur/0.0123456789abcdef.tallow:2,", "is not from a search");
  EXPECT_EQ(make({"/m/2"}), "");
  EXPECT_THAT(targets(), ElementsAre("/m/2"));
}

TEST_F(LinkFolderTest, RefusesOtherPlaces) {
  fs::create_directories(above);
  fs::create_directories(directory / "mail/cur");
  write(directory / "mail/cur/1", "mail");
  write(above + "/file", "text");
  fs::create_directory_symlink(directory / "mail", above + "/link");
  fs::create_directory(above + "/empty");
  fs::create_directory_symlink(above + "/empty", above + "/toEmpty");
  EXPECT_THAT(makeAt(directory / "mail", {}), HasSubstr("cur is not from a search"));
  EXPECT_THAT(makeAt(above + "/file", {}), HasSubstr("this is a file"));
  EXPECT_THAT(makeAt(above + "/link", {}), HasSubstr("symbolic link"));
  EXPECT_THAT(makeAt(above + "/toEmpty/", {}), HasSubstr("symbolic link"));
  EXPECT_THAT(makeAt(above + "/../b/found", {}), HasSubstr("\"..\""));
  EXPECT_THAT(makeAt(above + "/file/found", {}), HasSubstr("file"));
  EXPECT_THAT(makeAt(above + "/" + std::string(256, 'n'), {}), HasSubstr("too long"));
  EXPECT_THAT(makeAt("/", {}), HasSubstr("cannot be a folder"));
  EXPECT_THAT(makeAt(std::string("/tmp/a\0b", 8), {}), HasSubstr("cannot be a folder"));
  // Parts that are links lead elsewhere.
  ASSERT_EQ(make({}), "");
  fs::remove(place + "/cur");
  fs::create_directory_symlink(directory / "mail/cur", place + "/cur");
  EXPECT_THAT(make({}), HasSubstr("cur is not from a search"));
  EXPECT_EQ(platform::readFile(directory / "mail/cur/1", 100, nullptr), "mail");
  EXPECT_EQ(platform::readFile(above + "/file", 100, nullptr), "text");
  EXPECT_THAT(namesIn(above + "/empty"), IsEmpty());
}

TEST_F(LinkFolderTest, WhatIsNotPublishedVanishes) {
  ASSERT_EQ(make({"/m/1"}), "");
  std::optional<TLError> error;
  {
    const auto folder = LinkFolder::begin(place, &error);
    ASSERT_NE(folder, nullptr);
    EXPECT_TRUE(folder->addLink({"file/m/2", 0, "", false}, "/m/2", &error));
    EXPECT_TRUE(folder->addCopy({"mbox/m/2", 0, "", false}, "text", &error));
    EXPECT_EQ(namesIn(place + "/tmp").size(), 3U);
  }
  EXPECT_THAT(namesIn(place + "/tmp"), IsEmpty());
  EXPECT_THAT(targets(), ElementsAre("/m/1"));
  // A process that is killed leaves links in tmp, or a folder without all parts.
  fs::create_symlink("/m/4", place + "/tmp/0.0123456789abcdef.tallow:2,");
  write(place + "/tmp/0123456789abcdef", "a copy");
  fs::remove_all(place + "/new");
  EXPECT_EQ(make({"/m/3"}), "");
  EXPECT_THAT(namesIn(place), ElementsAre(".tallow-folder", "cur", "new", "tmp"));
  EXPECT_THAT(namesIn(place + "/tmp"), IsEmpty());
  EXPECT_THAT(targets(), ElementsAre("/m/3"));
}

// Mail programs watch the directories, so these stay, and so do links that are found again. A copy
// is made anew.
TEST_F(LinkFolderTest, WhatIsFoundAgainStays) {
  const auto inodeOf = [](const std::string& path) {
    struct stat info {};
    lstat(path.c_str(), &info);
    return info.st_ino;
  };
  std::optional<TLError> error;
  for (const char* const text : {"old", "new"}) {
    const auto folder = LinkFolder::begin(place, &error);
    ASSERT_NE(folder, nullptr) << error->message;
    EXPECT_TRUE(folder->addCopy({"mbox/m/2", 0, "", false}, text, &error));
    EXPECT_TRUE(folder->publish(&error));
  }
  const std::string link = place + "/cur/" + nameIn("cur");
  EXPECT_EQ(platform::readFile(link, 100, nullptr), "new");
  ASSERT_EQ(make({"/m/1"}), "");
  EXPECT_THAT(namesIn(place + "/.tallow-folder"), IsEmpty());
  const std::string kept = place + "/cur/" + nameIn("cur");
  const auto before = std::pair(inodeOf(place + "/cur"), inodeOf(kept));
  ASSERT_EQ(make({"/m/0", "/m/1", "/m/2"}), "");
  EXPECT_EQ(before, std::pair(inodeOf(place + "/cur"), inodeOf(kept)));
  ASSERT_EQ(make({"/m/1"}), "");
  EXPECT_EQ(before, std::pair(inodeOf(place + "/cur"), inodeOf(kept)));
}

TEST_F(LinkFolderTest, SearchesTakeTurns) {
  std::vector<std::jthread> threads;
  for (const std::string name : {"1", "2", "3"}) {
    threads.emplace_back([this, name] {
      for (int i = 0; i < 30; ++i) EXPECT_EQ(make({"/m/" + name, "/m/" + name + "b"}), "");
    });
  }
  threads.clear();
  ASSERT_EQ(targets().size(), 2U);
  EXPECT_EQ(*targets().begin() + "b", *targets().rbegin());
  EXPECT_THAT(namesIn(place), ElementsAre(".tallow-folder", "cur", "new", "tmp"));
}
