#include <google/protobuf/descriptor.h>
#include <google/protobuf/message.h>
#include <google/protobuf/util/message_differencer.h>
#include <gtest/gtest.h>

#include <nlohmann/json.hpp>
#include <random>
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
using google::protobuf::FieldDescriptor;
using google::protobuf::Message;
using testsupport::hex;

namespace {

class RandomMessages {
 public:
  explicit RandomMessages(uint32_t seed) : _random(seed) {}

  // Sets each field with a probability of one half; sub-messages nest up to `depth` levels.
  void fill(Message& message, int depth) {
    for (int i = 0; i < message.GetDescriptor()->field_count(); ++i) {
      const FieldDescriptor* field = message.GetDescriptor()->field(i);
      const bool message_ = field->cpp_type() == FieldDescriptor::CPPTYPE_MESSAGE;
      if (message_ && depth == 0) continue;
      // A new item has an identifier, and a parameter must have a key.
      const bool required =
          field->name() == "identifier" || (field->name() == "key" && field->cpp_type() == kText);
      if (field->is_repeated()) {
        for (uint32_t n = _random() % 4; n > 0; --n) add(message, field, depth);
      } else if (required || _random() % 2 == 0) {
        set(message, field, depth);
      }
    }
  }

 private:
  static constexpr auto kText = FieldDescriptor::CPPTYPE_STRING;

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

  void set(Message& m, const FieldDescriptor* f, int depth) {
    const auto* r = m.GetReflection();
    switch (f->cpp_type()) {
      case FieldDescriptor::CPPTYPE_INT64:
        return r->SetInt64(&m, f, integer());
      case FieldDescriptor::CPPTYPE_DOUBLE:
        return r->SetDouble(&m, f, real());
      case FieldDescriptor::CPPTYPE_FLOAT:
        return r->SetFloat(&m, f, static_cast<float>(real()));
      case FieldDescriptor::CPPTYPE_BOOL:
        return r->SetBool(&m, f, _random() % 2 == 0);
      case FieldDescriptor::CPPTYPE_ENUM:
        return r->SetEnumValue(&m, f, enumeration());
      case FieldDescriptor::CPPTYPE_STRING:
        return r->SetString(&m, f, text());
      case FieldDescriptor::CPPTYPE_MESSAGE:
        return fill(*r->MutableMessage(&m, f), depth - 1);
      default:
        FAIL() << f->full_name();
    }
  }
  void add(Message& m, const FieldDescriptor* f, int depth) {
    const auto* r = m.GetReflection();
    switch (f->cpp_type()) {
      case FieldDescriptor::CPPTYPE_ENUM:
        return r->AddEnumValue(&m, f, enumeration());
      case FieldDescriptor::CPPTYPE_STRING:
        return r->AddString(&m, f, text());
      case FieldDescriptor::CPPTYPE_MESSAGE:
        return fill(*r->AddMessage(&m, f), depth - 1);
      default:
        FAIL() << f->full_name();
    }
  }

  std::mt19937 _random;
};

template <typename Record, typename Schema>
void expectAgreement(int depth) {
  for (uint32_t seed = testsupport::firstSeed(), end = seed + 400; seed != end; ++seed) {
    Schema message;
    RandomMessages(seed).fill(message, depth);
    const std::string wire = message.SerializeAsString();
    Record record;
    ASSERT_TRUE(record.initWithData(wire)) << seed;
    ASSERT_EQ(hex(record.data()), hex(wire)) << seed;
    Schema back;
    ASSERT_TRUE(back.ParseFromString(record.data())) << seed;
    ASSERT_TRUE(google::protobuf::util::MessageDifferencer::Equals(message, back)) << seed;

    Record again;
    ASSERT_TRUE(again.initWithData(wire));
    const auto copy = record.copyWithZone();
    Record target;
    record.copyTo(target);
    const std::vector<const Record*> equals{&again, copy.get(), &target};
    for (const Record* same : equals) {
      ASSERT_TRUE(record.isEqual(*same)) << seed;
      ASSERT_EQ(record.hash(), same->hash()) << seed;
      ASSERT_EQ(record.dictionaryRepresentation(), same->dictionaryRepresentation()) << seed;
    }
  }
}

template <typename Enum>
void expectSameEnumeration(const google::protobuf::EnumDescriptor* descriptor, int extra) {
  const auto& table = TLEnumNames<Enum>::table;
  EXPECT_EQ(descriptor->value_count(), static_cast<int>(std::size(table)) + extra);
  for (const auto& row : table) {
    const auto* value = descriptor->FindValueByName(std::string(row.name));
    ASSERT_NE(value, nullptr) << row.name;
    EXPECT_EQ(value->number(), static_cast<int>(row.value)) << row.name;
  }
}

}  // namespace

TEST(Schema, RandomRecordsAgreeBothWays) {
  expectAgreement<TLPerson, schema::TLPerson>(0);
  expectAgreement<TLCard, schema::TLCard>(0);
  expectAgreement<TLAttribute, schema::TLAttribute>(1);
  expectAgreement<TLIndexableItem, schema::TLIndexableItem>(2);
  expectAgreement<TLQueryNode, schema::TLQueryNode>(3);
  expectAgreement<TLQuery, schema::TLQuery>(4);
  expectAgreement<TLParameters, schema::TLParameters>(1);
}

TEST(Schema, EnumerationsAgree) {
  expectSameEnumeration<TLAttributeKey>(schema::TLAttributeKey_descriptor(), 0);
  expectSameEnumeration<TLQueryNodeOp>(schema::TLQueryNodeOp_descriptor(), 1);
  expectSameEnumeration<TLQueryNodeMergeOp>(schema::TLQueryNodeMergeOp_descriptor(), 0);
}

TEST(Schema, UnknownFieldsAreSkippedByBothSides) {
  schema::TLQueryNode extended;
  extended.add_keys(schema::SUBJECT);
  auto* unknown = extended.GetReflection()->MutableUnknownFields(&extended);
  unknown->AddVarint(12, 300);
  unknown->AddFixed32(13, 1);
  unknown->AddFixed64(14, 2);
  unknown->AddLengthDelimited(1000, "abc");
  auto* group = unknown->AddGroup(15);
  group->AddLengthDelimited(1, "in");
  group->AddGroup(2)->AddVarint(1, 1);
  TLQueryNode node;
  ASSERT_TRUE(node.initWithData(extended.SerializeAsString()));
  EXPECT_EQ(hex(node.data()), "08 0d");
}

TEST(Schema, PackedKeysReadAsSingleOnes) {
  std::string packed("\x0a\x0e\x0d\xab\x01\x02\xff\xff\xff\xff\xff\xff\xff\xff\xff\x01", 16);
  TLQueryNode node;
  ASSERT_TRUE(node.initWithData(packed));
  schema::TLQueryNode message;
  ASSERT_TRUE(message.ParseFromString(packed));
  EXPECT_EQ(hex(node.data()), hex(message.SerializeAsString()));
  EXPECT_EQ(node.keysCount(), 4U);
  EXPECT_EQ(node.keyAtIndex(3), -1);
}
