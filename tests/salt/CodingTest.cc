#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <bit>
#include <ctime>
#include <numeric>
#include <random>
#include <sstream>

#include "salt/BytewiseComparator.h"
#include "salt/Coding.h"
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

}  // namespace

TEST(Varint, RoundTripsAroundPowersOfTwoAndEndsAtEveryTruncation) {
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
  EXPECT_FALSE(salt::parseTextKey("\x01" + "1,2"s, &docID, &zoneID));
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

TEST(SuffixMeta, Prints) {
  EXPECT_EQ(std::string(SuffixMeta{5, 6, 7, 0, {}}), "[5,7:6]");
  EXPECT_EQ(std::string(SuffixMeta{5, 6, 0, 0, {0, 'x'}}), "[5:6]");
  EXPECT_EQ(std::string(SuffixMeta{5, 6, 7, 3, {}}), "[5,7:6 (3)+\"\"]");
  EXPECT_EQ(std::string(SuffixMeta{5, 6, 7, 0, {'a', 0}}), "[5,7:6 (0)+\"a\"]");
  EXPECT_EQ(std::string(SuffixMeta{5, 6, 7, 12, {'a', 'b'}}), "[5,7:6 (12)+\"ab\"]");
}

TEST(Options, HaveGoldenBytesAndRoundTrip) {
  Index::Options options;
  options.Path = "abc";
  // The first word has two flags and the two lengths, the last two the length of the path.
  const uint32_t words[] = {0x642000, 200000, 50, 1000000, 16, 500000, 0, 0, 1000000, 0, 3, 0};
  const std::string golden =
      std::string(reinterpret_cast<const char*>(words), sizeof words) + "abc";
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

TEST(Metrics, HaveGoldenBytesAndPrintInFull) {
  // Little-endian 64-bit words, with a different value in each field.
  std::vector<uint64_t> words(25);
  std::iota(words.begin(), words.end(), 1);
  const std::pair<size_t, double> seconds[] = {{10, 0.5}, {11, 0.25}, {14, 7}, {17, 0.001}};
  for (const auto& [at, value] : seconds) words[at] = std::bit_cast<uint64_t>(value);
  words[12] = 1;  // true
  words[16] = 4;
  words[23] = 18 + (uint64_t{19} << 32);
  const std::string bytes(reinterpret_cast<const char*>(words.data()), 8 * words.size());
  Index::Metrics metrics;
  std::istringstream shortened(bytes.substr(0, bytes.size() - 1));
  EXPECT_FALSE(metrics.ParseFromIstream(shortened));
  std::istringstream in(bytes);
  ASSERT_TRUE(metrics.ParseFromIstream(in));
  std::ostringstream out;
  ASSERT_TRUE(metrics.SerializeToOstream(out));
  EXPECT_EQ(out.str(), bytes);
  const time_t created = 23;
  EXPECT_EQ(std::string(metrics),
            "SALT INDEX METRICS\n-- Code version: 25\n-- Creation time: "s + std::ctime(&created) +
                "-- Max doc ID: 18\n-- Last doc ID added: 19\n"
                "--\n-- AGGREGATE METRICS\n---- Docs: 1\n---- Zones: 2\n---- Suffixes: 3\n"
                "---- Text bytes: 0.00MB\n---- Average tokens/doc: 3.00\n"
                "---- Average bytes/doc: 4.00\n---- Deleted docs: 5\n"
                "--\n-- SHARD METRICS\n---- Shards: 6\n---- Last shard suffixes: 7\n"
                "---- Hot (unmerged) suffixes: 8\n---- Pages: 9\n"
                "---- Average suffixes/page: -0.56\n"
                "--\n-- INDEXING METRICS\n---- Indexing calls: 10\n---- Total time: 0.50s\n"
                "---- Average time: 50000.0us\n---- Average throttling: 25000.0us\n"
                "--\n-- VACUUM METRICS\n---- Vacuums: 14 (IN PROGRESS)\n"
                "---- Last shard vacuumed: 16\n---- Total time: 7.00s\n---- Average time: 0.50s\n"
                "--\n-- SCANNING METRICS\n---- Scans run: 4\n---- Average time: 250.0us\n"
                "---- Average results: 4.8\n---- Average text fetches: 5.0\n"
                "---- Average hot reads: 5.2\n---- Average page reads: 5.5\n");
  // Of nothing there is no average.
  EXPECT_THAT(std::string(Index::Metrics()), testing::Not(testing::HasSubstr("Average")));
}
