#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <future>
#include <random>
#include <thread>
#include <vector>

#include "platform/Clock.h"
#include "platform/Concurrent.h"
#include "platform/Files.h"
#include "platform/Log.h"
#include "platform/Paths.h"
#include "platform/Queue.h"
#include "platform/Redaction.h"
#include "platform/Signpost.h"
#include "platform/StateCapture.h"
#include "platform/Text.h"
#include "platform/TextFile.h"
#include "platform/URL.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

using testsupport::LogCapture;
using testsupport::TemporaryDirectory;

TEST(Text, ConvertsBothWaysAndReplacesWhatIsInvalid) {
  EXPECT_EQ(platform::toUTF8(u"plain ascii that is longer than a block"),
            "plain ascii that is longer than a block");
  EXPECT_EQ(platform::toUTF8(u"gr\u00fc\u00dfe \U0001F600"),
            "gr\xC3\xBC\xC3\x9F"
            "e \xF0\x9F\x98\x80");
  EXPECT_EQ(platform::fromUTF8("abcdefgh\xE6\x97\xA5"), u"abcdefgh\u65e5");
  EXPECT_EQ(platform::toUTF8(TLString(u"a") + char16_t(0xD800) + u"b"),
            "a\xEF\xBF\xBD"
            "b");
  EXPECT_EQ(platform::fromUTF8("a\xFF"
                               "b"),
            u"a\uFFFDb");
  EXPECT_EQ(platform::toUTF8(TLString(1, u'\0')), std::string(1, '\0'));
  EXPECT_FALSE(platform::isValidUTF8("ab\xC0\xAF"));
  EXPECT_TRUE(platform::isValidUTF8("\xF0\x9F\x98\x80"));
}

TEST(Text, RandomTextSurvivesTheRoundTrip) {
  std::mt19937 random(7);
  for (int round = 0; round < 500; ++round) {
    TLString text;
    for (size_t i = random() % 40; i > 0; --i) {
      const uint32_t kind = random() % 3;
      if (kind == 2) {
        text += static_cast<char16_t>(0xD800 + random() % 0x400);
        text += static_cast<char16_t>(0xDC00 + random() % 0x400);
      } else {
        text += static_cast<char16_t>(kind == 0 ? random() % 0x80 : 0x80 + random() % 0xD000);
      }
    }
    ASSERT_EQ(platform::fromUTF8(platform::toUTF8(text)), text);
  }
}

TEST(Redaction, ShowsTwoUnitsAndTheLength) {
  EXPECT_EQ(TLPartiallyRedactedStringForString(u"ab"), u"\"ab...\"<2 chars>");
  EXPECT_EQ(TLPartiallyRedactedStringForString(u"a secret"), u"\"a ...\"<8 chars>");
  EXPECT_EQ(TLPartiallyRedactedStringForString(u"a"), u"a");
  EXPECT_EQ(TLPartiallyRedactedStringForString(std::nullopt), std::nullopt);
  EXPECT_EQ(TLPartiallyRedactedStringForStringAndMaxLength(u"abcdef", 4), u"\"abcd...\"<6 chars>");
}

TEST(Clock, MillisecondsAreWholeAndADenominatorOfZeroGivesZero) {
  EXPECT_EQ(platform::millisFromTicks(1999999, {1, 1}), 1u);
  EXPECT_EQ(platform::millisFromTicks(24000, {125, 3}), 1u);
  EXPECT_EQ(platform::millisFromTicks(5000000, {1, 0}), 0u);
}

// Also from a thread whose own pending signals nobody handles.
TEST(Log, ALogThatNobodyReadsAsksTheProcessToEnd) {
  sigset_t broken;
  sigemptyset(&broken);
  sigaddset(&broken, SIGPIPE);
  pthread_sigmask(SIG_BLOCK, &broken, nullptr);
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
  const int standardError = dup(STDERR_FILENO);
  dup2(ends[1], STDERR_FILENO);
  close(ends[0]);
  close(ends[1]);
  std::thread([] { platform::Log(platform::kSubsystem, "test").error("lost"); }).join();
  dup2(standardError, STDERR_FILENO);
  close(standardError);
  const timespec atOnce{};
  EXPECT_EQ(sigtimedwait(&broken, nullptr, &atOnce), SIGPIPE);
}

TEST(Paths, AUserOtherThanRootHasTheirOwnDirectories) {
  for (const char* name : {"STATE_DIRECTORY", "RUNTIME_DIRECTORY", "XDG_STATE_HOME"})
    unsetenv(name);
  setenv("HOME", "/home/mara", 1);
  setenv("XDG_RUNTIME_DIR", "/run/user/7", 1);
  const uid_t user = geteuid();
  if (user == 0) {
    EXPECT_EQ(platform::stateDirectory(), "/var/lib/tallow");
    EXPECT_EQ(platform::runtimeDirectory(), "/run/tallow");
    ASSERT_EQ(seteuid(65534), 0);
  }
  EXPECT_EQ(platform::stateDirectory(), "/home/mara/.local/state/tallow");
  EXPECT_EQ(platform::runtimeDirectory(), "/run/user/7/tallow");
  setenv("XDG_STATE_HOME", "/data/mara", 1);
  EXPECT_EQ(platform::stateDirectory(), "/data/mara/tallow");
  setenv("XDG_STATE_HOME", "relative", 1);
  EXPECT_EQ(platform::stateDirectory(), "/home/mara/.local/state/tallow");
  setenv("STATE_DIRECTORY", "/srv/a:/srv/b", 1);
  setenv("RUNTIME_DIRECTORY", "/srv/run", 1);
  EXPECT_EQ(platform::stateDirectory(), "/srv/a");
  EXPECT_EQ(platform::runtimeDirectory(), "/srv/run");
  ASSERT_EQ(seteuid(user), 0);
}

// A thread that ends as soon as it is idle, so that items arrive in each of its states.
TEST(Queue, LosesNothingWhenThreadsComeAndGo) {
  constexpr int kThreads = 4;
  constexpr int kItems = 500;
  int count = 0;  // used on the queue
  std::vector<int> orders(kThreads, 0);
  {
    platform::SerialQueue queue("queue", platform::QueuePriority::unspecified,
                                std::chrono::milliseconds(0));
    std::vector<std::jthread> callers;
    for (int caller = 0; caller < kThreads; ++caller) {
      callers.emplace_back([&, caller] {
        for (int i = 0; i < kItems; ++i) {
          const auto item = [&count, &last = orders[static_cast<size_t>(caller)], i] {
            EXPECT_EQ(last, i);
            last = i + 1;
            ++count;
          };
          if (i % 3 == 0) {
            queue.sync(item);
          } else {
            EXPECT_TRUE(queue.async(item));
          }
        }
      });
    }
  }
  EXPECT_EQ(count, kThreads * kItems);
}

TEST(Queue, RunsWhatIsPendingAtTheEnd) {
  int ran = 0;
  {
    platform::SerialQueue queue("queue");
    for (int i = 0; i < 1000; ++i) EXPECT_TRUE(queue.async([&ran] { ++ran; }));
  }
  EXPECT_EQ(ran, 1000);
}

TEST(Queue, RunsSynchronousItemsOnTheCallersThread) {
  platform::SerialQueue queue("queue");
  std::thread::id ran;
  queue.sync([&] { ran = std::this_thread::get_id(); });
  EXPECT_EQ(ran, std::this_thread::get_id());
  EXPECT_TRUE(queue.async([&] { ran = std::this_thread::get_id(); }));
  queue.drain();
  EXPECT_NE(ran, std::this_thread::get_id());
}

TEST(Concurrent, VisitsEveryIndexOnce) {
  std::vector<int> visits(1000);
  platform::concurrentApply(visits.size(), [&](size_t i) { ++visits[i]; });
  EXPECT_EQ(visits, std::vector<int>(1000, 1));
  platform::concurrentApply(0, [](size_t) { FAIL(); });
}

TEST(URL, AcceptsOnlyStrictAbsoluteURLs) {
  EXPECT_TRUE(TLURL::parse("tlw://mail_bundle_id/file/tmp/a%20b"));
  EXPECT_TRUE(TLURL::parse("tlw://b/x?offset=10"));
  for (const char* bad : {"", "no scheme", "tlw://b/a b", "tlw://b/\xC3\xA9", "tlw://b/%zz",
                          "/only/path", "tlw://b/a\"b", "tlw://b/[x"}) {
    EXPECT_FALSE(TLURL::parse(bad)) << bad;
  }
  EXPECT_FALSE(TLURL::parse(std::string("tlw://b/a\0b", 11)));
}

TEST(Files, DirectoriesArePrivateAndCarryTheirClass) {
  TemporaryDirectory temporary;
  const std::string path = temporary / "a/b/c";
  ASSERT_TRUE(platform::createDirectories(path, nullptr, "SysFileProtectionComplete"));
  ASSERT_TRUE(platform::createDirectories(path, nullptr));
  struct stat info;
  ASSERT_EQ(stat(path.c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 0777, 0700u);
  char value[64] = {};
  if (setxattr(temporary.path().c_str(), "user.tallow.probe", "x", 1, 0) == 0) {
    ASSERT_GT(getxattr(path.c_str(), "user.tallow.protection", value, sizeof value), 0);
    EXPECT_STREQ(value, "SysFileProtectionComplete");
  }
}

TEST(Files, FailuresNameThePath) {
  TemporaryDirectory temporary;
  std::optional<TLError> error;
  EXPECT_FALSE(platform::createDirectories(temporary / std::string("x\0y", 3), &error));
  EXPECT_EQ(error->code, EINVAL);
  ASSERT_TRUE(platform::writeFileAtomically(temporary / "file", "0123456789", &error));
  EXPECT_FALSE(platform::createDirectories(temporary / "file", &error));
  EXPECT_EQ(error->code, EEXIST);
  EXPECT_FALSE(platform::createDirectories(temporary / std::string(300, 'n'), &error));
  EXPECT_EQ(error->code, ENAMETOOLONG);
  EXPECT_FALSE(platform::readFile(temporary / "file", 9, &error));
  EXPECT_EQ(error->code, EFBIG);
  EXPECT_EQ(platform::readFile(temporary / "file", 10, nullptr), "0123456789");
  EXPECT_FALSE(platform::listDirectory(temporary / "none", &error));
  EXPECT_EQ(error->code, ENOENT);
  EXPECT_EQ(error->domain, kPOSIXErrorDomain);
  EXPECT_NE(error->message.find("none"), std::string::npos);
  EXPECT_TRUE(platform::removeItem(temporary / "file", nullptr));
  EXPECT_EQ(platform::listDirectory(temporary.path(), nullptr)->size(), 0u);
}

TEST(Files, AnUnnamedFileLeavesNothingBehind) {
  const testsupport::TemporaryDirectory directory;
  const platform::FileDescriptor file = platform::openUnnamedFile(directory.path());
  ASSERT_GE(file.get(), 0);
  ASSERT_TRUE(platform::writeAt(file.get(), 3, "text"));
  std::string read(4, '\0');
  EXPECT_TRUE(platform::readAt(file.get(), 3, read.data(), read.size()));
  EXPECT_EQ(read, "text");
  EXPECT_EQ(platform::listDirectory(directory.path(), nullptr), std::vector<std::string>());
  EXPECT_LT(platform::openUnnamedFile(directory / "missing").get(), 0);
}

TEST(TextFile, DetectsTheEncoding) {
  using namespace std::string_literals;
  const TLString text = u"na\u00efve,gr\u00fcn\n";
  const std::pair<std::string, TLString> cases[] = {
      {"", u""},
      {"\xEF\xBB\xBF", u""},
      {platform::toUTF8(text), text},
      {"\xEF\xBB\xBF" + platform::toUTF8(text), text},
      {"\xFF\xFE"
       "a\0\xEF\0"s,
       u"a\u00ef"},
      {"\xFE\xFF\0a\0\xEF"s, u"a\u00ef"},
      {"\xFF\xFE\0\0a\0\0\0"s, u"a"},
      {"\0\0\xFE\xFF\0\0\0a"s, u"a"},
      {"\xFE\xFF\0"s, u"\ufffd"},
      {"na\xEFve,gr\xFCn\n", text},
      {"\xE9", u"\u00e9"},
  };
  for (const auto& [bytes, expected] : cases) {
    EXPECT_EQ(platform::decodeText(bytes), expected) << testing::PrintToString(bytes);
  }
}

TEST(StateCapture, RecordHasTheStatedLayout) {
  platform::SerialQueue queue("capture");
  const std::string title(100, 't');
  auto cancel = TLLogRegisterStateCaptureBlock(queue, title, [] {
    return nlohmann::json{{"n", 7}};
  });
  auto cancelEmpty =
      TLLogRegisterStateCaptureBlock(queue, "e", [] { return nlohmann::json::object(); });
  const auto records = platform::captureState();
  ASSERT_EQ(records.size(), 1u);
  const std::string& record = records[0];
  EXPECT_EQ(record.substr(0, 4), std::string("\1\0\0\0", 4));
  EXPECT_EQ(static_cast<size_t>(record[4]), record.size() - 200);
  EXPECT_EQ(std::string(record.c_str() + 136), std::string(63, 't'));
  EXPECT_EQ(nlohmann::json::from_cbor(record.substr(200)), nlohmann::json({{"n", 7}}));
  LogCapture log;
  platform::logCapturedState();
  EXPECT_TRUE(log.contains("{\"n\":7}"));
  cancel();
  cancelEmpty();
  EXPECT_TRUE(platform::captureState().empty());
}

// A busy class must not delay the registration or cancellation of another.
TEST(StateCapture, WaitsForABusyQueueWithoutHoldingUpOthers) {
  platform::SerialQueue busy("busy");
  platform::SerialQueue other("other");
  std::promise<void> release;
  ASSERT_TRUE(busy.async([&release] { release.get_future().wait(); }));
  const auto block = [] { return nlohmann::json{{"n", 1}}; };
  auto cancelBusy = TLLogRegisterStateCaptureBlock(busy, "busy", block);
  std::promise<size_t> captured;
  std::thread capturing([&] { captured.set_value(platform::captureState().size()); });
  for (int i = 0; i < 100; ++i) TLLogRegisterStateCaptureBlock(other, "other", block)();
  release.set_value();
  EXPECT_EQ(captured.get_future().get(), 1U);
  cancelBusy();
  capturing.join();
}

TEST(Signpost, ReachesASinkAndSkipsTheReservedIdentifiers) {
  std::vector<std::string> seen;
  platform::setSignpostSink([&](const platform::SignpostEvent& event) {
    seen.push_back(fmt::format("{} {} {}",
                               event.phase == platform::SignpostPhase::begin ? "b" : "e",
                               event.name, event.message));
  });
  const int object = 0;
  const uint64_t id = platform::Signpost::identifierForObject(&object);
  platform::Signpost::begin(id, "work", "index {} items", 3);
  platform::Signpost::begin(0, "work", "never");
  platform::Signpost::end(~uint64_t{0}, "work", "never");
  platform::Signpost::end(id, "work", "done");
  platform::setSignpostSink({});
  EXPECT_EQ(seen, (std::vector<std::string>{"b work index 3 items", "e work done"}));
}
