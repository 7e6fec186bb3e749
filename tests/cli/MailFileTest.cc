#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include "cli/Identifier.h"
#include "cli/LineReader.h"
#include "cli/MailFile.h"
#include "cli/MailWalker.h"
#include "platform/Files.h"
#include "tests/extract/Samples.h"
#include "tests/support/TemporaryDirectory.h"

using testing::ElementsAre;
using testing::IsEmpty;

namespace {

std::string gzip(const std::string& bytes) {
  return samples::compressed(bytes, samples::Compression::gzip);
}

std::string xz(const std::string& bytes) {
  return samples::compressed(bytes, samples::Compression::xz);
}

// Reads one file and records what the sink receives.
class MailFileTest : public testing::Test {
 protected:
  void readFile(const std::string& path, bool named = true) {
    messages.clear();
    places.clear();
    failures.clear();
    ignored = 0;
    const cli::MailSink sink{
        [this](std::string_view bytes, const cli::MessageOrigin& origin) {
          messages.emplace_back(bytes);
          const auto location = cli::parseIdentifier(origin.identifier);
          places.push_back(location->offset ? std::to_string(*location->offset) : "file");
          folder = origin.folderName + " " + origin.folderPath;
          return goOn;
        },
        [this](const std::string& where, const std::string& reason) {
          failures.push_back(where.substr(where.rfind('/') + 1) + ": " + reason);
          return true;
        },
        [this](const std::string&) { ++ignored; }, [](uint64_t) {}};
    finished = cli::readMailFile(path, named, sink);
  }
  void readBytes(const std::string& bytes) { readFile(directory.write("box", bytes)); }

  testsupport::TemporaryDirectory directory;
  std::vector<std::string> messages;
  std::vector<std::string> places;
  std::vector<std::string> failures;
  std::string folder;
  int ignored = 0;
  bool goOn = true;
  bool finished = false;
};

const std::string kFrom = "From m@example.org Mon Jan  8 08:49:00 2024\n";
const std::string kTwo = kFrom + "Subject: a\n\none\n\n" + kFrom + "Subject: b\n\ntwo\n\n";

}  // namespace

TEST_F(MailFileTest, SplitsAnMboxAtItsFromLines) {
  const std::string crlf = "From m@example.org Mon Jan  8 08:49:00 2024\r\n";
  const std::pair<std::string, std::vector<std::string>> cases[] = {
      {kTwo, {"Subject: a\n\none\n", "Subject: b\n\ntwo\n"}},
      {crlf + "A: a\r\n\r\none\r\n\r\n" + crlf + "B: b\r\n\r\ntwo\r\n",
       {"A: a\r\n\r\none\r\n", "B: b\r\n\r\ntwo\r\n"}},
      {kFrom + "A: a\n\nno line feed at the end", {"A: a\n\nno line feed at the end"}},
      {kFrom + "A: a\n\n>From me\n>>From you\n> From us\n>Fromage\n",
       {"A: a\n\nFrom me\n>From you\n> From us\n>Fromage\n"}},
      // A From line does not begin a message after text or without a date.
      {kFrom + "A: a\n\ntext\n" + kFrom + "\nFrom now on it is 2024.\n\nFrom 9:15 we eat.\n",
       {"A: a\n\ntext\n" + kFrom + "\nFrom now on it is 2024.\n\nFrom 9:15 we eat.\n"}},
      {"From whoever\nA: a\n\none\n", {"A: a\n\none\n"}},
      {kFrom, {""}},
      {kFrom + "\n" + kFrom + "A: a\n", {"\n", "A: a\n"}},
  };
  for (const auto& [bytes, expected] : cases) {
    readBytes(bytes);
    EXPECT_EQ(messages, expected) << bytes;
    EXPECT_THAT(failures, IsEmpty());
    EXPECT_TRUE(finished);
  }
  readBytes(kTwo);
  EXPECT_THAT(places, ElementsAre("0", std::to_string(kTwo.size() / 2)));
}

TEST_F(MailFileTest, FromLines) {
  for (const char* line :
       {"From a@b Thu Aug 22 12:36:23 2002\n", "From - Thu Aug 22 12:36:23 2002\r\n",
        "From a Thu Aug 22 9:05 EDT 2002", "From a@b Thu Aug 22 12:36:23 2002 +0200\n"}) {
    EXPECT_TRUE(cli::isFromLine(line)) << line;
  }
  for (const char* line : {"From", "From \n", "from a Thu Aug 22 12:36:23 2002\n",
                           ">From a Thu Aug 22 12:36:23 2002\n", "From 10:30 to 2100x\n",
                           "From x:30 2002\n", "From 1830 to 1899 at 10:30\n"}) {
    EXPECT_FALSE(cli::isFromLine(line)) << line;
  }
}

TEST_F(MailFileTest, LinesLongerThanTheBufferStayWhole) {
  constexpr size_t kBuffer = cli::LineReader::kBufferBytes;
  for (const size_t size : {kBuffer - 1, kBuffer, kBuffer + 1, 3 * kBuffer + 7}) {
    // "From " inside a long line has no meaning, even at the start of a buffer.
    std::string line(size, 'x');
    for (size_t at = 0; at + kFrom.size() < size; at += kBuffer / 2) line.replace(at, 5, "From ");
    const std::string first = "A: a\n\n" + line + "\n";
    readBytes(kFrom + first + "\n" + kFrom + "B: b\n\ntwo\n");
    ASSERT_EQ(messages.size(), 2u) << size;
    EXPECT_TRUE(messages[0] == first) << size;
  }
}

TEST_F(MailFileTest, ReportsATooLongMessageAndReadsTheNext) {
  std::string big = kFrom + "A: a\n\n";
  big.append(cli::kMaxMessageBytes, 'x');
  readBytes(big + "\n\n" + kFrom + "B: b\n\ntwo\n");
  EXPECT_THAT(failures, ElementsAre("box:0: longer than 64 MiB"));
  EXPECT_THAT(messages, ElementsAre("B: b\n\ntwo\n"));
}

TEST_F(MailFileTest, CompressedFilesReadLikePlainOnes) {
  const std::string tail = kFrom + "Subject: c\n\nthree\n";
  const std::vector<std::string> all{"Subject: a\n\none\n", "Subject: b\n\ntwo\n",
                                     "Subject: c\n\nthree\n"};
  for (const std::string& bytes :
       {gzip(kTwo + tail), gzip(kTwo) + gzip(tail), gzip(kTwo + tail) + std::string(512, '\0'),
        xz(kTwo + tail), xz(kTwo) + xz(tail)}) {
    readBytes(bytes);
    EXPECT_EQ(messages, all);
    EXPECT_THAT(failures, IsEmpty());
  }
}

// Truncated at any place: complete messages are read and the rest is reported.
TEST_F(MailFileTest, TruncatedCompressionIsReported) {
  for (const std::string& bytes : {gzip(kTwo), xz(kTwo)}) {
    for (size_t size = 6; size < bytes.size(); ++size) {
      readBytes(bytes.substr(0, size));
      ASSERT_EQ(failures.size(), 1u) << size;
      EXPECT_NE(failures[0].find("the compressed data ends early"), std::string::npos);
      EXPECT_LE(messages.size(), 1u);
    }
    std::string damaged = bytes;
    for (size_t i = bytes.size() / 2; i < bytes.size() / 2 + 8; ++i) damaged[i] = '\x55';
    readBytes(damaged);
    EXPECT_EQ(failures.size(), 1u);
  }
}

TEST_F(MailFileTest, DetectsTheKindOfAFile) {
  const std::string message = "Subject: a\nfrom: b\n\ntext\n";
  const std::tuple<const char*, std::string, bool, size_t, size_t, int> cases[] = {
      {"empty", "", true, 0, 0, 0},
      {"message", message, false, 1, 0, 0},
      {"message.gz", gzip(message), false, 1, 0, 0},
      {"a.eml", "anything", false, 1, 0, 0},
      {"notes.txt", "Dear diary", false, 0, 0, 1},
      {"notes.txt", "Dear diary", true, 0, 1, 0},
      {"settings", "key: value\n", false, 0, 0, 1},
  };
  for (const auto& [name, bytes, named, read, failed, passed] : cases) {
    readFile(directory.write(name, bytes), named);
    EXPECT_EQ(messages.size(), read) << name;
    EXPECT_EQ(failures.size(), failed) << name;
    EXPECT_EQ(ignored, passed) << name;
  }
  readFile(directory / "nowhere");
  EXPECT_THAT(failures, ElementsAre("nowhere: cannot open: No such file or directory"));
  mkfifo((directory / "pipe").c_str(), 0600);
  readFile(directory / "pipe");
  EXPECT_THAT(failures, ElementsAre("pipe: not a regular file"));
}

TEST_F(MailFileTest, FoldersAreNamedAfterTheirPlace) {
  readFile(directory.write(".Sent/cur/1:2,S", "A: a\n\n"));
  EXPECT_EQ(folder, "Sent " + directory / ".Sent");
  readFile(directory.write("plain.eml", "A: a\n\n"));
  EXPECT_EQ(folder.substr(folder.find(' ') + 1), directory.path());
  readFile(directory.write("archive.mbox.gz", gzip(kTwo)));
  EXPECT_EQ(folder, "archive " + directory / "archive.mbox.gz");
}

TEST_F(MailFileTest, ASinkCanStop) {
  goOn = false;
  readBytes(kTwo);
  EXPECT_EQ(messages.size(), 1u);
  EXPECT_FALSE(finished);
}

TEST_F(MailFileTest, VisitsEachFileOnceDespiteLoops) {
  for (const char* name : {"z", "a", "b/cur/2", "b/cur/1", "b/tmp/half", "tmp/kept"}) {
    directory.write(name, "x");
  }
  ASSERT_EQ(symlink(directory.path().c_str(), (directory / "b/loop").c_str()), 0);
  ASSERT_EQ(symlink((directory / "a").c_str(), (directory / "link").c_str()), 0);
  ASSERT_EQ(symlink("nowhere", (directory / "dangling").c_str()), 0);
  mkfifo((directory / "pipe").c_str(), 0600);
  std::vector<std::string> visited;
  const auto walk = [&](const std::string& path) {
    visited.clear();
    return cli::walkMail(
        path, {[&](const std::string& file, bool named, uint64_t size) {
                 visited.push_back(file.substr(directory.path().size() + 1) + (named ? "!" : ""));
                 EXPECT_EQ(size, 1u);
                 return visited.size() < 7;
               },
               [&](const std::string&, const std::string& reason) {
                 visited.push_back(reason);
                 return true;
               }});
  };
  EXPECT_TRUE(walk(directory / "b/.."));
  EXPECT_THAT(visited, ElementsAre("a", "link", "z", "b/cur/1", "b/cur/2", "tmp/kept"));
  EXPECT_TRUE(walk(directory / "b/loop/a"));
  EXPECT_THAT(visited, ElementsAre("a!"));
  EXPECT_TRUE(walk(directory / "none"));
  EXPECT_THAT(visited, ElementsAre("cannot open: No such file or directory"));
}

TEST_F(MailFileTest, StopsAtTheMaximumDepth) {
  std::string deep = directory.path();
  for (size_t i = 0; i < cli::kMaxDirectoryDepth + 3; ++i) deep += "/d";
  platform::createDirectories(deep, nullptr);
  int failed = 0;
  cli::walkMail(directory.path(), {[](const std::string&, bool, uint64_t) { return true; },
                                   [&](const std::string&, const std::string& reason) {
                                     EXPECT_EQ(reason, "more than 64 directories deep");
                                     ++failed;
                                     return true;
                                   }});
  EXPECT_EQ(failed, 1);
}
