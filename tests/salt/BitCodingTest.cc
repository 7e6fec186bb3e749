#include <gtest/gtest.h>

#include <random>
#include <vector>

#include "salt/BitCoding.h"

using salt::BitReader;
using salt::BitWriter;
using salt::kMaxGamma;

TEST(BitCoding, ReadsWhatWasWrittenAndNothingAfterIt) {
  std::mt19937 random(3);
  std::vector<uint32_t> values{kMaxGamma, kMaxGamma, kMaxGamma, 1, 2, 3, 4};
  for (int i = 0; i < 3000; ++i)
    values.push_back(1 + (random() & kMaxGamma) % (1U << random() % 28));
  std::string bytes("before");
  BitWriter writer(&bytes);
  for (const uint32_t value : values) writer.putGamma(value);
  writer.finish();
  BitReader reader(std::string_view(bytes).substr(6));
  for (const uint32_t value : values) ASSERT_EQ(reader.gamma(), value);
  EXPECT_TRUE(reader.good);
  for (int i = 0; i < 8; ++i) (void)reader.gamma();  // the rest of the last byte holds no code
  EXPECT_FALSE(reader.good);
}

TEST(BitCoding, HasTheBytesOfTheFormat) {
  std::string bytes;
  BitWriter writer(&bytes);
  for (const uint32_t value : {1, 5, 2}) writer.putGamma(value);  // 1, 00101, 010
  writer.finish();
  EXPECT_EQ(bytes, std::string("\x95\0", 2));
}

TEST(BitCoding, BytesThatHoldNoCodeAreAnError) {
  for (const std::string& bytes :
       {std::string(), std::string(1, '\0'), std::string(30, '\0'), std::string("\x01"),
        std::string("\0\0\0\x04\xFF\xFF\xFF\xFF\xFF", 9)}) {
    BitReader reader(bytes);
    EXPECT_EQ(reader.gamma(), 0u);
    EXPECT_FALSE(reader.good);
  }
}
