#include <gmock/gmock.h>

#include <map>

#include "tests/cli/SampleMail.h"

using Key = TLAttributeKey;
using testing::HasSubstr;

namespace {

// The sample mailbox, by subject.
class SampleMail : public testing::Test {
 protected:
  static void SetUpTestSuite() {
    testsupport::forEachSampleMail(
        [](auto&, auto, auto&, const TLIndexableItem& item) { add(item); });
  }

  static void add(const TLIndexableItem& item) {
    ++count;
    bySubject[text(item.stringValueForKey(Key::SUBJECT))] = item.copyWithZone();
    byFolder[text(item.stringValuesForKey(Key::MAILBOXES)->at(0))]++;
  }
  static std::string text(const std::optional<TLString>& value) {
    return platform::toUTF8(platform::orEmpty(value));
  }
  static const TLIndexableItem& named(const std::string& subject) {
    static const TLIndexableItem none;
    const auto& found = bySubject[subject];
    EXPECT_NE(found, nullptr) << subject;
    return found == nullptr ? none : *found;
  }
  static std::string body(const std::string& subject) {
    return text(named(subject).stringValueForKey(Key::TEXT_CONTENT));
  }

  static inline size_t count = 0;
  static inline std::map<std::string, std::shared_ptr<TLIndexableItem>> bySubject;
  static inline std::map<std::string, int> byFolder;
};

}  // namespace

TEST_F(SampleMail, EveryMessageIsRead) {
  EXPECT_EQ(count, 41u);
  EXPECT_EQ(byFolder, (std::map<std::string, int>{{"archive", 29}, {"drafts", 2}, {"family", 10}}));
}

TEST_F(SampleMail, EveryFormOfTextArrives) {
  const std::pair<const char*, const char*> cases[] = {
      {"Keys for the boat shed", "padlock is stiff"},
      {"Café de la Gare, vendredi ?", "la crème\nbrûlée"},
      {"京都旅行の予定", "新幹線の切符"},
      {"Re: 京都旅行の予定", "東京駅の銀の鈴"},
      {"Рукопись второй главы", "смотрителем маяка"},
      {"Blumenzwiebeln für den Hof", "heißen Kakao"},
      {"Three loans are due on Friday", "Lighthouse Keeper’s Almanac"},
      {"Offer for the kitchen shelves", "oiled ash"},
      {"Photos from the island", "¡Un abrazo!"},
      {"Photos from the island", "Departure from pier 3"},
      {"Minutes of the rowing club", "agreed to repaint both doubles"},
      {"[allotment] Seed swap", "From now on the seed swap"},
      {"Re: Surprise for Elena", "D’accord pour l’accordéon"},
      {"Randonnée dimanche", "belvédère"},
      {"Recipe for miso soup", "味噌汁"},
  };
  for (const auto& [name, words] : cases) EXPECT_THAT(body(name), HasSubstr(words)) << name;
  const std::string empty = "(no text, see subject) bring the ladder please";
  EXPECT_FALSE(named(empty).stringValueForKey(Key::TEXT_CONTENT).has_value());
  for (const auto& [subject, words] :
       {std::pair("Seven winter vegetables, one basket", "salsify &amp; chicory"),
        std::pair("Corrected invoice 4502", "Straße und Hausnummer"),
        std::pair("Oarlock fixed", "Ma&ntilde;ana")}) {
    EXPECT_TRUE(body(subject).empty());
    EXPECT_THAT(named(subject).bytesValueForKey(Key::HTML_CONTENT_DATA).value_or(""),
                HasSubstr(words));
  }
}

TEST_F(SampleMail, HeadersAndAttachmentsArrive) {
  const TLIndexableItem& offer = named("Offer for the kitchen shelves");
  EXPECT_EQ(*offer.stringValuesForKey(Key::ATTACHMENT_NAMES),
            (std::vector<TLString>{u"offer-2024-017.pdf", u"Küche Ansicht.png"}));
  EXPECT_EQ(*offer.stringValuesForKey(Key::ATTACHMENT_TYPES),
            (std::vector<TLString>{u"application/pdf", u"image/png"}));
  const TLIndexableItem& surprise = named("Surprise for Elena");
  EXPECT_EQ(surprise.personValuesForKey(Key::HIDDEN_ADDITIONAL_RECIPIENTS)->size(), 2u);
  EXPECT_EQ(
      text(named("[allotment] Water is turned off on Thursday").stringValueForKey(Key::X_FROM)),
      "Priya Nair <priya.nair@example.org>");
  EXPECT_EQ(text(named("京都旅行の予定").personValuesForKey(Key::AUTHORS)->at(0)->name()),
            "佐藤 由紀");
  // Received is 14 seconds after Date; a draft has no date of receipt.
  const TLIndexableItem& keys = named("Keys for the boat shed");
  EXPECT_EQ(keys.doubleValueForKey(Key::MAIL_DATE_RECEIVED),
            keys.doubleValueForKey(Key::CONTENT_CREATION_DATE) + 14);
  const TLIndexableItem& draft = named("Draft: notes on chapter two");
  EXPECT_EQ(draft.doubleValueForKey(Key::MAIL_DATE_RECEIVED),
            draft.doubleValueForKey(Key::CONTENT_CREATION_DATE));
  EXPECT_THAT(text(named("Piano for sale").identifier()),
              testing::EndsWith("family/cur/1707388380.M004.harbour"));
}
