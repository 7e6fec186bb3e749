#pragma once

#include <fcntl.h>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <filesystem>
#include <set>

#include "platform/Text.h"
#include "sync/MailSync.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/sync/StoringDaemon.h"

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testsupport::StoringDaemon;
using Lines = std::multiset<std::string>;

// A mailbox with two Maildirs, and a daemon that stores what is sent to it.
class MailboxTest : public testing::Test {
 protected:
  MailboxTest() {
    for (const char* folder : {"a", "b"}) makeFolder(folder);
  }

  void makeFolder(const std::string& folder) const { directory.makeMaildir("mail/" + folder); }
  void put(const std::string& path, const std::string& content) const {
    directory.write("mail/" + path, content);
  }
  [[nodiscard]] mailsync::SyncSettings syncSettings() const {
    mailsync::SyncSettings settings;
    settings.runtimeDirectory = daemon.runtimeDirectory();
    settings.protectionClass = "default";
    settings.name = "tallow";
    settings.catalogueDirectory = directory / "state";
    return settings;
  }

  const testsupport::TemporaryDirectory directory;
  const std::string mail = directory / "mail";
  StoringDaemon daemon;
};

// Repeated syncs of the mailbox. `age` sets the times of files and directories back, each to a
// value not used before, so that changes can be detected.
class MailSyncTest : public MailboxTest {
 protected:
  MailSyncTest() { settings.lockPatience = std::chrono::milliseconds(0); }

  static std::string message(const std::string& subject) {
    return fmt::format(
        "From: a@example.org\nDate: Mon, 8 Jan 2024 08:00:00 +0000\n"
        "Subject: {}\n\nText of {}\n",
        subject, subject);
  }
  void add(const std::string& path, const std::string& subject) const {
    put(path, message(subject));
  }
  static std::string mboxOf(const std::vector<std::string>& subjects) {
    std::string text;
    for (const std::string& subject : subjects) {
      text += "From a@example.org Mon Jan  8 08:00:00 2024\n" + message(subject) + '\n';
    }
    return text;
  }
  void move(const std::string& from, const std::string& to) const {
    fs::rename(mail + '/' + from, mail + '/' + to);
  }
  void age() {
    std::vector<std::string> paths{mail};
    for (const auto& entry : fs::recursive_directory_iterator(mail)) paths.push_back(entry.path());
    for (const std::string& path : paths) {
      struct stat info {};
      if (stat(path.c_str(), &info) == 0 && info.st_mtime > 1'500'000'000) {
        const timespec time{1'000'000'000 + ++tick, 0};
        const timespec times[2] = {time, time};
        utimensat(AT_FDCWD, path.c_str(), times, 0);
      }
    }
  }

  bool sync(const std::vector<std::string>& paths = {}) {
    complaints.clear();
    plan.clear();
    error.reset();
    report = {};
    const mailsync::SyncObserver observer{
        [&](const std::string& where, const std::string& reason) {
          complaints.push_back(where + ": " + reason);
        },
        [](uint64_t, uint64_t, const mailsync::DeliveryCounts&) {}, [] { return false; },
        [&](const char* action, const std::string& what) {
          plan.push_back(std::string(action) + ' ' + what);
        }};
    return mailsync::syncMail(settings, paths.empty() ? std::vector{mail} : paths, observer, report,
                              &error);
  }

  // "FOLDER: SUBJECT" of each message in the index.
  [[nodiscard]] Lines indexed() const {
    Lines found;
    for (const auto& [identifier, item] : daemon.content().items) {
      const std::string folder =
          platform::toUTF8(item->stringValuesForKey(TLAttributeKey::MAILBOX_IDENTIFIERS)->front());
      found.insert(folder.substr(mail.size() + 1) + ": " +
                   platform::toUTF8(*item->stringValueForKey(TLAttributeKey::SUBJECT)));
    }
    return found;
  }
  // The same after a sync that must succeed.
  Lines synced() {
    EXPECT_TRUE(sync()) << platform::printable(error);
    return indexed();
  }
  [[nodiscard]] std::string cataloguePath() const {
    return mailsync::cataloguePath(settings.catalogueDirectory, settings.runtimeDirectory,
                                   settings.protectionClass);
  }

  mailsync::SyncSettings settings = syncSettings();
  mailsync::SyncReport report;
  std::optional<TLError> error;
  std::vector<std::string> complaints;
  std::vector<std::string> plan;
  int64_t tick = 0;
};
