#include <algorithm>

#include "sync/DirectoryWatch.h"
#include "sync/MailWatch.h"
#include "tests/sync/MailSyncTest.h"

using mailsync::Change;
using std::chrono::minutes;
using testing::Contains;

namespace {

// Reports the changes given by the test, and records the watched directories.
class ScriptedSource : public mailsync::ChangeSource {
 public:
  Result watch(const std::string& directory) override {
    if (!fs::is_directory(directory)) return Result::absent;
    if (refused.contains(directory)) return Result::refused;
    watched.insert(directory);
    return Result::watched;
  }
  void keepOnly(const std::set<std::string>& directories) override {
    std::erase_if(watched, [&](const auto& path) { return !directories.contains(path); });
  }
  std::vector<Change> read() override { return std::exchange(changes, {}); }
  [[nodiscard]] int descriptor() const override { return -1; }

  std::set<std::string> watched;
  std::set<std::string> refused;
  std::vector<Change> changes;
};

class MailWatchTest : public MailboxTest {
 protected:
  void add(const std::string& path) const { put(path, "Subject: " + path + "\n\nText\n"); }
  void setPower(bool online) const {
    for (const auto& [supply, attribute, value] :
         {std::tuple("AC", "type", "Mains"), std::tuple("AC", "online", online ? "1" : "0"),
          std::tuple("BAT0", "type", "Battery"),
          std::tuple("BAT0", "status", online ? "Full" : "Unknown")}) {
      directory.write(fmt::format("power/{}/{}", supply, attribute), std::string(value) + '\n');
    }
  }
  void start(const std::string& root) {
    settings.sync = syncSettings();
    settings.roots = {root};
    settings.powerDirectory = directory / "power";
    auto scripted = std::make_unique<ScriptedSource>();
    source = scripted.get();
    source->refused = refused;
    watch = mailsync::MailWatch::start(
        settings, std::move(scripted),
        {[this](const std::string& line) { said.push_back(line); },
         [this](const mailsync::SyncReport& report) { entered = report.scan.entered; },
         [] { return false; }},
        now, nullptr);
    ASSERT_TRUE(watch);
    watch->turn(now);
  }
  // Advances the time and runs a round that is due. Returns the number of messages indexed then.
  size_t pass(std::chrono::milliseconds time) {
    now = std::max(now, mailsync::RescanPlan::Clock::now()) + time;
    entered = 0;
    watch->turn(now);
    return indexed();
  }
  // The same with a change that is reported, and long enough for its round.
  size_t tell(const std::string& place, const std::string& name, bool isDirectory = false,
              Change::Kind kind = Change::Kind::entry) {
    source->changes.push_back({kind, place, name, isDirectory});
    pass(std::chrono::seconds(1));
    return pass(std::chrono::seconds(1));
  }
  [[nodiscard]] size_t indexed() const { return daemon.content().items.size(); }

  ScriptedSource* source = nullptr;
  mailsync::WatchSettings settings;
  std::set<std::string> refused;
  std::unique_ptr<mailsync::MailWatch> watch;
  mailsync::MailWatch::Time now = mailsync::RescanPlan::Clock::now();
  std::vector<std::string> said;
  uint64_t entered = 0;  // directories listed by the last round
};

}  // namespace

TEST_F(MailWatchTest, ScansOnlyChangedDirectories) {
  start(mail);
  EXPECT_THAT(source->watched, Contains(mail + "/a/new"));
  EXPECT_THAT(source->watched, Contains(directory.path()));
  add("a/new/1");
  add("b/new/2");
  EXPECT_EQ(tell(mail + "/a/new", "1"), 1U);
  EXPECT_EQ(entered, 1U);
  // Files that programs keep next to mail start no round; a folder with such a name does.
  makeFolder("dovecot");
  add("dovecot/new/3.lock");
  EXPECT_EQ(tell(mail, "dovecot-uidlist.lock"), 1U);
  EXPECT_EQ(tell(mail, "dovecot", true), 2U);
  fs::remove(mail + "/dovecot/new/3.lock");
  EXPECT_EQ(tell(mail + "/dovecot/new", "3.lock"), 1U);
  // A new folder, created from the inside out.
  makeFolder("b/c");
  add("b/c/cur/3:2,S");
  source->changes.push_back({Change::Kind::entry, mail + "/b/c", "cur", true});
  EXPECT_EQ(tell(mail + "/b", "c"), 2U);
  EXPECT_THAT(source->watched, Contains(mail + "/b/c/cur"));
  EXPECT_EQ(tell("", "", false, Change::Kind::lost), 3U);
}

TEST_F(MailWatchTest, ScansUnwatchableDirectoriesAtIntervals) {
  refused = {mail + "/a/new"};
  start(mail);
  EXPECT_THAT(said, ElementsAre(HasSubstr("cannot be watched")));
  add("a/new/1");
  EXPECT_EQ(pass(std::chrono::seconds(60)), 0U);
  EXPECT_EQ(pass(minutes(2)), 1U);
  EXPECT_EQ(said.size(), 1U);
}

TEST_F(MailWatchTest, RootsMayAppearAndDisappear) {
  const std::string root = directory / "later/mail";
  start(root);
  fs::create_directories(directory / "later");
  tell(directory.path(), "later");
  EXPECT_THAT(source->watched, Contains(directory / "later"));
  fs::rename(mail, root);
  directory.write("later/mail/a/new/1", "Subject: one\n\nText\n");
  EXPECT_EQ(tell(directory / "later", "mail"), 1U);
  EXPECT_THAT(source->watched, Contains(root + "/a/new"));
  fs::rename(root, mail);
  EXPECT_EQ(tell(directory / "later", "mail"), 1U);
  EXPECT_THAT(said, Contains(HasSubstr("is not there")));
  add("b/new/2");
  fs::rename(mail, root);
  EXPECT_EQ(pass(minutes(5)), 2U);
}

TEST_F(MailWatchTest, ALargeBacklogWaitsForPowerAndNewMailDoesNot) {
  setPower(false);
  EXPECT_TRUE(platform::runsOnBattery(directory / "power"));
  EXPECT_FALSE(platform::runsOnBattery(directory / "none"));
  const size_t many = mailsync::MailWatch::kBatteryBacklog + 1;
  for (size_t i = 0; i < many; ++i) add("a/cur/" + std::to_string(i) + ":2,");
  start(mail);
  EXPECT_EQ(indexed(), 0U);
  EXPECT_THAT(said, ElementsAre(HasSubstr("501 messages wait for power")));
  add("b/new/1");
  EXPECT_EQ(tell(mail + "/b/new", "1"), 1U);
  EXPECT_EQ(pass(minutes(2)), 1U);
  setPower(true);
  pass(minutes(2));
  EXPECT_EQ(pass(std::chrono::seconds(1)), many + 1);
  EXPECT_EQ(said.size(), 2U);
}

// Power is lost while a round sends.
TEST_F(MailWatchTest, RoundStopsForPowerWithALargeBacklog) {
  settings.powerInterval = std::chrono::milliseconds(0);
  setPower(true);
  const size_t limit = mailsync::MailWatch::kBatteryBacklog;
  const size_t many = 3 * limit;
  for (size_t i = 0; i < many; ++i) add("a/cur/" + std::to_string(i) + ":2,");
  daemon.whenReceived(limit / 2, [this] { setPower(false); });
  start(mail);
  const size_t sent = indexed();
  EXPECT_GE(sent, limit / 2);
  EXPECT_LT(sent, many - limit);
  pass(std::chrono::seconds(1));
  EXPECT_THAT(said, ElementsAre(HasSubstr(std::to_string(many - sent) + " messages wait")));
  add("b/new/1");
  EXPECT_EQ(tell(mail + "/b/new", "1"), sent + 1);
  setPower(true);
  pass(minutes(2));
  EXPECT_EQ(pass(std::chrono::seconds(1)), many + 1);
  EXPECT_EQ(daemon.received(), many + 1);
  // New mail within the limit is sent completely.
  for (size_t i = 0; i < limit; ++i) add("b/cur/more" + std::to_string(i) + ":2,");
  daemon.whenReceived(many + 2, [this] { setPower(false); });
  EXPECT_EQ(tell(mail + "/b/cur", "more0:2,"), many + 1 + limit);
}

TEST_F(MailWatchTest, RefusesASecondWatchOfTheClass) {
  start(mail);
  std::optional<TLError> error;
  EXPECT_EQ(
      mailsync::MailWatch::start(settings, std::make_unique<ScriptedSource>(), {}, now, &error),
      nullptr);
  EXPECT_EQ(error->domain, mailsync::kBusyDomain);
}

TEST_F(MailWatchTest, KernelReportsTheLatestPathOfADirectory) {
  mailsync::DirectoryWatch kernel;
  using Result = mailsync::ChangeSource::Result;
  ASSERT_EQ(kernel.watch(mail + "/a/new"), Result::watched);
  EXPECT_EQ(kernel.watch(mail + "/none"), Result::absent);
  const auto told = [&] {
    std::set<std::string> places;
    for (const Change& change : kernel.read()) places.insert(change.directory + '/' + change.name);
    return places;
  };
  add("a/new/1");
  EXPECT_THAT(told(), ElementsAre(mail + "/a/new/1"));
  fs::rename(mail + "/a", mail + "/\xff");
  EXPECT_EQ(kernel.watch(mail + "/\xff/new"), Result::watched);
  fs::remove(mail + "/\xff/new/1");
  EXPECT_THAT(told(), ElementsAre(mail + "/\xff/new/1"));
  makeFolder("a");
  EXPECT_EQ(kernel.watch(mail + "/a/new"), Result::watched);
  kernel.keepOnly({mail + "/a/new"});
  (void)kernel.read();
  add("\xff/new/2");
  add("a/new/3");
  EXPECT_THAT(told(), ElementsAre(mail + "/a/new/3"));
  fs::remove_all(mail + "/a/new");
  EXPECT_THAT(told(), Contains(mail + "/a/new/"));
}
