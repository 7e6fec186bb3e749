#include <algorithm>
#include <cstdlib>

#include "platform/Files.h"
#include "records/TLAttributeKey.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/ShellTest.h"

// The statements of tallow-query(7) and tallow-search(7) are true.
namespace {

std::string readAll(const std::string& path) {
  return platform::readFile(path, size_t{1} << 20, nullptr).value_or("");
}

// A line of the page as displayed.
std::string shown(std::string line) {
  for (const auto& [escape, text] : {std::pair("\\-", "-"), {"\\(aq", "'"}, {"\\e", "\\"}}) {
    for (size_t at; (at = line.find(escape)) != std::string::npos;) {
      line.replace(at, std::string_view(escape).size(), text);
    }
  }
  return line;
}

struct Example {
  std::string command;
  size_t found;  // of the sample mail, by the comment before it
};

std::vector<Example> examplesOf(const std::string& page) {
  const std::string mark = ".\\\" sample mail: ";
  std::vector<Example> examples;
  for (size_t at = page.find(mark); at != std::string::npos; at = page.find(mark, at + 1)) {
    const size_t line = page.find('\n', at) + 1;
    examples.push_back({shown(page.substr(line, page.find('\n', line) - line)),
                        std::strtoull(page.c_str() + at + mark.size(), nullptr, 10)});
  }
  return examples;
}

class Pages : public testsupport::ShellTest,
              public testing::WithParamInterface<std::pair<const char*, size_t>> {};

}  // namespace

INSTANTIATE_TEST_SUITE_P(Query, Pages,
                         testing::Values(std::pair(TALLOW_QUERY_PAGE, 10u),
                                         std::pair(TALLOW_SEARCH_PAGE, 21u)));

TEST_P(Pages, ExamplesFindTheStatedNumberOfMails) {
  const testsupport::DaemonProcess daemon(directory.path());
  ASSERT_TRUE(daemon.ready());
  tallow = TALLOW_PROGRAM " --runtime-dir " + daemon.runtimeDirectory();
  ASSERT_EQ(run("index " TALLOW_SAMPLE_MAIL), 0) << errors;
  const std::vector<Example> examples = examplesOf(readAll(GetParam().first));
  EXPECT_EQ(examples.size(), GetParam().second);
  for (const auto& [command, found] : examples) {
    ASSERT_TRUE(command.starts_with("tallow search ")) << command;
    EXPECT_EQ(run(command.substr(6) + " --limit 0 --format=files"), 0) << command;
    EXPECT_EQ(std::count(output.begin(), output.end(), '\n'), found) << command << '\n' << output;
    EXPECT_EQ(errors, "") << command;
  }
}

TEST(QueryPage, NamesTheWholeVocabulary) {
  const std::string page = readAll(TALLOW_QUERY_PAGE);
  for (const TLAttributeName& row : kTLAttributeNames) {
    EXPECT_NE(page.find(row.name), std::string::npos) << row.name;
  }
  for (const char* function : {"now", "absolute", "iso", "today", "yesterday", "this_week",
                               "last_week", "this_month", "this_year"}) {
    EXPECT_NE(page.find(std::string("$time.") + function + "("), std::string::npos) << function;
  }
}
