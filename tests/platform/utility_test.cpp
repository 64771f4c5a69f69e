#include "platform/tessel/utility.h"

#include <gtest/gtest.h>

#include <clocale>
#include <cstring>
#include <limits>
#include <set>

#include "platform/tessel/guid.h"

namespace tessel::utility {
namespace {

Guid StateOfSeed(std::uint8_t seed) {
  Guid::Bytes bytes{};
  bytes[0] = bytes[8] = seed;
  return Guid(bytes);
}

TEST(GuidTest, TextFormRoundTripsAndKeepsTheOrderOfBytes) {
  const Guid guid = Guid::FromText("00112233-4455-6677-8899-aAbBcCdDeEfF");
  for (std::size_t i = 0; i < 16; ++i) EXPECT_EQ(guid.bytes()[i], i * 0x11);
  EXPECT_EQ(guid.ToText(), "00112233-4455-6677-8899-aabbccddeeff");
  EXPECT_EQ(Guid::FromText(guid.ToText()), guid);
  EXPECT_EQ(Guid().ToText(), "00000000-0000-0000-0000-000000000000");
  EXPECT_TRUE(Guid::FromText(Guid().ToText()).IsNil());
  EXPECT_LT(Guid::FromText("00ffffff-ffff-ffff-ffff-ffffffffffff"),
            Guid::FromText("01000000-0000-0000-0000-000000000000"));
}

TEST(GuidTest, OtherTextsAreHashed) {
  Guid guid = StateOfSeed(3);
  for (const char* text :
       {"", "frame 12", "00112233-4455-6677-8899-aabbccddeef",
        "00112233-4455-6677-8899-aabbccddeeff0", "0011223344-55-6677-8899-aabbccddeeff",
        "00112233-4455-6677-8899-aabbccddeefg", "00112233-4455-6677-8899aabbccddeeff-"}) {
    EXPECT_FALSE(Guid::Parse(text, &guid)) << text;
    EXPECT_EQ(Guid::FromText(text), MixHash(Guid(), text, std::strlen(text))) << text;
  }
  EXPECT_EQ(guid, StateOfSeed(3));
}

TEST(MixHashTest, PublishedValuesStandForEver) {
  const std::string fox = "The quick brown fox jumps over the lazy dog";
  EXPECT_EQ(MixHash(Guid(), fox.data(), fox.size()).ToText(),
            "6c1b07bc-7bbc-4be3-4793-9ac4a93c437a");
  EXPECT_EQ(MixHash(StateOfSeed(42), "foo", 3).ToText(), "f2537063-519d-56f4-a99a-b0eed8b579a2");
  // Pieces in a row, and zeros that must not vanish.
  EXPECT_EQ(MixHash(MixHash(Guid(), "foo", 3), "bar", 3).ToText(),
            "9aa9dddb-addb-f3de-901b-2d874f496450");
  EXPECT_EQ(MixHash(Guid(), "\0\0\0\0", 4).ToText(), "bc764cd8-ddf7-a0cf-f126-f51c16239658");
}

TEST(MixHashTest, OrderBordersAndEveryByteCount) {
  const auto mix = [](std::initializer_list<std::string> pieces) {
    Guid state;
    for (const std::string& piece : pieces) state = MixHash(state, piece.data(), piece.size());
    return state;
  };
  std::set<Guid> all = {mix({"ab", "c"}), mix({"a", "bc"}), mix({"abc"}), mix({"c", "ab"}),
                        mix({"ab", "", "c"})};
  for (std::size_t i = 0; i < 40; ++i) all.insert(mix({std::string(40, 'x').replace(i, 1, "y")}));
  EXPECT_EQ(all.size(), 45u);
}

TEST(UtilityTest, TextsConvertBothWaysAndDamageIsReplaced) {
  const std::string text = "a\u00e9\u20ac\U0001f3ac";
  EXPECT_EQ(ToUTF16(text), u"a\u00e9\u20ac\U0001f3ac");
  EXPECT_EQ(ToUTF8(u"a\u00e9\u20ac\U0001f3ac"), text);
  EXPECT_EQ(ToUTF16("a\xff"
                    "b"),
            u"a\ufffdb");
  EXPECT_EQ(ToUTF16("\xe2\x82"), u"\ufffd");        // ends within a character
  EXPECT_EQ(ToUTF16("\xc0\xaf"), u"\ufffd\ufffd");  // two bytes for "/"
  EXPECT_EQ(ToUTF16("\xed\xa0\x80"), u"\ufffd");    // surrogates
  EXPECT_EQ(ToUTF16("\xed\xb0\x80"), u"\ufffd");
  EXPECT_EQ(ToUTF16("\xf4\x90\x80\x80"), u"\ufffd");  // beyond the last character
  const char16_t lone[] = {u'x', 0xd83c, u'y', 0xdfac, 0};
  EXPECT_EQ(ToUTF8(lone), "x\ufffdy\ufffd");
}

TEST(UtilityTest, CutsBetweenCharacters) {
  EXPECT_EQ(CutToBytes("abcdef", 6), "abcdef");
  EXPECT_EQ(CutToBytes("abcdef", 5), "abcde");
  EXPECT_EQ(CutToBytes("ab\u20ac", 5), "ab\u20ac");
  EXPECT_EQ(CutToBytes("ab\u20ac", 4), "ab");
}

TEST(UtilityTest, PlaceholdersAreReplacedOnce) {
  EXPECT_EQ(ReplaceInString("@1x@0, @1", "@1", "b"), "bx@1, b");
  EXPECT_EQ(ReplaceInString("@2 @ @9 a@", "x"), "@2 @ @9 a@");
  EXPECT_EQ(ReplaceInString("@9", "0", "1", "2", "3", "4", "5", "6", "7", "8", "nine"), "nine");
  EXPECT_EQ(ReplacePlaceholders("^1 for ^2, @0 ^0", {"x", "y"}, '^', '1'), "x for y, @0 ^0");
}

TEST(UtilityTest, NumbersHaveAPointInEveryLocale) {
  std::setlocale(LC_ALL, "de_DE.UTF-8");          // where it is installed
  EXPECT_EQ(NumberToString(104.25, 1), "104.2");  // a tie goes to the even digit
  EXPECT_EQ(NumberToString(104.35, 1), "104.3");  // the double lies below
  EXPECT_EQ(NumberToString(-0.5, 3), "-0.500");
  EXPECT_EQ(NumberToString(std::numeric_limits<double>::max(), 2).size(), 312u);
  EXPECT_EQ(NumberToString(std::numeric_limits<std::int64_t>::min()), "-9223372036854775808");
  std::setlocale(LC_ALL, "C");
}

TEST(UtilityTest, ChecksumAndClock) {
  EXPECT_EQ(CRC32("123456789", 9), 0xCBF43926u);
  EXPECT_EQ(CRC32("6789", 4, CRC32("12345", 5)), 0xCBF43926u);
  EXPECT_EQ(HighPrecisionTime::Seconds(5000000000u, 2000000000u), -3.0);
}

}  // namespace
}  // namespace tessel::utility
