#include "platform/memory/packed_words.h"

#include <gtest/gtest.h>

#include <limits>
#include <random>

namespace {

using Bytes = std::vector<std::uint8_t>;
using Words = std::vector<std::int32_t>;

constexpr std::int32_t kMost = std::numeric_limits<std::int32_t>::max();
constexpr std::int32_t kLeast = std::numeric_limits<std::int32_t>::min();

TEST(PackedWordsTest, BytesOfAGroup) {
  Bytes bytes;
  memory::PackWords(Words{0, -1, 1, -2}, bytes);  // as 0, 1, 2, 3 in two bits each
  EXPECT_EQ(bytes, (Bytes{2, 0b11'10'01'00}));
  memory::PackWords(Words(16, 0), bytes);
  EXPECT_EQ(bytes, (Bytes{2, 0b11'10'01'00, 0}));
}

TEST(PackedWordsTest, AnyWordsComeBackOneAfterTheOther) {
  std::mt19937 random(5);
  for (int width = 0; width <= 31; ++width) {
    Words words{0, kMost, kLeast, -1};
    const auto most = static_cast<std::int32_t>((std::int64_t{1} << width) - 1);
    std::uniform_int_distribution<std::int32_t> any(-most, most);
    for (int i = 0; i < 61; ++i) words.push_back(any(random));
    Bytes bytes = {99};
    memory::PackWords(words, bytes);
    memory::PackWords(Words{7}, bytes);
    Words back(words.size()), last(1);
    std::size_t place = 1;
    ASSERT_TRUE(memory::UnpackWords(bytes, place, back));
    EXPECT_EQ(back, words) << width;
    ASSERT_TRUE(memory::UnpackWords(bytes, place, last));
    EXPECT_EQ(last[0], 7);
    EXPECT_EQ(place, bytes.size());
  }
}

TEST(PackedWordsTest, RefusesWhatEndsEarlyOrIsNone) {
  Bytes bytes;
  memory::PackWords(Words{kMost, 1, 2}, bytes);
  Words back(3);
  for (std::size_t size = 0; size < bytes.size(); ++size) {
    std::size_t place = 0;
    EXPECT_FALSE(memory::UnpackWords({bytes.data(), size}, place, back)) << size;
  }
  bytes[0] = 33;
  bytes.resize(200);
  std::size_t place = 0;
  EXPECT_FALSE(memory::UnpackWords(bytes, place, back));
}

}  // namespace
