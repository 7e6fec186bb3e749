#include <fmt/format.h>
#include <gmock/gmock.h>

#include <filesystem>
#include <memory>

#include "desktop/DesktopService.h"
#include "platform/Files.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/desktop/DesktopSession.h"
#include "tests/support/Programs.h"
#include "tests/support/ShellTest.h"

using testing::HasSubstr;
using testing::Not;

namespace {

constexpr size_t kMaxFileBytes = size_t{1} << 20;
constexpr const char* kShell = "org.gnome.Shell.SearchProvider2";
constexpr const char* kRunner = "org.kde.krunner1";

// Every operation, called by general D-Bus tools, with a daemon that holds the sample mail.
class DesktopToolsTest : public testsupport::ShellTest {
 protected:
  void SetUp() override {
    NEED_PROGRAMS("dbus-daemon", "gdbus", "busctl")
    ASSERT_TRUE(daemon.ready());
    std::filesystem::copy(TALLOW_SAMPLE_MAIL, mail, std::filesystem::copy_options::recursive);
    tallow = TALLOW_PROGRAM " --runtime-dir " + daemon.runtimeDirectory();
    ASSERT_EQ(run("index " + mail), 0) << errors;
    open(true);
  }
  void open(bool withOpener) {
    session = std::make_unique<testsupport::DesktopSession>(daemon.runtimeDirectory(), withOpener);
  }

  // The output of a call by gdbus, or of one by busctl.
  std::string gdbus(const char* interface, const std::string& call) {
    return outputOfShell(
        fmt::format("gdbus call --address {} --dest {} --object-path {} --method {}.{}",
                    session->address(), desktop::kBusName, desktop::kObjectPath, interface, call));
  }
  std::string busctl(const char* interface, const std::string& call) {
    return outputOfShell(fmt::format("busctl --address={} call {} {} {} {}", session->address(),
                                     desktop::kBusName, desktop::kObjectPath, interface, call));
  }
  // The first identifier in an output, which puts it in quotes.
  [[nodiscard]] static std::string identifierIn(const std::string& text) {
    const size_t begin = std::min(text.find("file/"), text.find("mbox/"));
    return begin == std::string::npos
               ? ""
               : text.substr(begin, text.find_first_of("'\"", begin) - begin);
  }

  const std::string mail = directory / "mail";
  const testsupport::DaemonProcess daemon{directory.path()};
  std::unique_ptr<testsupport::DesktopSession> session;
};

// What the packages install for desktops.
using DesktopFiles = testsupport::ShellTest;

std::string fileOf(const std::string& name) {
  return platform::readFile(std::string(TALLOW_DESKTOP_FILES) + '/' + name, kMaxFileBytes, nullptr)
      .value_or("");
}

}  // namespace

TEST_F(DesktopToolsTest, SearchesAsTheShellDoes) {
  const std::string first = gdbus(kShell, "GetInitialResultSet \"['corrected', 'inv']\"");
  const std::string identifier = identifierIn(first);
  ASSERT_THAT(identifier, HasSubstr("archive.mbox")) << first;
  const std::string refined = gdbus(
      kShell,
      fmt::format("GetSubsearchResultSet \"['{}']\" \"['from:nordlys', 'invoice']\"", identifier));
  EXPECT_THAT(refined, HasSubstr(identifier));
  EXPECT_THAT(gdbus(kShell, "GetSubsearchResultSet \"['x']\" \"['nothingofthekind']\""),
              HasSubstr("(@as [],)"));
  const std::string metas = gdbus(kShell, fmt::format("GetResultMetas \"['{}']\"", identifier));
  EXPECT_THAT(metas, HasSubstr(fmt::format("'id': <'{}'>", identifier)));
  EXPECT_THAT(metas, HasSubstr("'description': <'Nordlys Energy · 2024-02-04 16:28 · archive'>"));
  EXPECT_THAT(metas, HasSubstr("nvoice"));

  gdbus(kShell, fmt::format("ActivateResult '{}' \"['invoice']\" 17", identifier));
  EXPECT_EQ(session->nextProgram(), "open-mail|--now|" + mail + "/archive.mbox");
  gdbus(kShell, "LaunchSearch \"['-draft', 'three words']\" 17");
  EXPECT_EQ(session->nextProgram(),
            "xdg-terminal-exec|tallow|screen|--class=default|--|-draft three words");
}

TEST_F(DesktopToolsTest, SearchesAsKDEDoes) {
  const std::string matches = busctl(kRunner, "Match s '\"corrected invoice\"'");
  EXPECT_THAT(matches, testing::StartsWith("a(sssida{sv}) "));
  EXPECT_THAT(matches, HasSubstr("\"mail-read\" 30 0.7 1 \"subtext\" s \"Nordlys Energy"));
  const std::string identifier = identifierIn(matches);
  EXPECT_THAT(busctl(kRunner, "Actions"), HasSubstr("a(sss) 1 \"show\""));
  EXPECT_THAT(busctl(kRunner, "Config"), HasSubstr("a{sv} 1 \"MinLetterCount\" i 2"));
  busctl(kRunner, fmt::format("Run ss '{}' ''", identifier));
  EXPECT_EQ(session->nextProgram(), "open-mail|--now|" + mail + "/archive.mbox");
  busctl(kRunner, fmt::format("Run ss '{}' show", identifier));
  EXPECT_EQ(session->nextProgram(),
            "xdg-terminal-exec|tallow|show|--class=default|--|" + identifier);
  busctl(kRunner, "Teardown");
  EXPECT_THAT(gdbus(kShell, fmt::format("GetResultMetas \"['{}']\"", identifier)),
              HasSubstr("(@aa{sv} [],)"));
}

TEST_F(DesktopToolsTest, MailIsShownInATerminalWithoutAnOpener) {
  open(false);
  gdbus(kShell, "ActivateResult file/a%20b \"['x']\" 17");
  EXPECT_EQ(session->nextProgram(), "xdg-terminal-exec|tallow|show|--class=default|--|file/a%20b");
}

// One file for each desktop, and all name the same service.
TEST_F(DesktopFiles, NameTheService) {
  const std::string name = desktop::kBusName;
  const std::string path = desktop::kObjectPath;
  EXPECT_THAT(fileOf(name + ".service"), HasSubstr("\nName=" + name + "\n"));
  const std::string provider = fileOf(name + ".ini");
  EXPECT_THAT(provider, HasSubstr("\nBusName=" + name + "\n"));
  EXPECT_THAT(provider, HasSubstr("\nObjectPath=" + path + "\n"));
  EXPECT_THAT(provider, HasSubstr("\nDesktopId=" + name + ".desktop\n"));
  EXPECT_THAT(fileOf(name + ".desktop"), HasSubstr("[Desktop Entry]\n"));
  const std::string runner = fileOf("com.quill.tallow.Runner.desktop");
  EXPECT_THAT(runner, HasSubstr("\nX-Plasma-DBusRunner-Service=" + name + "\n"));
  EXPECT_THAT(runner, HasSubstr("\nX-Plasma-DBusRunner-Path=" + path + "\n"));
}

// What software centres and desktops read, checked by their own programs. Skipped without these,
// except with CI=true (scripts/ci-packages.list).
TEST_F(DesktopFiles, AreValid) {
  NEED_PROGRAMS("appstreamcli", "desktop-file-validate")
  const std::string packaging = TALLOW_PACKAGING;
  outputOfShell("appstreamcli validate --no-net --pedantic --strict " + packaging +
                "/appstream/com.quill.tallow.metainfo.xml");
  for (const auto& entry : std::filesystem::directory_iterator(packaging + "/desktop")) {
    if (entry.path().extension() != ".desktop") continue;
    outputOfShell("desktop-file-validate " + entry.path().string());
  }
}
