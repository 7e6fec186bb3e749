#include <gmock/gmock.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <random>
#include <thread>

#include "mcp/FolderLimit.h"
#include "mcp/LineInput.h"
#include "mcp/Session.h"
#include "mcp/ShownText.h"
#include "tests/support/Damage.h"
#include "tests/support/Seed.h"
#include "tests/support/TemporaryDirectory.h"

// The parts of `tallow mcp` that keep its limits.

namespace {

// Reads all lines of a text that is written through a pipe; "(too long)" for those.
std::vector<std::string> linesOf(const std::string& text) {
  int ends[2];
  EXPECT_EQ(pipe(ends), 0);
  std::thread writer([&] {
    for (size_t at = 0; at < text.size();) {
      const ssize_t count = write(ends[1], text.data() + at, text.size() - at);
      if (count < 0) break;
      at += static_cast<size_t>(count);
    }
    close(ends[1]);
  });
  std::vector<std::string> lines;
  mcp::LineInput input(ends[0]);
  while (const auto line = input.next()) lines.push_back(line->tooLong ? "(too long)" : line->text);
  writer.join();
  close(ends[0]);
  return lines;
}

}  // namespace

TEST(McpLineInputTest, SplitsLinesAndSkipsLongOnes) {
  using testing::ElementsAre;
  EXPECT_THAT(linesOf(""), ElementsAre());
  EXPECT_THAT(linesOf("a\n\nb"), ElementsAre("a", "", "b"));
  const std::string full(mcp::kMaxLineBytes, 'x');
  EXPECT_THAT(linesOf(full + "\nb\n"), ElementsAre(full, "b"));
  EXPECT_THAT(linesOf(full + "x\nb\n"), ElementsAre("(too long)", "b"));
  EXPECT_THAT(linesOf("a\n" + full + full + full), ElementsAre("a", "(too long)"));
}

TEST(McpShownTextTest, RemovesWhatPeopleDoNotSee) {
  EXPECT_EQ(mcp::shownText("a\x1b[31mb", 10), "a\uFFFD[31mb");
  EXPECT_EQ(mcp::shownText("a\u202Eb\u200Bc\u2066d\u00ADe\uFEFFf\U000E0041g\uFE0Fh", 20),
            "abcdefgh");
  EXPECT_EQ(mcp::shownText("\U000DFFFF\U000F0000", 9), "\U000DFFFF\U000F0000");
  EXPECT_EQ(mcp::shownText("a\nb\xff", 10), "a\nb\uFFFD");
}

TEST(McpShownTextTest, CutsBetweenCodePoints) {
  EXPECT_EQ(mcp::shownText("äöü", 3), "äöü");
  EXPECT_EQ(mcp::shownText("äöü", 2), "äö…");
  EXPECT_EQ(mcp::shownText("", 0), "");
  EXPECT_EQ(mcp::shownText(std::string(5000000, 'a'), 2), "aa…");
  size_t next = 7;
  EXPECT_EQ(mcp::partOf("a京b都", 1, 2, next), "京b");
  EXPECT_EQ(next, 3U);
  EXPECT_EQ(mcp::partOf("a京b都", 3, 2, next), "都");
  EXPECT_EQ(next, 0U);
  EXPECT_EQ(mcp::partOf("a京b都", 4, 2, next), "");
  EXPECT_EQ(mcp::partOf("a京b都", 99, 2, next), "");
  EXPECT_EQ(next, 0U);
}

TEST(McpFolderLimitTest, AllowsByTheResolvedPath) {
  namespace fs = std::filesystem;
  const testsupport::TemporaryDirectory directory;
  for (const char* const name : {"in/cur/1:2,S", "in/mail", "in/box", "inside/mail", "out/mail"}) {
    directory.write(name, "Subject: a\n\nb\n");
  }
  fs::create_symlink(directory / "out/mail", directory / "in/link");
  fs::create_symlink(directory / "out", directory / "in/folder");
  fs::create_symlink(directory / "in/mail", directory / "out/back");
  const auto limit = mcp::FolderLimit::of({directory / "in"});
  ASSERT_TRUE(std::holds_alternative<mcp::FolderLimit>(limit));
  const auto& allowed = std::get<mcp::FolderLimit>(limit);
  cli::MailReader reader;
  const auto allows = [&](const std::string& before, const std::string& after) {
    return allowed.allows(before + directory.path() + after, reader);
  };
  EXPECT_TRUE(allows("file", "/in/mail"));
  EXPECT_TRUE(allows("file", "/in/cur/1"));
  EXPECT_TRUE(allows("mbox", "/in/box?offset=0"));
  EXPECT_TRUE(allows("mbox", "/in/box?message=aa"));
  EXPECT_TRUE(allows("file", "/out/back"));
  for (const char* const wrong :
       {"/in/link", "/in/folder/mail", "/inside/mail", "/out/mail", "/in/../out/mail",
        "/in/%2E%2E/out/mail", "/in/none", "/in/cur/2", "/in/mail%00", ""}) {
    EXPECT_FALSE(allows("file", wrong)) << wrong;
  }
  EXPECT_FALSE(allows("message", "/in/mail"));
  EXPECT_FALSE(allowed.allows("", reader));
  EXPECT_TRUE(allowed.allowsPath(directory / "in"));
}

TEST(McpListedMailTest, ForgetsTheOldest) {
  mcp::ListedMail listed;
  for (size_t i = 0; i <= mcp::ListedMail::kMaxListed; ++i) listed.add(std::to_string(i));
  EXPECT_FALSE(listed.holds("0"));
  EXPECT_TRUE(listed.holds("1"));
  EXPECT_TRUE(listed.holds(std::to_string(mcp::ListedMail::kMaxListed)));
}

// Whatever a client sends, the reply is one line of JSON, or nothing, and the session goes on.
TEST(McpSessionTest, DamagedMessagesEndNothing) {
  const testsupport::TemporaryDirectory directory;
  setenv("XDG_STATE_HOME", directory.path().c_str(), 1);
  cli::Options options;
  options.runtimeDirectory = directory / "run";
  mcp::MailTools tools(options,
                       std::get<mcp::FolderLimit>(mcp::FolderLimit::of({directory.path()})));
  mcp::Session session(tools, "0");
  const std::string messages[] = {
      R"({"jsonrpc":"2.0","id":1,"method":"initialize","params":{"protocolVersion":"2025-03-26"}})",
      R"([{"jsonrpc":"2.0","id":2,"method":"ping"},{"jsonrpc":"2.0","id":3,"method":"tools/list"}])",
      R"({"jsonrpc":"2.0","id":"4","method":"tools/call","params":{"name":"search","arguments":)"
      R"({"query":"from:mara \"a b\" OR (c -d","limit":5}}})",
      R"({"jsonrpc":"2.0","id":5,"method":"tools/call","params":{"name":"show","arguments":)"
      R"({"id":"file/a%2Fb","from":7}}})",
      R"({"jsonrpc":"2.0","id":6,"method":"tools/call","params":{"name":"status"}})",
      R"({"jsonrpc":"2.0","id":[8],"method":"ping"})",
      R"({"jsonrpc":"2.0","id":9,"method":7})"};
  std::mt19937 random(testsupport::firstSeed());
  for (int round = 0; round < 5000; ++round) {
    std::string line = messages[random() % std::size(messages)];
    if (round % 4 != 0) line = testsupport::damaged(line, 3, random);
    const std::string reply = session.answer(line);
    EXPECT_EQ(reply.find('\n'), std::string::npos) << line;
    EXPECT_TRUE(reply.empty() || nlohmann::json::accept(reply)) << line << '\n' << reply;
  }
  EXPECT_EQ(session.answer(R"({"jsonrpc":"2.0","id":7,"method":"ping"})"),
            R"({"jsonrpc":"2.0","id":7,"result":{}})");
}
