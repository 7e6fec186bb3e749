#include <gtest/gtest.h>

#include <chrono>
#include <filesystem>

#include "cli/MailReader.h"
#include "sync/MessageDigest.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

const std::string kFirst = "Subject: one\n\nfirst\n";
const std::string kSecond = "Subject: two\n\nsecond\n>From here on\n";
const std::string kFrom = "From mara@example.com Mon Feb  5 09:30:00 2024\n";

class MailReaderTest : public testing::Test {
 protected:
  [[nodiscard]] std::optional<std::string> read(const std::string& identifier, size_t most = 1000) {
    _error.reset();
    cli::MailReader reader([this](const std::string&) { return _offset; });
    return reader.read(identifier, most, &_error);
  }

  const testsupport::TemporaryDirectory _directory;
  const std::string _path = _directory.path() + "/archive.mbox";
  std::optional<uint64_t> _offset;
  std::optional<TLError> _error;
};

// The catalogue may be older than the mailbox: another message may be at the old offset.
TEST_F(MailReaderTest, FindsAMessageByContentOrNotAtAll) {
  const std::string unquoted = "Subject: two\n\nsecond\nFrom here on\n";
  const std::string name =
      cli::mboxIdentifier(_path, std::string_view(mailsync::messageDigest(unquoted)));
  _directory.write("archive.mbox", kFrom + kFirst + "\n" + kFrom + kSecond);
  EXPECT_FALSE(read(name)) << "nobody knows where it is";

  _offset = kFrom.size() + kFirst.size() + 1;
  EXPECT_EQ(read(name), unquoted);
  EXPECT_EQ(read(name + ".2"), unquoted);
  EXPECT_EQ(read(name, 7), "Subject");

  _offset = 0;
  EXPECT_FALSE(read(name));
  ASSERT_TRUE(_error);
  EXPECT_EQ(_error->message, "the mailbox has changed since the last sync");

  _offset = 5;  // inside a message
  EXPECT_FALSE(read(name));
  _offset = 100000;
  EXPECT_FALSE(read(name));
}

// Directories are listed once, and again only after `refresh`, if they have changed.
TEST_F(MailReaderTest, ListsAChangedMaildirAgain) {
  namespace fs = std::filesystem;
  const std::string maildir = _directory / "Mail";
  fs::create_directories(maildir + "/cur");
  _directory.write("Mail/new/1.M1.host", kFirst);
  const std::string identifier = cli::maildirIdentifier(maildir + "/new/1.M1.host");
  cli::MailReader reader;
  const auto path = [&] {
    const auto location = reader.locate(identifier);
    return location ? location->path : "";
  };
  EXPECT_EQ(path(), maildir + "/new/1.M1.host");
  fs::rename(maildir + "/new/1.M1.host", maildir + "/cur/1.M1.host:2,S");
  // Directory times have the resolution of clock ticks.
  fs::last_write_time(maildir + "/cur", fs::file_time_type::clock::now() + std::chrono::hours(1));
  EXPECT_EQ(path(), maildir + "/new/1.M1.host");
  reader.refresh();
  EXPECT_EQ(path(), maildir + "/cur/1.M1.host:2,S");
}

}  // namespace
