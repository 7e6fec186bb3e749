#include <gtest/gtest.h>

#include <random>

#include "cli/Identifier.h"
#include "platform/URL.h"
#include "tests/support/TemporaryDirectory.h"

using cli::fileIdentifier;
using cli::mboxIdentifier;
using cli::parseIdentifier;

TEST(Identifier, NamesThePlaceOfAMessage) {
  EXPECT_EQ(fileIdentifier("/home/m/a.eml"), "file/home/m/a.eml");
  EXPECT_EQ(fileIdentifier("/m/Entwürfe/a b#1?.eml"), "file/m/Entw%C3%BCrfe/a%20b%231%3F.eml");
  EXPECT_EQ(fileIdentifier("/m/\xFF%:@"), "file/m/%FF%25%3A%40");
  EXPECT_EQ(mboxIdentifier("/m/in box", 12), "mbox/m/in%20box?offset=12");
  // Flags are removed only from the names of Maildir files.
  EXPECT_EQ(fileIdentifier("/m/cur/17.M1.host:2,FS"), "file/m/cur/17.M1.host");
  EXPECT_EQ(fileIdentifier("/m/new/17.M1.host"), "file/m/new/17.M1.host");
  EXPECT_EQ(fileIdentifier("/m/cur:2,S/a/x:2,S"), "file/m/cur%3A2%2CS/a/x%3A2%2CS");
}

TEST(Identifier, MakesAStrictURLOfAnyPathAndReadsBack) {
  std::mt19937 random(7);
  for (int round = 0; round < 2000; ++round) {
    std::string path;
    for (size_t i = 0, n = random() % 40; i < n; ++i) {
      path.push_back(static_cast<char>(1 + random() % 255));
    }
    path = "/x/" + path;
    const uint64_t offset = random();
    for (const std::string& identifier : {fileIdentifier(path), mboxIdentifier(path, offset)}) {
      EXPECT_TRUE(TLURL::parse("tlw://mail_bundle_id/" + identifier).has_value()) << identifier;
      const auto location = parseIdentifier(identifier);
      ASSERT_TRUE(location.has_value()) << identifier;
      EXPECT_TRUE(location->path == path || cli::isMaildirFile(path)) << path;
      EXPECT_TRUE(location->offset == offset || identifier.starts_with("file")) << identifier;
    }
  }
}

TEST(Identifier, RejectsOtherForms) {
  for (const char* identifier :
       {"", "file", "x-apple/1", "mbox/a", "mbox/a?offset=", "mbox/a?offset=1x", "file/a%2",
        "file/a%zz", "mbox/a?offset=99999999999999999999999"}) {
    EXPECT_FALSE(parseIdentifier(identifier).has_value()) << identifier;
  }
}

TEST(Identifier, FindsAMaildirFileAfterItsFlagsHaveChanged) {
  const testsupport::TemporaryDirectory directory;
  const std::string cur = directory / "in/cur";
  for (const char* name : {"in/cur/1.a:2,RS", "in/cur/1.ab"}) directory.write(name, "");
  EXPECT_EQ(cli::findMaildirFile(cur + "/1.a"), cur + "/1.a:2,RS");
  EXPECT_EQ(cli::findMaildirFile(cur + "/1.ab"), cur + "/1.ab");
  EXPECT_EQ(cli::findMaildirFile(directory / "in/new/1.a"), cur + "/1.a:2,RS");
  EXPECT_EQ(cli::findMaildirFile(cur + "/2"), cur + "/2");
}
