#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>
#include <sstream>

#include "platform/Files.h"
#include "salt/Quarantine.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/daemon/DaemonSupport.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/TemporaryDirectory.h"

// A class with a damaged index, next to a healthy one.
namespace {

namespace fs = std::filesystem;
using testsupport::DaemonProcess;
using testsupport::mails;
using testsupport::search;

class BadIndexTest : public testing::Test {
 protected:
  BadIndexTest() {
    DaemonProcess daemon(directory.path());
    client::SearchServiceProxy service(daemon.runtimeDirectory());
    for (const char* protectionClass : {"bad", "good"}) {
      EXPECT_TRUE(service.indexItems(mails("a", 10), "test", protectionClass, nullptr));
    }
    EXPECT_EQ(daemon.stop(), 0);
    fs::copy(root, kept, fs::copy_options::recursive);
  }

  // Restores the data as it was before all damage.
  void restore() const {
    fs::remove_all(root);
    fs::copy(kept, root, fs::copy_options::recursive);
  }
  void makeFile(const std::string& path) const {
    fs::remove_all(path);
    ASSERT_TRUE(platform::writeFileAtomically(path, "a file", nullptr));
  }
  void editOptions(const std::function<void(salt::Index::Options&)>& edit) const {
    salt::Index::Options options;
    edit(options);
    std::ostringstream bytes;
    ASSERT_TRUE(options.SerializeToOstream(bytes));
    const std::string value = bytes.str();
    salttest::editKey(index, "\xFFOPTIONS", &value);
  }
  // Inverts the first byte of each table.
  void damageTables() const {
    salttest::loadIndex(index).reset();  // from the log into a table
    for (const auto& entry : fs::directory_iterator(index)) {
      if (entry.path().extension() != ".ldb") continue;
      std::fstream file(entry.path(), std::ios::in | std::ios::out | std::ios::binary);
      const int byte = file.get();
      file.seekp(0);
      file.put(static_cast<char>(~byte));
    }
  }

  testsupport::TemporaryDirectory directory;
  const std::string root = directory / "state/TallowSearch";
  const std::string kept = directory / "kept";
  const std::string index = root + "/bad/salt";
};

}  // namespace

TEST_F(BadIndexTest, DamageInOneClassDoesNotAffectTheOther) {
  const struct {
    std::function<void()> damage;
    int64_t results;  // or the code of the error
    std::string line;
  } cases[] = {
      {[&] { salttest::editMetrics(index, [](auto& m) { m.CodeVersion = 303; }); }, 0,
       "SALT Loading failure: Mismatched code version."},
      {[&] { damageTables(); }, 0, "SALT Error scanning index: Corruption: corrupted"},
      {[&] { makeFile(index); }, 17, "TALIndexer Could not create intermediate directory"},
      {[&] { makeFile(root + "/bad"); }, 17, "Could not create bad protected directory"},
  };
  for (const auto& c : cases) {
    restore();
    c.damage();
    DaemonProcess daemon(directory.path());
    client::SearchServiceProxy service(daemon.runtimeDirectory());
    EXPECT_EQ(search(service, "a", "bad"), c.results) << c.line;
    EXPECT_EQ(search(service, "a", "good"), 10) << c.line;
    EXPECT_TRUE(daemon.waitForLog(c.line));
    EXPECT_TRUE(service.indexItems(mails("b", 1), "test", "good", nullptr));
    EXPECT_EQ(search(service, "word", "good"), 11) << c.line;
    EXPECT_EQ(daemon.stop(), 0);
  }
}

TEST_F(BadIndexTest, SetsAsideAnIndexAfterTwoCrashesAndKeepsTheOtherClass) {
  const std::string page("\x02", 1);
  const struct {
    std::function<void()> damage;
    std::string line;
  } cases[] = {
      {[&] { editOptions([](auto& op) { op.MaxShards = 0; }); }, "Assertion failed: op.Valid()"},
      {[&] {
         salttest::writePage(index, 1, "a", {{1, 0, 1, 0, {}}});
         salttest::editKey(index,
                           std::string("\x01"
                                       "a\0\x01\0\x01",
                                       6),
                           &page);
       },
       "Assertion failed: s.size()"},
  };
  for (const auto& c : cases) {
    restore();
    c.damage();
    for (int start = 0; start < 2; ++start) {
      DaemonProcess daemon(directory.path());
      client::SearchServiceProxy service(daemon.runtimeDirectory());
      EXPECT_EQ(search(service, "a", "good"), 10);
      EXPECT_NE(search(service, "a", "bad"), 0);
      EXPECT_EQ(daemon.wait(), 128 + SIGABRT);
      EXPECT_NE(daemon.log().find(c.line), std::string::npos) << c.line;
      EXPECT_TRUE(salt::indexesSetAside(index).empty());
    }
    DaemonProcess daemon(directory.path());
    client::SearchServiceProxy service(daemon.runtimeDirectory());
    EXPECT_EQ(search(service, "a", "bad"), 0);
    EXPECT_TRUE(daemon.waitForLog("The text index has ended the process twice within an hour"));
    EXPECT_EQ(salt::indexesSetAside(index).size(), 1u);
    EXPECT_EQ(search(service, "a", "good"), 10);
    EXPECT_TRUE(service.indexItems(mails("b", 2), "test", "bad", nullptr));
    EXPECT_EQ(search(service, "word", "bad"), 2);
    EXPECT_EQ(daemon.stop(), 0);
    EXPECT_FALSE(fs::exists(salt::crashNotesPath(index)));
  }
}

TEST_F(BadIndexTest, KillsDoNotCountAsDamage) {
  for (int start = 0; start < 3; ++start) {
    DaemonProcess daemon(directory.path());
    client::SearchServiceProxy service(daemon.runtimeDirectory());
    EXPECT_EQ(search(service, "a", "bad"), 10);
    daemon.signal(SIGKILL);
    daemon.wait();
  }
  EXPECT_TRUE(salt::indexesSetAside(index).empty());
}
