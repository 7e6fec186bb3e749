#include <filesystem>

#include "tests/support/Programs.h"
#include "tests/support/ShellTest.h"

using MetadataTest = testsupport::ShellTest;

// What software centres and desktops read, checked by their own programs. Skipped without these,
// except with CI=true (scripts/ci-packages.list).
TEST_F(MetadataTest, IsValid) {
  NEED_PROGRAMS("appstreamcli", "desktop-file-validate")
  const std::string packaging = TALLOW_PACKAGING;
  EXPECT_EQ(shell("appstreamcli validate --no-net --pedantic --strict " + packaging +
                  "/appstream/com.quill.tallow.metainfo.xml"),
            0)
      << output;
  for (const auto& entry : std::filesystem::directory_iterator(packaging + "/desktop")) {
    if (entry.path().extension() != ".desktop") continue;
    EXPECT_EQ(shell("desktop-file-validate " + entry.path().string()), 0) << output;
  }
}
