#include <fmt/format.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <regex>
#include <set>

#include "platform/Files.h"
#include "rpc/Names.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/Programs.h"
#include "tests/support/TemporaryDirectory.h"

// General D-Bus tools call every operation as tallowsearchd(8) says. Skipped where a tool is
// missing, but not where CI=true (scripts/ci-packages.list).
namespace {

using testsupport::DaemonProcess;

constexpr size_t kMaxFileBytes = size_t{1} << 20;

class ServicePageTest : public testing::Test {
 protected:
  void SetUp() override {
    NEED_PROGRAMS("busctl", "gdbus")
    // The page's calls go to $XDG_RUNTIME_DIR/tallow.
    std::filesystem::create_directory_symlink(daemon.runtimeDirectory(), directory / "tallow");
  }

  int run(const std::string& commands) const {
    const std::string script = directory / "script";
    EXPECT_TRUE(platform::writeFileAtomically(script, commands, nullptr));
    return std::system(
        fmt::format("XDG_RUNTIME_DIR='{0}' sh -e '{1}' >'{0}/out' 2>&1", directory.path(), script)
            .c_str());
  }

  std::string output() const {
    return platform::readFile(directory / "out", kMaxFileBytes, nullptr).value_or("");
  }

  testsupport::TemporaryDirectory directory;
  DaemonProcess daemon{directory.path()};
};

// The lines of the example as they are shown.
std::string examplesOf(std::string page) {
  const size_t begin = page.find("SEARCH=");
  page = page.substr(begin, page.find(".fi", begin) - begin);
  page = std::regex_replace(page, std::regex(R"(\\-)"), "-");
  return std::regex_replace(page, std::regex(R"(\\e)"), "\\");
}

std::set<std::string> operationsOf(const std::string& text, const std::regex& name) {
  std::set<std::string> names;
  for (std::sregex_iterator found(text.begin(), text.end(), name), end; found != end; ++found) {
    names.insert((*found)[1]);
  }
  return names;
}

}  // namespace

TEST_F(ServicePageTest, EveryOperationIsCalledAsThePageSays) {
  ASSERT_TRUE(daemon.ready());
  const std::string examples =
      examplesOf(platform::readFile(TALLOW_DAEMON_PAGE, kMaxFileBytes, nullptr).value_or(""));
  std::set<std::string> operations;
  for (const char* service : {rpc::kSearchServiceName, rpc::kDebugServiceName}) {
    const auto description = platform::readFile(
        fmt::format("{}/{}.xml", TALLOW_INTERFACES, service), kMaxFileBytes, nullptr);
    operations.merge(operationsOf(description.value_or(""), std::regex("<method name=\"(\\w+)\"")));
  }
  EXPECT_EQ(operationsOf(examples, std::regex("com\\.quill\\.\\w+\\.\\w+ ([A-Z]\\w+)")),
            operations);
  EXPECT_EQ(run(examples), 0) << output();
}

TEST_F(ServicePageTest, ToolsForABusIntrospectAndCall) {
  ASSERT_TRUE(daemon.ready());
  const std::string service = rpc::kDebugServiceName;
  const std::string address = "unix:path=" + daemon.socketOf(service);
  const std::string path = rpc::objectPath(service);
  EXPECT_EQ(run(fmt::format("busctl --address={} introspect {} {}", address, service, path)), 0);
  EXPECT_NE(output().find(".FetchStatsForSalt"), std::string::npos) << output();
  const std::string gdbus =
      fmt::format("gdbus {{}} --address {} --dest {} --object-path {} ", address, service, path);
  EXPECT_EQ(run(fmt::format(fmt::runtime(gdbus), "introspect")), 0);
  EXPECT_NE(output().find("ForceVacuumAndCompact"), std::string::npos) << output();
  EXPECT_EQ(run(fmt::format(fmt::runtime(gdbus), "call") + "--method " + service + ".Ping hello"),
            0);
  EXPECT_NE(output().find("Received hello"), std::string::npos) << output();
}
