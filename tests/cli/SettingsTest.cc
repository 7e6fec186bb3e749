#include <gmock/gmock.h>

#include <filesystem>

#include "cli/Mailboxes.h"
#include "cli/Settings.h"
#include "tests/support/TemporaryDirectory.h"

using testing::ElementsAre;
using testing::HasSubstr;
using testing::Pair;

namespace {

cli::Settings settingsOf(const std::string& text) {
  auto result = cli::parseSettings(text, "config.toml", "/home/mara");
  const auto* const wrong = std::get_if<std::string>(&result);
  EXPECT_EQ(wrong, nullptr) << *wrong;
  return wrong == nullptr ? std::get<cli::Settings>(result) : cli::Settings();
}

std::string complaintOf(const std::string& text) {
  const auto result = cli::parseSettings(text, "config.toml", "/home/mara");
  const auto* const wrong = std::get_if<std::string>(&result);
  return wrong == nullptr ? "" : *wrong;
}

}  // namespace

TEST(Settings, EachKey) {
  const cli::Settings settings = settingsOf(R"(
roots = ["~/Mail", "/srv/mail.mbox", "~"]
exclude = [".Trash", "~/Mail/old", "Lists/noise"]
largest_mail = "20 MB"
on_battery = true
attachments = false
desktop_search = true
desktop_class = "work"
mcp_folders = ["~/Mail/lists"]
[class]
"~/Mail/work" = "work"
)");
  EXPECT_THAT(settings.roots, ElementsAre("/home/mara/Mail", "/srv/mail.mbox", "/home/mara"));
  EXPECT_THAT(settings.excluded, ElementsAre("/home/mara/Mail/old"));
  EXPECT_THAT(settings.excludedNames, ElementsAre(".Trash", "Lists/noise"));
  EXPECT_THAT(settings.classes, ElementsAre(Pair("/home/mara/Mail/work", "work")));
  EXPECT_EQ(settings.largestMail, 20'000'000U);
  EXPECT_TRUE(settings.onBattery);
  EXPECT_FALSE(settings.attachments);
  EXPECT_TRUE(settingsOf("").attachments);
  EXPECT_TRUE(settings.desktopSearch);
  EXPECT_EQ(settings.desktopClass, "work");
  EXPECT_FALSE(settingsOf("").desktopSearch);
  EXPECT_EQ(settingsOf("").desktopClass, "default");
  EXPECT_THAT(settings.mcpFolders, ElementsAre("/home/mara/Mail/lists"));
  EXPECT_EQ(settingsOf("largest_mail = 5000").largestMail, 5000U);
  EXPECT_EQ(settingsOf("largest_mail = '500KB'").largestMail, 500'000U);
  EXPECT_EQ(settingsOf("").largestMail, 0U);
}

TEST(Settings, ErrorsNameFileLineKeyAndAllowedValues) {
  EXPECT_EQ(complaintOf("\nrots = []"),
            "config.toml:2: there is no key \"rots\"; did you mean \"roots\"?");
  EXPECT_EQ(complaintOf("colour = 1"),
            "config.toml:1: there is no key \"colour\"; the keys are roots, exclude, class, "
            "largest_mail, on_battery, attachments, desktop_search, desktop_class, mcp_folders");
  EXPECT_EQ(complaintOf("# a\n\non_battery = \"yes\""),
            "config.toml:3: on_battery takes true or false");
  const std::pair<std::string, std::vector<std::string>> wrong[] = {
      {"roots", {"1", "[1]", "['Mail']", "[\"/a\\u0000b\"]"}},
      {"exclude", {"['']", "'a'"}},
      {"largest_mail", {"10", "-1", "'1 GB'", "'99999999999999999999 KB'", "99999999999"}},
      {"on_battery", {"1"}},
      {"attachments", {"1"}},
      {"desktop_search", {"1"}},
      {"desktop_class", {"'a/b'"}},
      {"class", {"1", "{'work' = 'a'}", "{'/work' = ''}", "{'/work' = '../a'}", "{'/work' = 1}"}},
  };
  for (const auto& [key, values] : wrong) {
    for (const std::string& value : values) {
      EXPECT_THAT(complaintOf(key + " = " + value), HasSubstr(" takes ")) << key << value;
    }
  }
  for (const std::string& bad :
       {std::string("roots = ["), std::string("= 1"), std::string("roots = []\nroots = []"),
        std::string("roots = ['\xff']"), "roots = " + std::string(100000, '[')}) {
    EXPECT_THAT(complaintOf(bad), HasSubstr("config.toml:")) << bad.substr(0, 20);
  }
}

TEST(Settings, MailboxesByClass) {
  const testsupport::TemporaryDirectory directory;
  const std::string mail = directory / "mail";
  std::filesystem::create_directories(mail);
  std::filesystem::create_directory_symlink(mail, directory / "link");
  cli::Settings settings;
  settings.excludedNames = {".Trash"};
  settings.classes[directory / "link/work"] = "work";
  const auto groupsOf = [&](const std::vector<std::string>& paths, bool all) {
    return std::get<std::vector<cli::MailboxGroup>>(
        cli::groupMailboxes(settings, paths, "default", all));
  };
  auto groups = groupsOf({mail, directory / "link/below"}, true);
  ASSERT_EQ(groups.size(), 2U);
  EXPECT_EQ(groups[0].protectionClass, "default");
  EXPECT_THAT(groups[0].roots, ElementsAre(mail));
  EXPECT_THAT(groups[0].excluded, ElementsAre(mail + "/.Trash", mail + "/work"));
  EXPECT_EQ(groups[1].protectionClass, "work");
  EXPECT_THAT(groups[1].roots, ElementsAre(mail + "/work"));
  EXPECT_THAT(groups[1].excluded, ElementsAre(mail + "/work/.Trash"));
  // A path in such a folder has the folder's class.
  groups = groupsOf({mail + "/work/plans"}, false);
  ASSERT_EQ(groups.size(), 1U);
  EXPECT_EQ(groups[0].protectionClass, "work");
  settings.classes[mail + "/work/plans"] = "default";
  const auto nested = cli::groupMailboxes(settings, {mail}, "default", true);
  EXPECT_THAT(std::get<std::string>(nested), HasSubstr("lies in"));
}
