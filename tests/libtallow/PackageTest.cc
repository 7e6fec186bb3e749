#include <fmt/format.h>
#include <gmock/gmock.h>

#include <filesystem>

#include "platform/Files.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/ShellTest.h"

using testing::HasSubstr;

// The library as other projects get it: installed, found, linked and run.
namespace {

constexpr size_t kMaxBytes = size_t{1} << 20;

class PackageTest : public testsupport::ShellTest {
 protected:
  void SetUp() override {
    for (const char* const component : {"libtallow", "libtallow_dev"}) {
      outputOfShell(fmt::format("{} --install {} --prefix {} --component {}", TALLOW_CMAKE,
                                TALLOW_BUILD_DIRECTORY, prefix, component));
    }
    write("project/example.cc", blockOfPage("```cpp\n"));
    write("project/CMakeLists.txt", blockOfPage("```cmake\n"));
  }

  static std::string blockOfPage(const std::string& fence) {
    const auto page = platform::readFile(TALLOW_LIBRARY_PAGE, kMaxBytes, nullptr).value_or("");
    const size_t begin = page.find(fence);
    if (begin == std::string::npos) return "";
    return page.substr(begin + fence.size(),
                       page.find("```", begin + fence.size()) - begin - fence.size());
  }

  // The program of the page, with and without a daemon.
  void tryExample(const std::string& program) {
    EXPECT_EQ(shell(program + " " + directory.path() + "/run"), 75);
    EXPECT_THAT(errors, HasSubstr("daemon not reachable"));
    const testsupport::DaemonProcess daemon(directory.path());
    EXPECT_EQ(outputOfShell(program + " " + daemon.runtimeDirectory()),
              "example/1: Harbour fees for March\n");
  }

  const std::string prefix = directory / "prefix";
  const std::string libraries = prefix + "/" TALLOW_LIBRARY_DIRECTORY;
};

}  // namespace

// The list has the types of a 64-bit system.
TEST_F(PackageTest, ExportsNothingButTheInterface) {
  const auto expected = platform::readFile(TALLOW_SYMBOLS, kMaxBytes, nullptr);
  EXPECT_EQ(outputOfShell("nm --dynamic --defined-only --demangle " + libraries +
                          "/libtallow.so | sed 's/^[0-9a-f]* //' | LC_ALL=C sort -u"),
            expected.value_or("(none)"));
  EXPECT_THAT(outputOfShell("readelf --dynamic " + libraries + "/libtallow.so | grep SONAME"),
              HasSubstr("[libtallow.so.1]"));
}

// No header needs another library, and each can be included alone.
TEST_F(PackageTest, HeadersStandAlone) {
  for (const auto& header : std::filesystem::directory_iterator(prefix + "/include/tallow")) {
    outputOfShell(
        fmt::format("{} -std=c++20 -Wall -Wextra -Wpedantic -Wshadow -Werror "
                    "-fsyntax-only -I{}/include -include {} -x c++ /dev/null",
                    TALLOW_COMPILER, prefix, header.path().string()));
    const auto text = platform::readFile(header.path().string(), kMaxBytes, nullptr).value_or("");
    EXPECT_EQ(text.find("#include \""), std::string::npos) << header.path();
  }
}

TEST_F(PackageTest, PkgConfigBuildsTheProgramOfThePage) {
  outputOfShell(
      fmt::format("export PKG_CONFIG_PATH={}/pkgconfig; {} -std=c++20 {} "
                  "project/example.cc $(pkg-config --cflags --libs tallow) "
                  "-Wl,-rpath,{} -o example",
                  libraries, TALLOW_COMPILER, TALLOW_COMPILER_FLAGS, libraries));
  tryExample("./example");
}

TEST_F(PackageTest, FindPackageBuildsTheProgramOfThePage) {
  outputOfShell(
      fmt::format("{0} -G Ninja -S project -B built -DCMAKE_PREFIX_PATH={1} "
                  "-DCMAKE_CXX_COMPILER={2} -DCMAKE_CXX_FLAGS='{3}' && {0} --build built",
                  TALLOW_CMAKE, prefix, TALLOW_COMPILER, TALLOW_COMPILER_FLAGS));
  tryExample("built/example");
}
