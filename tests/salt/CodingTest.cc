#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <ctime>
#include <random>
#include <sstream>

#include "salt/BytewiseComparator.h"
#include "salt/Coding.h"
#include "salt/IndexImpl.h"
#include "tests/salt/Model.h"
#include "tests/support/Seed.h"

using salt::Index;
using salt::SuffixMeta;
using namespace std::string_literals;

namespace {

std::string varint(uint32_t value) {
  char bytes[salt::kMaxVarint32];
  return {bytes, static_cast<size_t>(salt::putVarint(bytes, value) - bytes)};
}

std::string key(uint8_t shard, std::string_view text, const SuffixMeta& meta) {
  std::string bytes = "rest of an older key";
  salt::suffixKey(shard, text, meta, &bytes);
  return bytes;
}

}  // namespace

TEST(Varint, RoundTripsAroundPowersOfTwoAndEndsAtEveryTruncation) {
  EXPECT_EQ(varint(0), "\0"s);
  EXPECT_EQ(varint(127), "\x7F");
  EXPECT_EQ(varint(128), "\x80\x01");
  EXPECT_EQ(varint(UINT32_MAX), "\xFF\xFF\xFF\xFF\x0F");
  for (uint64_t power = 1; power <= uint64_t{1} << 32; power *= 2) {
    for (const uint64_t wide : {power - 1, power, power + 1}) {
      if (wide > UINT32_MAX) continue;
      const auto value = static_cast<uint32_t>(wide);
      const std::string bytes = varint(value) + "x";
      EXPECT_EQ(bytes, salttest::naiveVarint(value) + "x");
      std::string_view rest = bytes;
      EXPECT_EQ(salt::readVarint(rest), value);
      EXPECT_EQ(rest, "x");
    }
  }
  for (size_t size = 0; size < 5; ++size) {
    std::string_view cut = std::string_view("\xFF\xFF\xFF\xFF\x0F").substr(0, size);
    EXPECT_DEATH(salt::readVarint(cut), "s\\.size\\(\\)") << size;
  }
  std::string_view endless = "\x80\x80\x80\x80\x80\x01";
  EXPECT_DEATH(salt::readVarint(endless), "shift < 32");
}

TEST(SuffixLength, EndsAtNULAtALateSpaceAndAtTheMaximum) {
  const std::string a31(31, 'a');
  const std::string a99(99, 'a');
  const struct {
    std::string text;
    size_t length;
  } cases[] = {
      {"", 0},
      {"abc", 3},
      {"\0abc"s, 0},
      {"ab\0c"s, 2},
      {a31 + " b", 33},   // a space at 31 does not end the text
      {a31 + "a b", 33},  // a space at 32 ends the text and is kept
      {a31 + "a  b", 33},
      {a31 + "aaa\0 b"s, 34},
      {a31 + "a \0b"s, 33},
      {a99 + "b", 100},
      {a99 + "bc", 100},
      {a99 + " c", 100},
      {a99 + "\0"s, 99},
      {a99 + "b\0"s, 100},
  };
  const Index::Options defaults;
  for (const auto& c : cases) EXPECT_EQ(salt::suffixLength(c.text, defaults), c.length) << c.text;
  std::mt19937 random(3);
  for (int round = 0; round < 5000; ++round) {
    Index::Options op;
    op.MaxMatchLen = static_cast<uint8_t>(random());
    op.MinMatchLen = static_cast<uint8_t>(random() % (op.MaxMatchLen + 1));
    const std::string text = salttest::randomText(random, random() % 300);
    ASSERT_EQ(text.substr(0, salt::suffixLength(text, op)), salttest::naiveCut(text, op));
  }
}

TEST(Keys, HaveGoldenBytes) {
  EXPECT_EQ(key(0, "ab", {300, 5, 7, 0, {}}), "\0ab\0\x07\x05\xAC\x02"s);
  EXPECT_EQ(key(16, "", {1, 200, 256, 9, {1, 2}}), "\x10\0\x80\x02\xC8\x01\x01"s);
  EXPECT_EQ(key(3, "ab", {0, 5, 7, 0, {}}), "\x03"s + "ab");
  EXPECT_EQ(salt::index::textKey(0, 0).view(), "\xFF"s + "0,0");
  EXPECT_EQ(salt::index::textKey(UINT32_MAX, UINT16_MAX).view(), "\xFF"s + "4294967295,65535");
}

TEST(Keys, OnlyTextKeysParseAsSuch) {
  uint32_t docID = 0;
  uint16_t zoneID = 0;
  ASSERT_TRUE(salt::parseTextKey("\xFF"s + "4294967295,65535", &docID, &zoneID));
  EXPECT_EQ(docID, UINT32_MAX);
  EXPECT_EQ(zoneID, UINT16_MAX);
  for (const auto* rest :
       {"METRICS", "", "1", "1,", ",1", "1,2x", "1;2", "4294967296,1", "1,65536", "-1,2", " 1,2"}) {
    EXPECT_FALSE(salt::parseTextKey("\xFF"s + rest, &docID, &zoneID)) << rest;
  }
  EXPECT_FALSE(
      salt::parseTextKey("\x01"
                         "1,2"s,
                         &docID, &zoneID));
  EXPECT_FALSE(salt::parseTextKey("", &docID, &zoneID));
}

// An index written in one order and read in another would be lost.
TEST(Keys, SortAsLeveldbSortsThem) {
  const salt::BytewiseComparator order;
  const leveldb::Comparator& bytewise = *leveldb::BytewiseComparator();
  EXPECT_STREQ(order.Name(), bytewise.Name());
  const auto sign = [](int result) { return (result > 0) - (result < 0); };
  std::mt19937 random(testsupport::firstSeed());
  const std::string_view alphabet("\0a\x7F\x80\xFF", 5);
  for (int round = 0; round < 20000; ++round) {
    std::string left(random() % 20, 'x');
    std::string right = left;  // common up to where the tails below begin
    for (std::string* key : {&left, &right}) {
      for (auto bytes = random() % 10; bytes > 0; --bytes) {
        key->push_back(alphabet[random() % alphabet.size()]);
      }
    }
    ASSERT_EQ(sign(order.Compare(left, right)), sign(bytewise.Compare(left, right)))
        << testing::PrintToString(left) << testing::PrintToString(right);
  }
}

TEST(SuffixMeta, SortsAsItsKeysDo) {
  EXPECT_TRUE((SuffixMeta{1, 1, 256, 0, {}}) < (SuffixMeta{1, 1, 129, 0, {}}));
  EXPECT_FALSE((SuffixMeta{1, 1, 129, 0, {}}) < (SuffixMeta{1, 1, 256, 0, {}}));
  std::mt19937 random(5);
  const auto number = [&random] { return static_cast<uint32_t>(random()) >> random() % 32; };
  for (int round = 0; round < 20000; ++round) {
    SuffixMeta a{number(), number(), static_cast<uint16_t>(number()), 1, {}};
    SuffixMeta b{number(), number(), static_cast<uint16_t>(number()), 2, {}};
    if (random() % 2) b.ZoneID = a.ZoneID;
    if (random() % 2) b.Offset = a.Offset;
    if (a.DocID == 0 || b.DocID == 0) continue;
    ASSERT_EQ(a < b, key(0, "t", a) < key(0, "t", b));
  }
}

TEST(SuffixMeta, Prints) {
  EXPECT_EQ(std::string(SuffixMeta{5, 6, 7, 0, {}}), "[5,7:6]");
  EXPECT_EQ(std::string(SuffixMeta{5, 6, 0, 0, {0, 'x'}}), "[5:6]");
  EXPECT_EQ(std::string(SuffixMeta{5, 6, 7, 3, {}}), "[5,7:6 (3)+\"\"]");
  EXPECT_EQ(std::string(SuffixMeta{5, 6, 7, 0, {'a', 0}}), "[5,7:6 (0)+\"a\"]");
  EXPECT_EQ(std::string(SuffixMeta{5, 6, 7, 12, {'a', 'b'}}), "[5,7:6 (12)+\"ab\"]");
}

TEST(Page, HasGoldenBytesAndRoundTrips) {
  const std::vector<SuffixMeta> metas{{1, 300, 2, 0, {'x', 'y'}}, {128, 0, 256, 200, {0, 0}}};
  std::string value;
  salt::pageToValue(metas.data(), metas.size(), &value);
  EXPECT_EQ(value,
            "\x02"
            "\x01\x80\x01"
            "\x02\x80\x02"
            "\xAC\x02\0"
            "\0\xC8\x01"
            "xy\0\0"s);
  std::vector<SuffixMeta> decoded(7);
  salt::valueToPage(value, Index::Options(), &decoded);
  ASSERT_EQ(decoded.size(), 2u);
  for (size_t i = 0; i < 2; ++i) {
    EXPECT_EQ(std::string(decoded[i]), std::string(metas[i]));
    EXPECT_EQ(decoded[i].lcp, metas[i].lcp);
  }
  Index::Options narrow;
  narrow.MaxPageSuffixes = 1;
  EXPECT_DEATH(salt::valueToPage(value, narrow, &decoded), "size <= op\\.MaxPageSuffixes");
  for (const size_t size : {size_t{0}, size_t{1}, size_t{4}, value.size() - 1}) {
    EXPECT_DEATH(salt::valueToPage(value.substr(0, size), Index::Options(), &decoded), "s\\.size");
  }
}

TEST(Options, HaveGoldenBytesAndRoundTrip) {
  Index::Options options;
  options.Path = "abc";
  const std::string golden =
      "\0\x20\x64\0"
      "\x40\x0D\x03\0"
      "\x32\0\0\0"
      "\x40\x42\x0F\0"
      "\x10\0\0\0"
      "\x20\xA1\x07\0"
      "\0\0\0\0"
      "\0\0\0\0"
      "\x40\x42\x0F\0"
      "\0\0\0\0"
      "\x03\0\0\0\0\0\0\0"
      "abc"s;
  std::ostringstream out;
  ASSERT_TRUE(options.SerializeToOstream(out));
  EXPECT_EQ(out.str(), golden);
  for (size_t size = 0; size < golden.size(); ++size) {
    std::istringstream in(golden.substr(0, size));
    EXPECT_FALSE(options.ParseFromIstream(in)) << size;
  }
  std::string changed = golden;
  changed[0] = 2;  // any value but 0 is true
  changed[24] = 1;
  changed[36] = 9;
  std::istringstream in(changed);
  Index::Options parsed;
  ASSERT_TRUE(parsed.ParseFromIstream(in));
  EXPECT_TRUE(parsed.ValidateOnLoad && parsed.CompactAfterVacuum);
  EXPECT_EQ(parsed.Path, "abc");
  changed.replace(40, 8, 8, '\x7F');
  std::istringstream endless(changed);
  EXPECT_FALSE(parsed.ParseFromIstream(endless));
  out.setstate(std::ios::failbit);
  EXPECT_FALSE(options.SerializeToOstream(out));
}

TEST(Options, AreValidWithinTheirLimits) {
  Index::Options op;
  EXPECT_TRUE(op.Valid());
  op.MinMatchLen = op.MaxMatchLen;
  EXPECT_TRUE(op.Valid());
  op.MinMatchLen = static_cast<uint8_t>(op.MaxMatchLen + 1);
  EXPECT_FALSE(op.Valid());
  op = {};
  op.MaxZoneSize = UINT32_MAX;
  EXPECT_FALSE(op.Valid());
  op = {};
  op.MaxShards = 0;
  EXPECT_FALSE(op.Valid());
}

namespace {

Index::Metrics numberedMetrics() {
  Index::Metrics m;
  uint64_t next = 1;
  for (uint64_t* field : {&m.Docs, &m.Zones, &m.Suffixes, &m.TextBytes, &m.DeletedDocs, &m.Shards,
                          &m.LastShardSuffixes, &m.HotSuffixes, &m.Pages, &m.IndexingCalls}) {
    *field = next++;
  }
  m.IndexingSeconds = 0.5;
  m.ThrottlingSeconds = 0.25;
  m.VacuumInProgress = true;
  m.Vacuums = 11;
  m.VacuumSeconds = 5.5;
  m.LastShardVacuumed = 12;
  m.Scans = 4;
  m.ScanSeconds = 0.001;
  next = 14;
  for (uint64_t* field : {&m.ScanResults, &m.ScanTextFetches, &m.ScanHotReads, &m.ScanPageReads}) {
    *field = next++;
  }
  m.CreationTime = 1700000000;
  m.MaxDocID = 18;
  m.LastDocID = 19;
  m.CodeVersion = salt::CODE_VERSION;
  return m;
}

}  // namespace

TEST(Metrics, HaveGoldenBytesAndRoundTrip) {
  std::ostringstream out;
  ASSERT_TRUE(numberedMetrics().SerializeToOstream(out));
  const std::string bytes = out.str();
  ASSERT_EQ(bytes.size(), 200u);
  // Offset and little-endian 64-bit word.
  const std::pair<size_t, uint64_t> words[] = {{0, 1},
                                               {8, 2},
                                               {16, 3},
                                               {24, 4},
                                               {32, 5},
                                               {40, 6},
                                               {48, 7},
                                               {56, 8},
                                               {64, 9},
                                               {72, 10},
                                               {80, 0x3FE0000000000000},
                                               {88, 0x3FD0000000000000},
                                               {96, 1},
                                               {104, 11},
                                               {112, 0x4016000000000000},
                                               {120, 12},
                                               {128, 4},
                                               {136, 0x3F50624DD2F1A9FC},
                                               {144, 14},
                                               {152, 15},
                                               {160, 16},
                                               {168, 17},
                                               {176, 1700000000},
                                               {184, 18 + (uint64_t{19} << 32)},
                                               {192, 304}};
  for (const auto& [offset, expected] : words) {
    uint64_t word = 0;
    for (size_t i = 0; i < 8; ++i) {
      word |= uint64_t{static_cast<uint8_t>(bytes[offset + i])} << 8 * i;
    }
    EXPECT_EQ(word, expected) << offset;
  }
  Index::Metrics parsed;
  std::istringstream shortened(bytes.substr(0, 199));
  EXPECT_FALSE(parsed.ParseFromIstream(shortened));
  std::istringstream in(bytes);
  ASSERT_TRUE(parsed.ParseFromIstream(in));
  EXPECT_EQ(std::string(parsed), std::string(numberedMetrics()));
}

TEST(Metrics, PrintInFull) {
  const time_t created = 1700000000;
  EXPECT_EQ(std::string(numberedMetrics()),
            "SALT INDEX METRICS\n-- Code version: 304\n-- Creation time: "s + std::ctime(&created) +
                "-- Max doc ID: 18\n-- Last doc ID added: 19\n"
                "--\n-- AGGREGATE METRICS\n---- Docs: 1\n---- Zones: 2\n---- Suffixes: 3\n"
                "---- Text bytes: 0.00MB\n---- Average tokens/doc: 3.00\n"
                "---- Average bytes/doc: 4.00\n---- Deleted docs: 5\n"
                "--\n-- SHARD METRICS\n---- Shards: 6\n---- Last shard suffixes: 7\n"
                "---- Hot (unmerged) suffixes: 8\n---- Pages: 9\n"
                "---- Average suffixes/page: -0.56\n"
                "--\n-- INDEXING METRICS\n---- Indexing calls: 10\n---- Total time: 0.50s\n"
                "---- Average time: 50000.0us\n---- Average throttling: 25000.0us\n"
                "--\n-- VACUUM METRICS\n---- Vacuums: 11 (IN PROGRESS)\n"
                "---- Last shard vacuumed: 12\n---- Total time: 5.50s\n---- Average time: 0.50s\n"
                "--\n-- SCANNING METRICS\n---- Scans run: 4\n---- Average time: 250.0us\n"
                "---- Average results: 3.5\n---- Average text fetches: 3.8\n"
                "---- Average hot reads: 4.0\n---- Average page reads: 4.2\n");
  const time_t epoch = 0;
  EXPECT_EQ(std::string(Index::Metrics()),
            "SALT INDEX METRICS\n-- Code version: 0\n-- Creation time: "s + std::ctime(&epoch) +
                "-- Max doc ID: 0\n-- Last doc ID added: 0\n"
                "--\n-- AGGREGATE METRICS\n---- Docs: 0\n---- Zones: 0\n---- Suffixes: 0\n"
                "---- Text bytes: 0.00MB\n---- Deleted docs: 0\n"
                "--\n-- SHARD METRICS\n---- Shards: 0\n---- Last shard suffixes: 0\n"
                "---- Hot (unmerged) suffixes: 0\n---- Pages: 0\n"
                "--\n-- INDEXING METRICS\n---- Indexing calls: 0\n"
                "--\n-- VACUUM METRICS\n---- Vacuums: 0\n"
                "--\n-- SCANNING METRICS\n---- Scans run: 0\n");
}
