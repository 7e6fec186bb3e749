#include <fmt/format.h>
#include <gmock/gmock.h>

#include <atomic>
#include <future>
#include <memory>

#include "platform/DeviceVault.h"
#include "platform/Text.h"
#include "tests/client/FakeDaemon.h"
#include "tests/daemon/DaemonSupport.h"
#include "tests/desktop/DesktopSession.h"
#include "tests/desktop/MockLogind.h"
#include "tests/desktop/SearchClient.h"
#include "tests/support/Programs.h"

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;
using testsupport::mail;

namespace {

// tallow-desktop, started by its bus, with a daemon that answers as the test says.
class DesktopServiceTest : public testing::Test {
 protected:
  void SetUp() override {
    NEED_PROGRAMS("dbus-daemon")
    session = std::make_unique<testsupport::DesktopSession>(daemon.runtimeDirectory(), true);
    client = std::make_unique<testsupport::SearchClient>(session->address());
    find({mail("file/mail/a", "harbour")});
  }

  // What the daemon finds from now on, whatever is searched for.
  void find(const std::vector<client::EncodedItem>& items) {
    rpc::BytesArray bytes;
    for (const auto& item : items) bytes.push_back(item.bytes);
    daemon.answer("SearchItemsForQuery", [bytes](rpc::Reply& reply) { reply.send({bytes}); });
  }
  // How a mail with this subject is called.
  [[nodiscard]] std::string nameOf(const std::string& subject) {
    find({mail("file/mail/a", subject)});
    const auto metas = client->metas(client->search({"x"}));
    EXPECT_THAT(metas, SizeIs(1));
    return metas.at(0).at("name");
  }
  [[nodiscard]] size_t searches() const {
    const auto calls = daemon.calls();
    return static_cast<size_t>(std::count_if(calls.begin(), calls.end(), [](const auto& call) {
      return call.starts_with("SearchItemsForQuery");
    }));
  }
  void setLockStatus(bool locked) const {
    ASSERT_TRUE(
        platform::writeLockStatus(daemon.runtimeDirectory() + "/lock_status", locked, nullptr));
  }

  testsupport::FakeDaemon daemon;
  std::unique_ptr<testsupport::DesktopSession> session;
  std::unique_ptr<testsupport::SearchClient> client;
};

// Holds the daemon's answers back until the test releases them.
class Gate {
 public:
  void pass(rpc::Reply& reply) {
    // The test, and this object with it, may end while the daemon's thread wakes up.
    const auto released = _released;
    if (!_reached.exchange(true)) _called.set_value();
    released.wait();
    reply.send({rpc::BytesArray{mail("file/mail/a", "harbour").bytes}});
  }
  void awaitCall() { _called.get_future().wait(); }
  void release() { _release.set_value(); }

 private:
  std::atomic<bool> _reached = false;
  std::promise<void> _called;
  std::promise<void> _release;
  std::shared_future<void> _released = _release.get_future().share();
};

}  // namespace

// Fifty keys while the daemon does not answer: all but the last search end at once and without a
// search of their own.
TEST_F(DesktopServiceTest, OvertakenSearchesAreDropped) {
  constexpr size_t kLast = 49;
  Gate gate;
  daemon.answer("SearchItemsForQuery", [&gate](rpc::Reply& reply) { gate.pass(reply); });
  client->begin({"word0"});
  gate.awaitCall();
  for (size_t i = 1; i <= kLast; ++i) client->begin({fmt::format("word{}", i)});
  for (size_t i = 0; i < kLast; ++i) EXPECT_THAT(client->answerOf(i), IsEmpty());
  EXPECT_EQ(searches(), 1U);
  gate.release();
  EXPECT_THAT(client->answerOf(kLast), ElementsAre("file/mail/a"));
  EXPECT_EQ(searches(), 2U);
}

TEST_F(DesktopServiceTest, NothingIsFoundUntilSwitchedOn) {
  for (const char* const settings : {"", "desktop_search = false", "desktop_search = 'yes'"}) {
    session->configure(settings);
    EXPECT_THAT(client->search({"x"}), IsEmpty()) << settings;
  }
  client->activate("file/mail/off");
  EXPECT_EQ(searches(), 0U);
  session->configure("desktop_search = true\ndesktop_class = 'work'");
  EXPECT_THAT(client->search({"x"}), ElementsAre("file/mail/a"));
  EXPECT_THAT(daemon.calls(), testing::Contains(HasSubstr(", work, ")));
  client->activate("file/mail/on");
  EXPECT_EQ(session->nextProgram(), "open-mail|--now|/mail/on");
}

TEST_F(DesktopServiceTest, NothingIsShownOrOpenedByALockedScreen) {
  const auto identifiers = client->search({"x"});
  EXPECT_THAT(identifiers, ElementsAre("file/mail/a"));
  EXPECT_THAT(client->metas(identifiers), SizeIs(1));
  setLockStatus(true);
  EXPECT_THAT(client->search({"x"}), IsEmpty());
  EXPECT_THAT(client->metas(identifiers), IsEmpty());
  client->activate("file/mail/locked");
  EXPECT_EQ(searches(), 1U);
  setLockStatus(false);
  EXPECT_THAT(client->metas(identifiers), SizeIs(1));
  client->activate("file/mail/open");
  EXPECT_EQ(session->nextProgram(), "open-mail|--now|/mail/open");
}

// Also for the answer to a search that began before.
TEST_F(DesktopServiceTest, FollowsTheLockOfTheSession) {
  testsupport::MockLogind logind(session->systemAddress(), {true, true});
  EXPECT_THAT(client->search({"x"}), IsEmpty());
  logind.setHint(false);
  while (client->search({"x"}).empty()) continue;
  Gate gate;
  daemon.answer("SearchItemsForQuery", [&gate](rpc::Reply& reply) { gate.pass(reply); });
  testsupport::SearchClient other(session->address());
  other.begin({"y"});
  gate.awaitCall();
  EXPECT_THAT(client->metas({"file/mail/a"}), SizeIs(1));
  logind.signalSession("Lock");
  while (!client->metas({"file/mail/a"}).empty()) continue;
  gate.release();
  EXPECT_THAT(other.answerOf(0), IsEmpty());
}

TEST_F(DesktopServiceTest, TextFromMailIsHarmless) {
  EXPECT_EQ(nameOf("a\x07 \u202Eb\n<img src=\"http://example.org/\">"),
            "a\uFFFD b ‹img src=\"http://example.org/\"›");
  EXPECT_THAT(nameOf("Tea & <b>cakes</b>\x80\xFF"),
              testing::StartsWith("Tea & ‹b›cakes‹/b›\uFFFD"));
  EXPECT_EQ(nameOf(""), "(no subject)");
  for (const char* const unit : {"x", "語", "e\xCC\x81\xCC\x81", "<", "\xE2\x80\x8B"}) {
    std::string subject;
    while (subject.size() < size_t{1} << 20) subject += unit;
    const std::string name = nameOf(subject);
    EXPECT_LE(name.size(), 3000U);
    EXPECT_TRUE(platform::isValidUTF8(name));
  }
}

TEST_F(DesktopServiceTest, LimitsWhatIsTypedAndFound) {
  std::vector<client::EncodedItem> many;
  for (int i = 0; i < 40; ++i) many.push_back(mail(fmt::format("file/mail/{}", i), "harbour"));
  find(many);
  EXPECT_THAT(client->search({"x"}), SizeIs(10));
  const size_t before = searches();
  for (const testsupport::Texts& words :
       {testsupport::Texts{}, {" ", ""}, {"@nosuchsearch"}, {std::string(5000, 'x')}}) {
    EXPECT_THAT(client->search(words), IsEmpty());
  }
  EXPECT_EQ(searches(), before);
  EXPECT_THAT(client->search({std::string(4000, 'x')}), Not(IsEmpty()));
  EXPECT_THAT(client->metas({"file/unknown"}), IsEmpty());
}

TEST_F(DesktopServiceTest, OutlivesTheDaemon) {
  EXPECT_THAT(client->search({"x"}), SizeIs(1));
  daemon.failOnce("SearchItemsForQuery", {"com.quill.tallow.TALIndexerManager", -2, "locked"});
  EXPECT_THAT(client->search({"x"}), IsEmpty());
  EXPECT_THAT(client->search({"x"}), SizeIs(1));
  daemon.stop();
  EXPECT_THAT(client->search({"x"}), IsEmpty());
}

TEST_F(DesktopServiceTest, OneProgramForEachBus) {
  EXPECT_THAT(client->search({"x"}), SizeIs(1));
  auto environment = session->environment();
  for (const auto& [address, reason] :
       {std::pair(session->address(), "another tallow-desktop runs"),
        {"unix:path=" + (*session / "none"), "tallow-desktop: no session bus"}}) {
    environment["DBUS_SESSION_BUS_ADDRESS"] = address;
    testsupport::Process second({TALLOW_DESKTOP_PROGRAM}, environment, *session / "second.log");
    EXPECT_EQ(second.end(), 1);
    EXPECT_THAT(second.log(), HasSubstr(reason));
  }
}
