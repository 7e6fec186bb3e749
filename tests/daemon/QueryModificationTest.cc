#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>

#include "client/SearchServiceProxy.h"
#include "platform/Text.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

namespace fs = std::filesystem;

// The subject of the first item, "" for none.
std::string first(client::SearchServiceProxy& service, const TLString& text) {
  TLQuery query;
  query.setOriginalQuery(text);
  const auto items = service.searchItems(query, 0, "default", 1, nullptr);
  if (!items || items->empty()) return "";
  return platform::printable(items->at(0)->stringValueForKey(TLAttributeKey::SUBJECT));
}

}  // namespace

TEST(QueryModificationProcess, MailIsFoundByASynonymAndByAnInflectedForm) {
  const testsupport::TemporaryDirectory directory;
  fs::create_directories(directory / "state/TALLOW");
  fs::copy_file(TALLOW_SYNONYMS, directory / "state/TALLOW/en_synonyms.txt");
  testsupport::DaemonProcess daemon(directory.path());
  const std::string index = "'" TALLOW_PROGRAM "' --runtime-dir '" + daemon.runtimeDirectory() +
                            "' index '" TALLOW_SAMPLE_MAIL "' >/dev/null 2>&1";
  ASSERT_EQ(std::system(index.c_str()), 0);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  const struct {
    TLString typed;  // stands in no mail
    const char* subject;
  } cases[] = {
      {u"bikes ", "Photos from the island"},
      {u"bills december", "Your invoice 4471 for December"},
      {u"automobile junction", "Train times for Saturday"},
      {u"invoicing", "First invoice for the shelves"},
      {u"repainting doubles", "Minutes of the rowing club"},
      {u"zebras ", ""},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(first(service, c.typed), c.subject) << platform::toUTF8(c.typed);
  }
  const std::string log = daemon.log();
  for (const char* line :
       {"en_synonyms.txt\n", "No match token <bikes> is considered for synonym expansion.",
        "Token <invoicing> is stemmed to <invoic>.", "Query modification didnt work out."}) {
    EXPECT_NE(log.find(line), std::string::npos) << line;
  }
}
