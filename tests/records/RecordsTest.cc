#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <nlohmann/json.hpp>
#include <random>
#include <stdexcept>

#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"
#include "tests/records/Hex.h"

using testsupport::bytes;
using testsupport::hex;

namespace {

std::shared_ptr<TLPerson> person(std::optional<TLString> name, std::optional<TLString> email) {
  auto result = std::make_shared<TLPerson>();
  result->setName(std::move(name));
  result->setEmailAddress(std::move(email));
  return result;
}

// An attribute with every field set.
std::shared_ptr<TLAttribute> richAttribute() {
  auto attribute = std::make_shared<TLAttribute>();
  attribute->setKey(TLAttributeKey::TEXT_CONTENT);
  attribute->setCustomKey(u"c");
  attribute->setStringValue(u"gr\u00fc\u00df");
  attribute->setIntValue(-1);
  attribute->setFloatValue(1.5F);
  attribute->setDoubleValue(-2.5);
  attribute->setBoolValue(true);
  attribute->setPersonValue(person(u"Ann", std::nullopt));
  attribute->setBytesValue(std::string("\0\xFF", 2));
  attribute->setStringValues({u"", u"b"});
  attribute->addPersonValues(person(std::nullopt, u"x@y"));
  attribute->addPersonValues(person(std::nullopt, std::nullopt));
  return attribute;
}

std::shared_ptr<TLIndexableItem> richItem() {
  auto item = std::make_shared<TLIndexableItem>();
  item->setIdentifier(u"id");
  item->setDomainIdentifier(u"inbox");
  item->setExpirationDate(1234567890123);
  item->addAttributes(richAttribute());
  item->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, TLString(300, u's'));
  item->setCard(std::make_shared<TLCard>());
  item->card()->setTextScore(0.5F);
  item->card()->setFreshness(3);
  return item;
}

// A chain of `levels` nodes, each the only child of the previous one.
std::shared_ptr<TLQueryNode> chain(int levels) {
  std::shared_ptr<TLQueryNode> top;
  for (int i = 0; i < levels; ++i) {
    auto node = std::make_shared<TLQueryNode>();
    if (top) node->addChild(std::move(top));
    top = std::move(node);
  }
  return top;
}

// The wire form of a node with `levels` nested nodes.
std::string chainBytes(int levels) {
  std::string reversed;
  for (int i = 0; i < levels; ++i) {
    TLWriter length;
    length.writeVarint(reversed.size());
    reversed.append(length.bytes().rbegin(), length.bytes().rend());
    reversed += '\x4a';
  }
  return {reversed.rbegin(), reversed.rend()};
}

}  // namespace

TEST(Records, SubRecordsOf127And128BytesGetTheRightLengthPrefix) {
  for (const size_t length : {125, 126, 127, 128, 16383, 16384, 2097152}) {
    TLIndexableItem item;
    item.addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, TLString(length, u'x'));
    TLIndexableItem back;
    ASSERT_TRUE(back.initWithData(item.data())) << length;
    EXPECT_TRUE(back.isEqual(item)) << length;
  }
}

TEST(Records, PresenceAndDefaults) {
  TLAttribute attribute;
  attribute.setIntValue(7);
  attribute.setHasIntValue(false);
  EXPECT_EQ(attribute.intValue(), 7);
  EXPECT_EQ(attribute.data(), "");
  attribute.setHasIntValue(true);
  EXPECT_EQ(hex(attribute.data()), "20 07");
  attribute.setHasIntValue(false);
  attribute.setStringValue(TLString(1, char16_t(0xD800)));
  EXPECT_EQ(hex(attribute.data()), "1a 03 ef bf bd");
  attribute.setKey(TLAttributeKey::SUBJECT);
  attribute.setHasKey(false);
  EXPECT_EQ(attribute.key(), TLAttributeKey::UNKNOWN);
  EXPECT_FALSE(attribute.hasKey());

  TLQueryNode fresh;
  EXPECT_EQ(fresh.op(), TLQueryNodeOp::STRING_EQUAL);
  EXPECT_EQ(fresh.mergeOp(), TLQueryNodeMergeOp::LEAF);
  fresh.setOp(TLQueryNodeOp::INT_LESS);
  fresh.setHasOp(false);
  EXPECT_EQ(fresh.op(), TLQueryNodeOp::STRING_EQUAL);
  TLQueryNode leaf;
  leaf.setMergeOp(TLQueryNodeMergeOp::LEAF);
  EXPECT_FALSE(leaf.isEqual(fresh));
  EXPECT_FALSE(fresh.isEqual(TLAttribute()));
}

// Invalid input, or input as other writers produce it: what is read is checked by writing it again.
template <typename Record>
void expectRead(const std::string& input, bool result, const std::string& rewritten) {
  Record record;
  EXPECT_EQ(record.initWithData(bytes(input)), result) << input;
  EXPECT_EQ(hex(record.data()), rewritten) << input;
}

TEST(Records, ReadsTheOutputOfOtherWriters) {
  expectRead<TLIndexableItem>("", true, "12 00");
  // Unknown fields of every wire type, field 0, and a field number above 32 bits.
  expectRead<TLAttribute>("60 05 08 0d", true, "08 0d");
  expectRead<TLAttribute>("61 01 02 03 04 05 06 07 08 08 0d", true, "08 0d");
  expectRead<TLAttribute>("62 02 08 01 65 01 02 03 04 02 00 08 0d", true, "08 0d");
  expectRead<TLAttribute>("f8 ff ff ff ff ff 01 05 08 0d", true, "08 0d");
  expectRead<TLCard>("4d 00 00 80 3f 0d 00 00 80 3f", true, "0d 00 00 80 3f");
  // A group is skipped with its contents, including nested groups.
  expectRead<TLAttribute>("63 08 01 6b 12 01 00 6c 64 08 0d", true, "08 0d");
  // An end tag validly ends the record.
  expectRead<TLAttribute>("08 0d 0c 20 07", true, "08 0d");
  // The wire type of a known field is ignored: field 5 takes four bytes, field 1 a varint.
  expectRead<TLAttribute>("28 00 00 80 3f 0a 0d", true, "08 0d 2d 00 00 80 3f");
  // The key keeps the low 32 bits; a boolean is any value other than 0.
  expectRead<TLAttribute>("08 8d 80 80 80 80 01 38 80 02", true, "08 0d 38 01");
  // A later value wins; a later person replaces the earlier one completely.
  expectRead<TLAttribute>("1a 01 61 1a 00", true, "1a 00");
  expectRead<TLAttribute>("42 03 0a 01 61 42 03 12 01 62", true, "42 03 12 01 62");
  // Ten bytes with their top bit set yield 0, and the eleventh byte is the next tag.
  expectRead<TLAttribute>("20 ff ff ff ff ff ff ff ff ff ff 08 0d", true, "08 0d 20 00");
  expectRead<TLAttribute>("20 ff ff ff ff ff ff ff ff ff 7f", true,
                          "20 ff ff ff ff ff ff ff ff ff 01");
  expectRead<TLAttribute>("20 80 80 80 80 80 80 80 80 80 01", true,
                          "20 80 80 80 80 80 80 80 80 80 01");
  // Packed keys, also negative ones and mixed with single ones.
  expectRead<TLQueryNode>("0a 0d 0d ab 01 ff ff ff ff ff ff ff ff ff 01 08 02 0a 00", true,
                          "08 0d 08 ab 01 08 ff ff ff ff ff ff ff ff ff 01 08 02");
  // Invalid UTF-8 becomes U+FFFD.
  expectRead<TLAttribute>("1a 02 61 ff", true, "1a 04 61 ef bf bd");
}

TEST(Records, RefusesBadInputAndKeepsWhatWasRead) {
  expectRead<TLAttribute>("08 0d 20", false, "08 0d 20 00");
  expectRead<TLAttribute>("08", false, "08 00");
  expectRead<TLAttribute>("80", false, "");
  expectRead<TLAttribute>("31 00 00 00 00 00 00 04", false, "31 00 00 00 00 00 00 00 00");
  expectRead<TLAttribute>("2d 00 00 c0", false, "2d 00 00 00 00");
  expectRead<TLAttribute>("1a 05 61", false, "");
  expectRead<TLAttribute>("1a ff ff ff ff ff ff ff ff ff 01 61", false, "");
  expectRead<TLAttribute>("66 00", false, "");
  expectRead<TLAttribute>("67 00", false, "");
  expectRead<TLAttribute>("62 05 00", false, "");
  expectRead<TLAttribute>("65 00 00", false, "");
  expectRead<TLAttribute>("63 08 01", false, "");
  expectRead<TLAttribute>("08 0d 42 09 0a 01", false, "08 0d 42 00");
  expectRead<TLAttribute>("42 03 0a 05 61 08 0d", false, "42 00");
  expectRead<TLIndexableItem>("0a 04 08 0d 1a 05", false, "0a 02 08 0d 12 00");
  expectRead<TLQueryNode>("0a 02 0d ab 01", false, "08 0d 08 00");
}

// Attributes kept in wire form compared with attributes decoded at once.
TEST(Records, WrittenItemsStayInWireFormUntilRead) {
  const auto date = TLAttributeKey::MAIL_DATE_RECEIVED;
  const auto item = richItem();
  item->setCard(nullptr);
  item->addAttributeWithKeyDoubleValue(date, 1.5);
  item->addAttributeWithKeyDoubleValue(date, 2.5);
  const std::string written = item->data();

  TLIndexableItem kept;
  ASSERT_TRUE(kept.initWithWrittenData(written));
  EXPECT_EQ(kept.data(), written);
  EXPECT_EQ(kept.doubleValueForKey(date), 1.5);
  EXPECT_EQ(kept.doubleValueForKey(TLAttributeKey::START_DATE), 0);
  kept.setCard(std::make_shared<TLCard>());
  EXPECT_EQ(kept.data(), written + "\x2A" + std::string(1, '\0'));
  kept.setCard(nullptr);
  TLIndexableItem sharing;
  kept.copyTo(sharing);
  EXPECT_EQ(sharing.attributesAtIndex(0), kept.attributesAtIndex(0));
  EXPECT_TRUE(kept.isEqual(*item));
  EXPECT_EQ(kept.data(), written);
  kept.addAttributeWithKeyBoolValue(TLAttributeKey::KIND, true);
  EXPECT_EQ(kept.attributesCount(), item->attributesCount() + 1);

  std::mt19937 random(7);
  size_t accepted = 0;
  for (int round = 0; round < 20000; ++round) {
    std::string bytes = written.substr(0, random() % 4 == 0 ? random() % written.size() : SIZE_MAX);
    for (size_t n = random() % 3; n > 0 && !bytes.empty(); --n) {
      bytes[random() % bytes.size()] = static_cast<char>(random());
    }
    TLIndexableItem mutated;
    if (!mutated.initWithWrittenData(bytes)) continue;
    ++accepted;
    TLIndexableItem plain;
    ASSERT_TRUE(plain.initWithData(bytes));
    TLIndexableItem received;
    ASSERT_TRUE(received.initWithData(mutated.data()));
    ASSERT_EQ(received.data(), plain.data());
    ASSERT_EQ(mutated.attributesCount(), plain.attributesCount());
    ASSERT_EQ(mutated.data(), plain.data());
  }
  EXPECT_GT(accepted, 1000U);
  EXPECT_LT(accepted, 19000U);
}

TEST(Records, NestingIsBounded) {
  TLQueryNode deepest;
  EXPECT_TRUE(deepest.initWithData(chainBytes(kMaxRecordDepth)));
  EXPECT_EQ(deepest.data(), chainBytes(kMaxRecordDepth));
  EXPECT_TRUE(deepest.copyWithZone()->isEqual(deepest));
  EXPECT_EQ(deepest.copyWithZone()->hash(), deepest.hash());
  EXPECT_FALSE(deepest.dictionaryRepresentation().empty());
  for (const int levels : {kMaxRecordDepth + 1, 100000}) {
    TLQueryNode node;
    EXPECT_FALSE(node.initWithData(chainBytes(levels))) << levels;
  }
  const auto built = chain(100000);
  EXPECT_DEATH((void)built->data(), "kMaxRecordDepth");
  EXPECT_DEATH((void)built->hash(), "kMaxRecordDepth");
}

TEST(Records, NumberOfElementsIsBounded) {
  for (const char* element : {"\x5a\x00", "\x52\x00"}) {
    std::string input;
    for (uint32_t i = 0; i < kMaxRecordElements; ++i) input.append(element, 2);
    EXPECT_TRUE(TLAttribute().initWithData(input));
    input.append(element, 2);
    EXPECT_FALSE(TLAttribute().initWithData(input));
  }
}

TEST(Records, HashOfNumbers) {
  const auto hashOf = [](double value) {
    TLCard card;
    card.setFreshness(value);
    return card.hash();
  };
  constexpr uint64_t factor = 2654435761;
  EXPECT_EQ(hashOf(0), 0U);
  EXPECT_EQ(hashOf(3), 3 * factor);
  EXPECT_EQ(hashOf(-3), 3 * factor);
  EXPECT_EQ(hashOf(2.25), 2 * factor + (uint64_t{1} << 62));
  EXPECT_EQ(hashOf(2.75), 3 * factor - (uint64_t{1} << 62));
  EXPECT_EQ(hashOf(0x1p64), 0U);
  EXPECT_EQ(hashOf(0x1p64 + 0x1p12), 4096 * factor);
  for (const double odd :
       {std::numeric_limits<double>::infinity(), std::nan(""), 1e308, 0x1p52 + 1}) {
    EXPECT_EQ(hashOf(odd), hashOf(-odd));
  }
  TLAttribute attribute;
  attribute.setIntValue(-1);
  EXPECT_EQ(attribute.hash(), uint64_t{0} - factor);
}

TEST(Records, CopyingSharesOrCopies) {
  const auto item = richItem();
  TLIndexableItem shared;
  shared.addAttributeWithKeyBoolValue(TLAttributeKey::READ, true);
  item->copyTo(shared);
  EXPECT_TRUE(shared.isEqual(*item));
  EXPECT_EQ(shared.card(), item->card());
  EXPECT_EQ(shared.attributesAtIndex(0), item->attributesAtIndex(0));

  const auto deep = item->copyWithZone();
  EXPECT_NE(deep->card(), item->card());
  EXPECT_NE(deep->attributesAtIndex(0), item->attributesAtIndex(0));
  EXPECT_NE(deep->attributesAtIndex(0)->personValue(), item->attributesAtIndex(0)->personValue());

  // copyTo keeps fields that the source lacks; a new copy does not have them.
  TLIndexableItem nothing;
  nothing.setIdentifier(std::nullopt);
  nothing.copyTo(shared);
  EXPECT_TRUE(shared.isEqual(*item));
  EXPECT_FALSE(nothing.copyWithZone()->hasIdentifier());
}

TEST(Records, MergingSharesNewSubRecordsAndMergesIntoOldOnes) {
  TLAttribute target;
  TLAttribute source;
  source.addPersonValues(person(u"Bob", std::nullopt));
  target.mergeFrom(source);
  EXPECT_EQ(target.personValuesAtIndex(0), source.personValuesAtIndex(0));

  TLQuery query;
  TLQuery other;
  other.setRoot(chain(2));
  query.mergeFrom(other);
  EXPECT_EQ(query.root(), other.root());
  query.setRoot(other.root()->copyWithZone());
  query.mergeFrom(other);
  EXPECT_EQ(query.root()->childAtIndex(1), other.root()->childAtIndex(0));
  other.mergeFrom(other);
  EXPECT_EQ(other.root()->childsCount(), 1U);
}

TEST(Records, TypedReadersSeeTheFirstAttributeOnly) {
  TLIndexableItem item;
  item.addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, u"first");
  item.addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, u"second");
  item.addAttributeWithKeyIntValue(TLAttributeKey::PRIORITY, 3);
  item.addAttributeWithKeyBoolValue(TLAttributeKey::READ, true);
  item.addAttributeWithKeyFloatValue(TLAttributeKey::KIND, 0.5F);
  item.addAttributeWithKeyDoubleValue(TLAttributeKey::MAIL_DATE_RECEIVED, 12.5);
  item.addAttributeWithKeyBytesValue(TLAttributeKey::HTML_CONTENT_DATA, "<p>");
  item.addAttributeWithKeyPersonValue(TLAttributeKey::AUTHORS, person(u"Ann", std::nullopt));
  item.addAttributeWithKeyStringValues(TLAttributeKey::MAILBOXES, {{u"in", u"all"}});
  item.addPersonsWithKey(TLAttributeKey::RECIPIENTS, {u"a@b", u"c@d"});
  ASSERT_EQ(item.attributesCount(), 10U);
  item.addAttributeWithKeyStringValue(TLAttributeKey::URL, std::nullopt);
  item.addAttributeWithKeyBytesValue(TLAttributeKey::URL, std::nullopt);
  item.addAttributeWithKeyPersonValue(TLAttributeKey::URL, nullptr);
  item.addAttributeWithKeyStringValues(TLAttributeKey::URL, std::nullopt);
  item.addAttributeWithKeyPersonValues(TLAttributeKey::URL, std::nullopt);
  EXPECT_EQ(item.attributesCount(), 10U) << "a null value appends nothing";

  EXPECT_EQ(item.stringValueForKey(TLAttributeKey::SUBJECT), u"first");
  EXPECT_EQ(item.attributesForKey(TLAttributeKey::SUBJECT).size(), 2U);
  EXPECT_EQ(item.intValueForKey(TLAttributeKey::PRIORITY), 3);
  EXPECT_TRUE(item.boolValueForKey(TLAttributeKey::READ));
  EXPECT_EQ(item.floatValueForKey(TLAttributeKey::KIND), 0.5F);
  EXPECT_EQ(item.doubleValueForKey(TLAttributeKey::MAIL_DATE_RECEIVED), 12.5);
  EXPECT_EQ(item.bytesValueForKey(TLAttributeKey::HTML_CONTENT_DATA), "<p>");
  EXPECT_EQ(item.personValueForKey(TLAttributeKey::AUTHORS)->name(), u"Ann");
  EXPECT_EQ(item.stringValuesForKey(TLAttributeKey::MAILBOXES)->size(), 2U);
  EXPECT_EQ(item.personValuesForKey(TLAttributeKey::RECIPIENTS)->at(1)->emailAddress(), u"c@d");

  EXPECT_EQ(item.attributeForKey(TLAttributeKey::URL), nullptr);
  EXPECT_EQ(item.stringValueForKey(TLAttributeKey::URL), std::nullopt);
  EXPECT_EQ(item.intValueForKey(TLAttributeKey::URL), 0);
  EXPECT_FALSE(item.boolValueForKey(TLAttributeKey::URL));
  EXPECT_EQ(item.personValuesForKey(TLAttributeKey::URL), nullptr);
  EXPECT_EQ(item.stringValuesForKey(TLAttributeKey::SUBJECT), nullptr);
  item.addPersonsWithKey(TLAttributeKey::HIDDEN_ADDITIONAL_RECIPIENTS, {});
  ASSERT_NE(item.personValuesForKey(TLAttributeKey::HIDDEN_ADDITIONAL_RECIPIENTS), nullptr);
  EXPECT_TRUE(item.personValuesForKey(TLAttributeKey::HIDDEN_ADDITIONAL_RECIPIENTS)->empty());
  EXPECT_TRUE(item.attributesForKey(TLAttributeKey::URL).empty());
}

TEST(Records, KeysOfANode) {
  TLQueryNode node;
  const int32_t keys[] = {13, 171, 2};
  node.setKeys(keys, 3);
  EXPECT_EQ(node.keyAtIndex(2), 2);
  EXPECT_EQ(std::vector<int32_t>(node.keys(), node.keys() + node.keysCount()),
            std::vector<int32_t>({13, 171, 2}));
  EXPECT_THAT([&] { (void)node.keyAtIndex(3); },
              testing::ThrowsMessage<std::out_of_range>("idx (3) is out of range (3)"));
  EXPECT_THROW((void)node.childAtIndex(0), std::out_of_range);
  node.setKeys(node.keys() + 1, 1);
  EXPECT_EQ(node.keysCount(), 1U);
  EXPECT_EQ(node.keyAtIndex(0), 171);
  node.clearKeys();
  EXPECT_EQ(node.data(), "");
}

TEST(Records, Dictionaries) {
  EXPECT_EQ(TLIndexableItem().dictionaryRepresentation().dump(), R"({"identifier":""})");
  const auto rich = richAttribute()->dictionaryRepresentation();
  EXPECT_EQ(rich["key"], "TEXT_CONTENT");
  EXPECT_EQ(rich["stringValues"].dump(), R"(["","b"])");
  EXPECT_EQ(rich["personValues"].dump(), R"([{"emailAddress":"x@y"},{}])");
  EXPECT_EQ(rich["bytesValue"].get_binary().size(), 2U);
  EXPECT_EQ(rich["boolValue"], true);
  EXPECT_EQ(rich.size(), 11U);
  TLQueryNode node;
  node.addKey(2);
  node.setMergeOp(TLQueryNodeMergeOp::AND);
  node.addChild(std::make_shared<TLQueryNode>());
  EXPECT_EQ(node.dictionaryRepresentation().dump(),
            R"json({"child":[{}],"key":["(unknown: 2)"],"mergeOp":"AND"})json");
  EXPECT_THAT(node.description(), testing::StartsWith("<TLQueryNode: 0x"));
  EXPECT_THAT(node.description(), testing::HasSubstr(R"json("mergeOp":"AND")json"));
  EXPECT_EQ(TLIndexableItem::attributesType(), typeid(TLAttribute));
  EXPECT_EQ(TLQueryNode::childType(), typeid(TLQueryNode));
}
