#include <fmt/format.h>
#include <gmock/gmock.h>

#include <map>
#include <regex>
#include <set>

#include "cli/PageParts.h"
#include "cli/StatusPage.h"
#include "sync/MailSync.h"
#include "tests/support/Programs.h"
#include "tests/support/TemporaryDirectory.h"

using testing::HasSubstr;
using testing::Not;

namespace {

constexpr const char* kHostile = "<script>\"'&\x1b]0;x\x07\u202E\xff\n</style></title>";
constexpr double kNow = 1707300000;  // 2024-02-07

// A class with a catalogue of invented folders.
class StatusPageTest : public testing::Test {
 protected:
  StatusPageTest() {
    status.name = "default";
    status.catalogue = mailsync::Catalogue::open(directory / "catalogue", nullptr);
    status.lastSync = 1707295200;
    status.disk = cli::DiskUse{812'345'678, 245'000'000};
    status.index = cli::IndexStatus{.stored = 48210,
                                    .searchable = 48210,
                                    .textBytes = 390'000'000,
                                    .suffixes = 41'000'000,
                                    .hotSuffixes = 310'000,
                                    .merges = 57,
                                    .mergeSeconds = 311.4,
                                    .scans = 21044,
                                    .scanSeconds = 19.1,
                                    .deleted = 903};
  }

  // Messages of a folder; of those without a date, `problem` says why they failed.
  void add(const std::string& folder, int count, std::optional<int64_t> date,
           const std::string& problem = "") {
    mailsync::Catalogue& catalogue = *status.catalogue;
    catalogue.begin();
    int64_t& id = _directories[folder];
    if (id == 0) id = catalogue.addDirectory({.path = folder + "/cur"});
    for (int i = 0; i < count; ++i) {
      const std::string name = fmt::format("{}", ++_messages);
      const mailsync::FileRow file{
          .directory = id, .name = name, .kind = mailsync::FileKind::maildir};
      mailsync::MessageRow added;
      added.file = catalogue.addFile(file);
      added.identifier = "file/" + name;
      catalogue.addMessage(added);
      const int64_t message = catalogue.messagesOf(added.file).front().id;
      if (problem.empty()) catalogue.setSent(message, 1, "digest", date);
      if (!problem.empty()) catalogue.setFailed(message, problem);
    }
    catalogue.setAcknowledged(1);
    ASSERT_TRUE(catalogue.commit()) << catalogue.failure()->message;
  }

  // Three years of mail, a hundred days of history, and some failures.
  void addLife() {
    constexpr int64_t kMonth = 2629800;
    for (int i = 0; i < 50; ++i) {
      const auto date = static_cast<int64_t>(kNow) - i * kMonth;
      add("/home/mara/Mail/Archive", 20 + (i * 37) % 41, date);
      if (i % 3 == 0) add("/home/mara/Mail/Family", 9 + i % 5, date);
      if (i < 8) add(fmt::format("/home/mara/Mail/.Lists.number-{}", i), 3 + i, date);
    }
    add("/home/mara/Mail/" + std::string(200, 'w'), 5, 0);
    add("/home/mara/Mail/" + std::string(kHostile), 2, std::nullopt);
    add("/home/mara/Mail/Archive", 3, std::nullopt, "the message has 70 levels of parts");
    add("/home/mara/Mail/Archive", 1, std::nullopt, kHostile);
    addHistory(100);
  }
  void addHistory(int days) {
    mailsync::Measurement one;
    for (int i = 0; i < days; ++i) {
      one.day = 20231000 + (i / 28) * 100 + i % 28 + 1;
      if (i >= 84) one.day = 20240100 + i - 83;
      one.messages = 40000 + 82 * i;
      one.indexBytes = 700'000'000 + 1'100'000 * i;
      one.storeBytes = 240'000'000;
      one.scans += 40 + i % 17;
      one.scanSeconds += 0.05 + 0.01 * (i % 7);
      status.catalogue->addMeasurement(one);
    }
  }
  [[nodiscard]] std::string page() {
    std::vector<cli::ClassStatus> classes;
    classes.push_back(std::move(status));
    return cli::statusPage(classes, "unlocked", kNow);
  }

  const testsupport::TemporaryDirectory directory;
  cli::ClassStatus status;

 private:
  std::map<std::string, int64_t> _directories;
  int _messages = 0;
};

// What a browser shows of a page.
struct Measured {
  int scrollWidth = 0;
  int width = 0;
  int bars = 0;       // with an area
  int resources = 0;  // that were loaded beside the page
  std::string background;
};

class BrowserTest : public StatusPageTest {
 protected:
  void SetUp() override { NEED_PROGRAMS("chromium") }

  [[nodiscard]] std::string show(const std::string& html, const std::string& options) const {
    directory.write("page.html", html);
    return testsupport::outputOf(fmt::format(
        "HOME={0} timeout 120 chromium --headless --no-sandbox --disable-gpu "
        "--disable-dev-shm-usage --user-data-dir={0}/profile {1} --dump-dom file://{0}/page.html",
        directory.path(), options));
  }

  // Shows a copy with a script of this test. The style must pass the policy as it is.
  [[nodiscard]] Measured measure(std::string html, const std::string& options) const {
    const std::string policy = "default-src 'none';";
    html.replace(html.find(policy), policy.size(), policy + " script-src 'unsafe-inline';");
    html += R"(<script>
      const area = one => one.getBoundingClientRect().width * one.getBoundingClientRect().height;
      const bars = [...document.querySelectorAll("rect.bar")].filter(one => area(one) > 0);
      document.body.append("measured " + [document.documentElement.scrollWidth, innerWidth,
        bars.length, performance.getEntriesByType("resource").length,
        getComputedStyle(document.body).backgroundColor].join(" ") + " end");
      </script>)";
    const std::string shown = show(html, options);
    std::smatch parts;
    const std::regex all("measured (\\d+) (\\d+) (\\d+) (\\d+) (.*) end");
    if (!std::regex_search(shown, parts, all)) return {};
    return {std::stoi(parts[1]), std::stoi(parts[2]), std::stoi(parts[3]), std::stoi(parts[4]),
            parts[5]};
  }
};

}  // namespace

TEST_F(StatusPageTest, ShowsTheFigures) {
  add("/m/a", 3, 1706000000);  // 2024-01
  add("/m/a", 2, 1600000000);  // 2020-09
  add("/m/b", 4, 4000000000);  // the future
  add("/m/b", 1, 0);
  add("/m/b", 1, std::nullopt, "too odd");
  addHistory(3);
  const std::string html = page();
  for (const char* const text :
       {"<title>2024-01: 3</title>", "<title>2020: 2</title>", "<title>2021-02: 0</title>",
        "5 more without a usable date", "<span class=\"count\">6, 1 failed</span>", "too odd",
        "812.3 MB index", "57 in 311 s", "310,000 of 41,000,000 suffixes", "0.91 ms each",
        "<title>2023-10-03: 40,164</title>", "<title>2023-10-02: 1.46 ms</title>"}) {
    EXPECT_THAT(html, HasSubstr(text));
  }
  EXPECT_THAT(html, Not(HasSubstr("2096")));
  EXPECT_THAT(html, Not(HasSubstr("<title>2020-09")));
}

TEST_F(StatusPageTest, NothingOfAMailIsMarkup) {
  addLife();
  status.error = TLError{"d", 1, kHostile};
  const std::string html = page();
  EXPECT_THAT(html, Not(HasSubstr("<script")));
  EXPECT_THAT(html, HasSubstr("&lt;script&gt;&quot;&#39;&amp;"));
  for (const char* const bad : {"\x1b", "\x07", "\u202E", "\xff", "http:", "https:", "url(",
                                " src=", " href=", "@import", " style="}) {
    EXPECT_THAT(html, Not(HasSubstr(bad))) << bad;
  }
  EXPECT_EQ(html.find("</style>"), html.rfind("</style>"));
  EXPECT_EQ(cli::escapedHTML(std::string(1'000'000, 'x')).size(), cli::kMaxPageText + 2);
}

TEST_F(StatusPageTest, TheHistoryIsBounded) {
  mailsync::Catalogue& catalogue = *status.catalogue;
  for (int64_t day = 1; day <= mailsync::kMaxMeasurements + 5; ++day) {
    mailsync::Measurement one;
    one.day = day;
    one.scanSeconds = 0.25;
    for (int times = 0; times < 2; ++times) catalogue.addMeasurement(one);
  }
  const auto kept = catalogue.measurements();
  ASSERT_EQ(kept.size(), static_cast<size_t>(mailsync::kMaxMeasurements));
  EXPECT_EQ(kept.front().day, 6);
  EXPECT_DOUBLE_EQ(kept.back().scanSeconds, 0.25);
  EXPECT_TRUE(catalogue.isMeasured(6));
  EXPECT_FALSE(catalogue.isMeasured(5));
}

TEST_F(StatusPageTest, AnOldCatalogueKeepsItsMessages) {
  add("/m/a", 2, 1706000000);
  status.catalogue.reset();
  const std::string path = directory / "catalogue";
  const auto database = mailsync::Database::open(path, nullptr);
  ASSERT_TRUE(
      database->execute("ALTER TABLE message DROP COLUMN date; DROP TABLE measurement; "
                        "UPDATE setting SET value = '1' WHERE key = 'schema'"));
  const auto catalogue = mailsync::Catalogue::open(path, nullptr);
  ASSERT_NE(catalogue, nullptr);
  EXPECT_EQ(catalogue->folderCounts().front().indexed, 2);
  ASSERT_EQ(catalogue->monthCounts().size(), 1U);
  EXPECT_EQ(catalogue->monthCounts().front().month, "");
  EXPECT_TRUE(catalogue->measurements().empty());
}

TEST_F(BrowserTest, FitsAnyWidthInLightAndDark) {
  addLife();
  const std::string html = page();
  const char* const kDark = "--blink-settings=preferredColorScheme=0 ";
  const char* const kLight = "--blink-settings=preferredColorScheme=1 ";
  std::set<std::string> backgrounds;
  for (const int width : {360, 1400}) {
    for (const char* const colors : {kLight, kDark}) {
      const Measured measured =
          measure(html, fmt::format("{} --window-size={},900", colors, width));
      EXPECT_LE(measured.scrollWidth, measured.width) << width << colors;
      EXPECT_GT(measured.bars, 100);
      EXPECT_EQ(measured.resources, 0);
      backgrounds.insert(measured.background);
    }
  }
  EXPECT_THAT(backgrounds, testing::ElementsAre("rgb(23, 20, 16)", "rgb(247, 244, 238)"));
}

TEST_F(BrowserTest, ThePolicyStopsScripts) {
  addLife();
  std::string html = page();
  html.insert(html.find("<header>"), "<script>document.body.id = \"ran\"</script>");
  const std::string shown = show(html, "");
  EXPECT_THAT(shown, HasSubstr("Mails by folder"));
  EXPECT_THAT(shown, Not(HasSubstr("id=\"ran\"")));
}
