#include <fmt/format.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>

#include "tests/support/Programs.h"

// What software centres and desktops read, checked by their own programs. Skipped without these,
// except with CI=true (scripts/ci-packages.list).
TEST(MetadataTest, IsValid) {
  NEED_PROGRAMS("appstreamcli", "desktop-file-validate")
  const std::string packaging = TALLOW_PACKAGING;
  EXPECT_EQ(std::system(fmt::format("appstreamcli validate --no-net --pedantic --strict "
                                    "{}/appstream/com.quill.tallow.metainfo.xml",
                                    packaging)
                            .c_str()),
            0);
  for (const auto& entry : std::filesystem::directory_iterator(packaging + "/desktop")) {
    if (entry.path().extension() != ".desktop") continue;
    const std::string command = "desktop-file-validate " + entry.path().string();
    EXPECT_EQ(std::system(command.c_str()), 0) << entry.path();
  }
}
