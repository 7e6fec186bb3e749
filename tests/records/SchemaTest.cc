#include <google/protobuf/descriptor.h>
#include <google/protobuf/message.h>
#include <google/protobuf/unknown_field_set.h>
#include <google/protobuf/util/message_differencer.h>
#include <gtest/gtest.h>

#include <bit>
#include <nlohmann/json.hpp>
#include <random>
#include <set>
#include <utility>
#include <vector>

#include "records/TLAttributeKey.h"
#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"
#include "tallow.pb.h"
#include "tests/records/Hex.h"
#include "tests/support/Seed.h"

// The published schema compared with the records: the records read what protoc's code writes, and
// the other way round. The random messages also test the records' own operations.

namespace schema = com::quill::tallow;
using google::protobuf::Descriptor;
using google::protobuf::FieldDescriptor;
using google::protobuf::Message;
using google::protobuf::UnknownFieldSet;
using testsupport::hex;

namespace {

class RandomMessages {
 public:
  explicit RandomMessages(uint32_t seed) : _random(seed) {}

  // A message with each field set with a probability of one half; sub-messages nest up to `depth`
  // levels.
  template <typename Schema>
  Schema make(int depth) {
    Schema message;
    EXPECT_TRUE(message.ParseFromString(fields(*Schema::descriptor(), depth)));
    return message;
  }

  // Clears a field of the message or of a message in it, and returns the field of `message` that
  // this changes; null if it has none.
  const FieldDescriptor* clearOne(Message& message) {
    std::vector<const FieldDescriptor*> fields;
    const auto* reflection = message.GetReflection();
    reflection->ListFields(message, &fields);
    std::erase_if(fields, [](const auto* one) { return isRequired(*one); });
    if (fields.empty()) return nullptr;
    const FieldDescriptor* field = fields[_random() % fields.size()];
    const bool inner = field->cpp_type() == FieldDescriptor::CPPTYPE_MESSAGE && _random() % 2 == 0;
    Message* const sub = !inner ? nullptr
                         : field->is_repeated()
                             ? reflection->MutableRepeatedMessage(&message, field, 0)
                             : reflection->MutableMessage(&message, field);
    if (sub == nullptr || clearOne(*sub) == nullptr) reflection->ClearField(&message, field);
    return field;
  }

  // A new item has an identifier, and a parameter must have a key.
  static bool isRequired(const FieldDescriptor& field) {
    return field.name() == "identifier" ||
           (field.name() == "key" && field.cpp_type() == FieldDescriptor::CPPTYPE_STRING);
  }

 private:
  int64_t integer() {
    const auto bits = static_cast<int64_t>((uint64_t{_random()} << 32) | _random());
    return bits >> (_random() % 64);
  }
  double real() { return static_cast<double>(integer()) / 1024; }
  int enumeration() {
    return static_cast<int32_t>(_random() % 8 == 0 ? integer() : _random() % 190);
  }
  std::string text() {
    std::string result;
    for (uint32_t n = _random() % 5 == 0 ? _random() % 300 : _random() % 12; n > 0; --n) {
      static const char* const pieces[] = {
          "a", "Z", " ", "\xC3\xA9", "\xE6\x97\xA5", "\xF0\x9F\x98\x80"};
      result += pieces[_random() % 6];
    }
    return result;
  }

  std::string fields(const Descriptor& message, int depth) {
    UnknownFieldSet set;
    for (int i = 0; i < message.field_count(); ++i) {
      const FieldDescriptor& field = *message.field(i);
      if (field.message_type() != nullptr && depth == 0) continue;
      uint32_t count = field.is_repeated() ? _random() % 4 : _random() % 2;
      if (isRequired(field)) count = 1;
      for (; count > 0; --count) add(field, depth, set);
    }
    std::string bytes;
    EXPECT_TRUE(set.SerializeToString(&bytes));
    return bytes;
  }
  void add(const FieldDescriptor& field, int depth, UnknownFieldSet& set) {
    const int number = field.number();
    switch (field.cpp_type()) {
      case FieldDescriptor::CPPTYPE_INT64:
        return set.AddVarint(number, static_cast<uint64_t>(integer()));
      case FieldDescriptor::CPPTYPE_ENUM:
        return set.AddVarint(number, static_cast<uint64_t>(int64_t{enumeration()}));
      case FieldDescriptor::CPPTYPE_BOOL:
        return set.AddVarint(number, _random() % 2);
      case FieldDescriptor::CPPTYPE_DOUBLE:
        return set.AddFixed64(number, std::bit_cast<uint64_t>(real()));
      case FieldDescriptor::CPPTYPE_FLOAT:
        return set.AddFixed32(number, std::bit_cast<uint32_t>(static_cast<float>(real())));
      case FieldDescriptor::CPPTYPE_STRING:
        return set.AddLengthDelimited(number, text());
      default:
        set.AddLengthDelimited(number, fields(*field.message_type(), depth - 1));
    }
  }

  std::mt19937 _random;
};

template <typename Record, typename Schema>
void expectSameBytesAndMerges(int depth) {
  for (uint32_t seed = testsupport::firstSeed(), end = seed + 400; seed != end; ++seed) {
    RandomMessages random(seed);
    const auto message = random.make<Schema>(depth);
    const std::string wire = message.SerializeAsString();
    Record record;
    ASSERT_TRUE(record.initWithData(wire)) << seed;
    ASSERT_EQ(hex(record.data()), hex(wire)) << seed;
    Schema back;
    ASSERT_TRUE(back.ParseFromString(record.data())) << seed;
    ASSERT_TRUE(google::protobuf::util::MessageDifferencer::Equals(message, back)) << seed;

    const auto copy = record.copyWithZone();
    Record target;
    record.copyTo(target);
    for (const Record* same : {const_cast<const Record*>(copy.get()), &std::as_const(target)}) {
      ASSERT_TRUE(record.isEqual(*same)) << seed;
      ASSERT_EQ(record.hash(), same->hash()) << seed;
      ASSERT_EQ(record.dictionaryRepresentation(), same->dictionaryRepresentation()) << seed;
    }

    auto merged = message;
    const auto other = random.make<Schema>(depth);
    merged.MergeFrom(other);
    Record source;
    ASSERT_TRUE(source.initWithData(other.SerializeAsString()));
    copy->mergeFrom(source);
    ASSERT_EQ(hex(copy->data()), hex(merged.SerializeAsString())) << seed;
    ASSERT_EQ(record.data(), wire) << seed;
  }
}

// Two records are equal exactly if they are written the same, and the hash depends on every field.
template <typename Record, typename Schema>
void expectEveryFieldToCount(int depth) {
  std::set<std::string> unseen;
  for (int i = 0; i < Schema::descriptor()->field_count(); ++i) {
    const FieldDescriptor* field = Schema::descriptor()->field(i);
    if (!RandomMessages::isRequired(*field)) unseen.insert(field->name());
  }
  for (uint32_t seed = testsupport::firstSeed(), end = seed + 400; seed != end; ++seed) {
    RandomMessages random(seed);
    auto message = random.make<Schema>(depth);
    Record record;
    ASSERT_TRUE(record.initWithData(message.SerializeAsString()));
    const FieldDescriptor* field = random.clearOne(message);
    Record less;
    ASSERT_TRUE(less.initWithData(message.SerializeAsString()));
    ASSERT_EQ(less.isEqual(record), less.data() == record.data()) << seed;
    if (field != nullptr && less.hash() != record.hash()) unseen.erase(field->name());
  }
  EXPECT_EQ(unseen, std::set<std::string>()) << Schema::descriptor()->name();
}

// The schema, the table and the look-ups both ways.
template <typename Enum>
void expectSameEnumeration(const google::protobuf::EnumDescriptor* descriptor, int extra,
                           Enum (*valueOf)(std::string_view), std::string (*nameOf)(Enum)) {
  const auto& table = TLEnumNames<Enum>::table;
  EXPECT_EQ(descriptor->value_count(), static_cast<int>(std::size(table)) + extra);
  for (const auto& row : table) {
    const auto* value = descriptor->FindValueByName(std::string(row.name));
    ASSERT_NE(value, nullptr) << row.name;
    EXPECT_EQ(value->number(), static_cast<int>(row.value)) << row.name;
    EXPECT_EQ(nameOf(row.value), row.name);
    EXPECT_EQ(valueOf(row.name), row.value) << row.name;
  }
}

template <typename Record, typename Schema>
void expectAgreement(int depth) {
  expectSameBytesAndMerges<Record, Schema>(depth);
  expectEveryFieldToCount<Record, Schema>(depth);
}

}  // namespace

TEST(Schema, RandomRecordsAgreeBothWaysAndEveryFieldCounts) {
  expectAgreement<TLPerson, schema::TLPerson>(0);
  expectAgreement<TLCard, schema::TLCard>(0);
  expectAgreement<TLAttribute, schema::TLAttribute>(1);
  expectAgreement<TLIndexableItem, schema::TLIndexableItem>(2);
  expectAgreement<TLQueryNode, schema::TLQueryNode>(3);
  expectAgreement<TLQuery, schema::TLQuery>(4);
  expectAgreement<TLParameters, schema::TLParameters>(1);
}

TEST(Schema, EnumerationsAgree) {
  expectSameEnumeration<TLAttributeKey>(schema::TLAttributeKey_descriptor(), 0,
                                        TLStringAsAttributeKey, TLAttributeKeyAsString);
  expectSameEnumeration<TLQueryNodeOp>(schema::TLQueryNodeOp_descriptor(), 1, TLStringAsQueryNodeOp,
                                       TLQueryNodeOpAsString);
  expectSameEnumeration<TLQueryNodeMergeOp>(schema::TLQueryNodeMergeOp_descriptor(), 0,
                                            TLStringAsQueryNodeMergeOp, TLQueryNodeMergeOpAsString);
}

TEST(Enumerations, NumbersAndNamesOfNodes) {
  EXPECT_EQ(TLQueryNode::keysAsString(171), "TEXT_CONTENT");
  EXPECT_EQ(TLQueryNode::opAsString(TLQueryNodeOp(21)), "BOOL_CONSTANT");
  EXPECT_EQ(TLQueryNode::keysAsString(2), "(unknown: 2)");
  EXPECT_EQ(TLAttribute::keyAsString(TLAttributeKey(-1)), "(unknown: -1)");
  EXPECT_EQ(TLQueryNode::opAsString(TLQueryNodeOp(7)), "(unknown: 7)");
  EXPECT_EQ(TLQueryNode::mergeOpAsString(TLQueryNodeMergeOp(3)), "(unknown: 3)");
  EXPECT_EQ(TLQueryNode::StringAsKeys("NO_SUCH_KEY"), 0);
  EXPECT_EQ(TLAttribute::StringAsKey("subject"), TLAttributeKey::UNKNOWN);
  EXPECT_EQ(TLQueryNode::StringAsOp("NO_SUCH_OP"), TLQueryNodeOp::STRING_EQUAL);
  EXPECT_EQ(TLQueryNode::StringAsMergeOp("XOR"), TLQueryNodeMergeOp::LEAF);
}

TEST(Enumerations, NamesOfTheQueryLanguage) {
  EXPECT_EQ(TLAttributeKeyForQueryName("**"), TLAttributeKey::ANY);
  EXPECT_EQ(TLAttributeKeyForQueryName("*"), TLAttributeKey::ANY_METADATA);
  EXPECT_EQ(TLAttributeKeyForQueryName("kTLItemMailboxes"), TLAttributeKey::MAILBOX_IDENTIFIERS);
  EXPECT_EQ(TLAttributeKeyForQueryName("com_quill_mail_read"), TLAttributeKey::READ);
  EXPECT_EQ(TLAttributeKeyForQueryName("ktlitemsubject"), std::nullopt);
  EXPECT_EQ(TLAttributeKeyForQueryName(""), std::nullopt);
}
