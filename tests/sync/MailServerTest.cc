#include "tests/sync/WatchProcessSupport.h"

// The watch in a usual setup: an IMAP server, and a program that copies its mail into a Maildir.

namespace fs = std::filesystem;

namespace {

constexpr const char* kServer = "/usr/lib/dovecot/imap";
constexpr const char* kCopier = "/usr/bin/mbsync";
constexpr int kFolders = 20;
constexpr int kMails = 500;
constexpr uid_t kNobody = 65534;  // the server refuses root

class MailServerTest : public testsupport::WatchProcessTest {
 protected:
  void SetUp() override {
    NEED_PROGRAMS(kServer, kCopier)
    const bool root = geteuid() == 0;
    write("server.conf",
          fmt::format("mail_location = maildir:{0}/server\nbase_dir = {0}/base\n"
                      "mail_fsync = never\nmail_uid = {1}\nmail_gid = {2}\nfirst_valid_uid = "
                      "0\nfirst_valid_gid = 0\n"
                      "namespace inbox {{\n  inbox = yes\n  separator = /\n}}\n",
                      directory.path(), root ? kNobody : getuid(), root ? kNobody : getgid()));
    write("copier.conf",
          fmt::format(
              "FSync no\n\nIMAPAccount server\nTunnel \"{} | cat\"\n\n"
              "IMAPStore far\nAccount server\n\n"
              "MaildirStore near\nPath {}/\nInbox {}/INBOX\nSubFolders Verbatim\n\n"
              "Channel all\nFar :far:\nNear :near:\nPatterns folder*\nCreate Near\nRemove Near\n"
              "Expunge Near\nSyncState *\n",
              serverCommand(), mail, mail));
    fs::permissions(directory.path(), fs::perms(0711));
    for (const char* path : {"/server", "/base"}) {
      fs::create_directories(directory.path() + path);
      if (root) {
        ASSERT_EQ(chown((directory.path() + path).c_str(), kNobody, kNobody), 0);
      }
    }
  }
  [[nodiscard]] std::string serverCommand() const {
    return fmt::format("{0} -c {1}/server.conf 2>>{1}/server.log", kServer, directory.path());
  }
  void runAsUser(const std::string& command) {
    outputOfShell(fmt::format("env -i HOME={} USER=mara PATH=/usr/bin:/bin:/usr/sbin {}",
                              directory.path(), command));
    if (HasFailure()) ADD_FAILURE() << read("server.log");
  }
  // Runs the commands of one session, one per line.
  void serve(const std::vector<std::string>& commands) {
    std::string session;
    for (const std::string& command : commands) session += "x " + command + "\r\n";
    write("session", session + "x LOGOUT\r\n");
    runAsUser(fmt::format("sh -c 'cat session | {}'", serverCommand()));
    EXPECT_EQ(output.find("\nx NO"), std::string::npos) << output;
    EXPECT_EQ(output.find("\nx BAD"), std::string::npos) << output;
  }
  static std::string append(int folder, int number) {
    const std::string text = fmt::format(
        "From: mara@example.org\r\nMessage-ID: <{0}@example.org>\r\nSubject: number {0}\r\n\r\n"
        "Text {0}\r\n",
        number);
    return fmt::format("APPEND folder{} {{{}+}}\r\n{}", folder, text.size(), text);
  }
  // The number of indexed messages, once the index matches the copied mail.
  size_t copied() {
    runAsUser(fmt::format("{} -c copier.conf -a", kCopier));
    return waitUntilInStep();
  }
};

}  // namespace

TEST_F(MailServerTest, TheIndexFollowsTheServer) {
  std::vector<std::string> commands;
  for (int i = 0; i < kFolders; ++i) commands.push_back(fmt::format("CREATE folder{}", i));
  for (int i = 0; i < kMails; ++i) commands.push_back(append(i % kFolders, i));
  serve(commands);
  EXPECT_EQ(copied(), static_cast<size_t>(kMails));
  serve({"SELECT folder1", "MOVE 1:10 folder2", "STORE 1:5 +FLAGS (\\Flagged \\Seen)",
         "SELECT folder3", "STORE 1:20 +FLAGS (\\Deleted)", "EXPUNGE", append(4, kMails)});
  EXPECT_EQ(copied(), static_cast<size_t>(kMails - 20 + 1));
  serve({"SELECT folder2", "COPY 1:* folder6", append(0, kMails + 1)});
  EXPECT_EQ(copied(), static_cast<size_t>(kMails - 20 + 2 + 35));
  EXPECT_EQ(watch->end(SIGTERM), 0);
}
