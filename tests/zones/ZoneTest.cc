#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <thread>

#include "parameters/TLParamsManager.h"
#include "tests/support/TemporaryDirectory.h"
#include "zones/TALZoneManager.h"
#include "zones/zone.h"

using zone::Zone;
using Offsets = std::vector<uint32_t>;
using enum TLAttributeKey;

namespace {

// Makes the scores independent of the user defaults of the machine.
class EmptyDefaults : public testing::Environment {
 public:
  void SetUp() override { setenv("STATE_DIRECTORY", _directory.path().c_str(), 1); }

 private:
  testsupport::TemporaryDirectory _directory;
};
[[maybe_unused]] testing::Environment* const kEmptyDefaults =
    testing::AddGlobalTestEnvironment(new EmptyDefaults);

std::string withNULs(std::string_view shown) {
  std::string bytes(shown);
  std::replace(bytes.begin(), bytes.end(), '|', '\0');
  return bytes;
}

struct Attribute {
  TLAttributeKey key;
  TLString value;
  std::optional<TLString> customKey = std::nullopt;
};

std::unique_ptr<TLIndexableItem> item(TLStringView identifier,
                                      const std::vector<Attribute>& attributes) {
  auto made = std::make_unique<TLIndexableItem>();
  made->setIdentifier(TLString(identifier));
  for (const Attribute& each : attributes) {
    made->addAttributeWithKeyStringValue(each.key, each.value);
    made->attributes().back()->setCustomKey(each.customKey);
  }
  return made;
}

// "KEY=value " of each attribute in order.
std::string shown(const TLIndexableItem& item) {
  std::string text;
  for (const auto& each : item.attributes()) {
    text += TLAttribute::keyAsString(each->key()) + "=" + platform::printable(each->stringValue());
    text += ' ';
  }
  return text;
}

std::shared_ptr<TLParameters> parameters(TLStringView overrides) {
  return TLParamsManager::resolveOverrides(*TLParamsManager::paramsFromString(overrides), true);
}

}  // namespace

TEST(Zone, ValuesAreSeparatedByOneNUL) {
  Zone asIs;
  asIs.AddTextAsIs("a");
  asIs.AddTextAsIs("bc");
  EXPECT_EQ(asIs.text, withNULs("a|bc"));
  EXPECT_EQ(asIs.offsets, (Offsets{0, 2}));

  Zone tokenized;
  tokenized.AddTokenizedText("ab cd ");
  EXPECT_EQ(tokenized.offsets, (Offsets{0, 3}));
  tokenized.AddTokenizedText("");
  tokenized.AddTokenizedText("x  y");
  EXPECT_EQ(tokenized.text, withNULs("ab cd ||x  y"));
  EXPECT_EQ(tokenized.offsets, (Offsets{0, 3, 8, 10, 11}));

  const auto tokenizer = tokenizer::NewFastLexemonTokenizer("en_US");
  Zone text;
  text.AddText(u"?!", *tokenizer);
  text.AddText(u"One TWO", *tokenizer);
  text.AddText(u"\u00DCber", *tokenizer);
  EXPECT_EQ(text.text, withNULs("one two |uber "));
  EXPECT_EQ(text.offsets, (Offsets{0, 4, 9}));
}

TEST(Zone, ZonesAreMadeOnDemand) {
  zone::Zones zones;
  zones.GetZone(13).AddTextAsIs("a");
  Zone& first = zones.GetZone(13);
  for (uint16_t id = 100; id < 1000; ++id) EXPECT_TRUE(zones.GetZone(id).text.empty());
  EXPECT_EQ(&zones.GetZone(13), &first);
  EXPECT_EQ(first.text, "a");
  EXPECT_EQ(zones.size(), 901u);
}

TEST(ZoneManager, ZonesAreAttributeKeys) {
  const TALZoneManager manager;
  EXPECT_EQ(manager.zoneIDForAttributeKey(13, std::nullopt), 13);
  EXPECT_EQ(manager.zoneIDForAttributeKey(999, u"x"), 999);
  for (const int32_t key : {0, -1, INT32_MIN}) {
    EXPECT_EQ(manager.zoneIDForAttributeKey(key, std::nullopt), std::nullopt);
  }
  for (const std::optional<TLString>& custom : {std::optional<TLString>(), {u""}, {u"anything"}}) {
    EXPECT_EQ(manager.zoneIDForAttributeKey(1, custom), std::nullopt);
  }
}

// The tests of the query processor show the other scores, and the order of all zones.
TEST(ZoneManager, DefaultScoresOfZonesThatFreeTextDoesNotSearch) {
  TALZoneManager manager;
  manager.setupAttributeScoresWithSearchParams(*TLParamsManager::paramsFromFallback());
  for (const int32_t zone : {138, 165, 106, 180}) EXPECT_EQ(manager.scoreForZoneID(zone), 1.0F);
  for (const std::optional<int32_t> none : {std::optional<int32_t>(), {22}, {999}}) {
    EXPECT_EQ(manager.scoreForZoneID(none), std::nullopt);
  }
}

TEST(ZoneManager, ParametersOfASearchStayInForce) {
  TALZoneManager manager;
  manager.setupAttributeScoresWithSearchParams(*parameters(u"zoneScore.Subject=0.25"));
  EXPECT_EQ(manager.scoreForZoneID(13), 0.25F);
  EXPECT_EQ(manager.scoreForZoneID(107), 1.0F);
  manager.overrideScoreForZoneID(999, 3.0F);
  manager.overrideScoreForZoneID(107, std::nullopt);
  manager.overrideScoreForZoneID(std::nullopt, 1.0F);
  EXPECT_EQ(manager.scoreForZoneID(999), 3.0F);
  EXPECT_EQ(manager.scoreForZoneID(107), std::nullopt);
  manager.setupAttributeScoresWithSearchParams(*parameters(u"zoneScore.XFrom=0.5"));
  EXPECT_EQ(manager.scoreForZoneID(13), 0.9F);
  EXPECT_EQ(manager.scoreForZoneID(107), 1.0F);
  EXPECT_EQ(manager.scoreForZoneID(147), 0.5F);
  EXPECT_EQ(manager.scoreForZoneID(999), 3.0F);
}

TEST(ZoneManager, ScoresAreSetWhileOthersRead) {
  TALZoneManager manager;
  const auto low = parameters(u"zoneScore.Subject=0.25");
  const auto high = parameters(u"zoneScore.Subject=0.75");
  manager.setupAttributeScoresWithSearchParams(*low);
  std::thread writer([&] {
    for (int i = 0; i < 2000; ++i) {
      manager.setupAttributeScoresWithSearchParams(i % 2 == 0 ? *high : *low);
    }
  });
  for (int i = 0; i < 20000; ++i) {
    const auto score = manager.scoreForZoneID(13);
    EXPECT_TRUE(score == 0.25F || score == 0.75F);
    EXPECT_EQ(manager.scoreForZoneID(107), 1.0F);
  }
  writer.join();
}

TEST(ZoneManager, MergesAttributeByAttribute) {
  const auto old = item(u"old", {{SUBJECT, u"old"},
                                 {READ, u"no"},
                                 {AUTHORS, u"ann"},
                                 {CUSTOM, u"kept", u"k1"},
                                 {CUSTOM, u"replaced", u"k2"},
                                 {CUSTOM, u"nameless"},
                                 {AUTHORS, u"bob"}});
  const struct {
    std::vector<Attribute> attributes;
    const TLIndexableItem* old;
    std::string merged;
    bool shouldIndex;
  } cases[] = {
      {{{SUBJECT, u"new"}, {READ, u"yes"}},
       old.get(),
       "SUBJECT=new READ=yes AUTHORS=ann CUSTOM=kept CUSTOM=replaced CUSTOM=nameless AUTHORS=bob ",
       true},
      {{{READ, u"yes"}, {CUSTOM, u"mine", u"k2"}},
       old.get(),
       "READ=yes CUSTOM=mine SUBJECT=old AUTHORS=ann CUSTOM=kept CUSTOM=nameless AUTHORS=bob ",
       false},
      {{{CONTENT_TYPE, u"t"}}, nullptr, "CONTENT_TYPE=t ", true},
  };
  const std::string before = shown(*old);
  for (const auto& c : cases) {
    const auto added = item(u"id", c.attributes);
    bool shouldIndex = !c.shouldIndex;
    const auto merged = TALZoneManager().mergeNewDoc(*added, c.old, &shouldIndex);
    EXPECT_EQ(merged->identifier(), u"id");
    EXPECT_EQ(shown(*merged), c.merged);
    EXPECT_EQ(shouldIndex, c.shouldIndex) << c.merged;
    EXPECT_EQ(added->attributes().size(), c.attributes.size());
    EXPECT_EQ(shown(*old), before);
  }
}
