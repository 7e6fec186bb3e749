#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>

#include "client/SearchServiceProxy.h"
#include "platform/Text.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

namespace fs = std::filesystem;

// The subject of the first item, "" if there is none.
std::string first(client::SearchServiceProxy& service, const TLString& text) {
  TLQuery query;
  query.setOriginalQuery(text);
  const auto items = service.searchItems(query, 0, "default", 1, nullptr);
  if (!items || items->empty()) return "";
  return platform::printable(items->at(0)->stringValueForKey(TLAttributeKey::SUBJECT));
}

// "typed>replacement reason" for each word replaced by the last search.
std::string replaced(client::SearchServiceProxy& service) {
  std::optional<TLError> error;
  const auto words = service.replacedWords(&error);
  if (!words) return platform::printable(error);
  std::string text;
  for (const auto& word : *words) {
    text += (text.empty() ? "" : ", ") + word.typed + ">" + word.replacement + " " + word.reason;
  }
  return text;
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
  client::SearchServiceProxy other(daemon.runtimeDirectory());
  EXPECT_EQ(first(other, u"invoicing"), "First invoice for the shelves");
  EXPECT_EQ(replaced(service), "");
  const struct {
    TLString typed;  // occurs in no mail
    const char* subject;
    const char* replaced;
  } cases[] = {
      {u"bikes ", "Photos from the island", "bikes>bicycles synonym"},
      {u"bills december", "Your invoice 4471 for December", "bills>invoices synonym"},
      {u"automobile junction", "Train times for Saturday", "automobile>car synonym"},
      {u"invoice", "First invoice for the shelves", ""},  // found as typed
      {u"Invocie", "First invoice for the shelves", "invocie>invoice spelling"},
      {u"", "", ""},  // an error
      {u"invoicing", "First invoice for the shelves", "invoicing>invoic stem"},
      {u"repainting doubles", "Minutes of the rowing club",
       "repainting>repaint stem, doubles>doubl stem"},
      {u"zebras ", "", ""},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(first(service, c.typed), c.subject) << platform::toUTF8(c.typed);
    EXPECT_EQ(replaced(service), c.replaced) << platform::toUTF8(c.typed);
  }
  EXPECT_EQ(replaced(other), "invoicing>invoic stem");
  const std::string log = daemon.log();
  for (const char* line :
       {"en_synonyms.txt\n", "No match token <bikes> is considered for synonym expansion.",
        "Token <invoicing> is stemmed to <invoic>.", "Query modification didnt work out."}) {
    EXPECT_NE(log.find(line), std::string::npos) << line;
  }
}
