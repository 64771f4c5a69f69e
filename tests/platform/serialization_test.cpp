#include "platform/tessel/serialization.h"

#include <gtest/gtest.h>

#include <bit>
#include <cmath>
#include <cstdint>
#include <limits>
#include <string>

#include "platform/tessel/utility.h"

namespace tessel::serialization {
namespace {

TEST(SerializationTest, KeysKeepTheirOrderAndTextsAreEscaped) {
  const Value value = {{"ProjectPath", "C:\\a \"b\"\n\u20ac\U0001f3ac"},
                       {"FieldType", -1},
                       {"StartTime", {{"value", 0}, {"scale", 1}}}};
  const std::u16string text = GetJSONString(value);
  EXPECT_EQ(text,
            u"{\"ProjectPath\":\"C:\\\\a \\\"b\\\"\\n\u20ac\U0001f3ac\",\"FieldType\":-1,"
            u"\"StartTime\":{\"value\":0,\"scale\":1}}");
  EXPECT_EQ(JSONParse(text), value);
}

TEST(SerializationTest, NumbersKeepAllTheirBits) {
  const std::int64_t lowest = std::numeric_limits<std::int64_t>::min();
  const std::uint64_t highest = std::numeric_limits<std::uint64_t>::max();
  const Value read = JSONParse(GetJSONString({{"lowest", lowest}, {"highest", highest}}));
  EXPECT_EQ(GetInteger<std::int64_t>(read, "lowest"), lowest);
  EXPECT_EQ(GetInteger<std::uint64_t>(read, "highest"), highest);
  for (const double f : {0.1, -0.0, 1.0 / 3, 5e-324, std::numeric_limits<double>::max(), 2.0}) {
    const double back = GetFloat(JSONParse(GetJSONString({{"f", f}})), "f");
    EXPECT_EQ(std::bit_cast<std::uint64_t>(back), std::bit_cast<std::uint64_t>(f)) << f;
  }
  EXPECT_THROW(GetJSONString({{"a", {1, {{"b", std::nan("")}}}}}), Error);
}

TEST(SerializationTest, MissingKeysAndWrongTypesAreToldApart) {
  const Value value = JSONParse(
      u"{\"i\":3000000000,\"n\":-1,\"f\":1.5,\"b\":true,\"s\":\"x\",\"o\":{},\"z\":null}");
  EXPECT_THROW(GetInteger<std::int32_t>(value, "x"), MissingKey);
  EXPECT_THROW(GetInteger<std::int32_t>(value, "i"), WrongType);
  EXPECT_EQ(GetInteger<std::uint32_t>(value, "i"), 3000000000u);
  EXPECT_THROW(GetInteger<std::uint64_t>(value, "n"), WrongType);
  EXPECT_EQ(GetInteger<std::int32_t>(value, "n"), -1);
  for (const char* key : {"f", "b", "s", "o", "z"}) {
    EXPECT_THROW(GetInteger<std::int64_t>(value, key), WrongType) << key;
  }
  EXPECT_EQ(GetFloat(value, "n"), -1.0);
  EXPECT_THROW(GetFloat(value, "b"), WrongType);
  EXPECT_TRUE(GetBool(value, "b"));
  EXPECT_THROW(GetBool(value, "n"), WrongType);
  EXPECT_EQ(GetString(value, "s"), "x");
  EXPECT_THROW(GetString(value, "z"), WrongType);
  EXPECT_THROW(GetObject(value, "s"), WrongType);
  EXPECT_THROW(GetBool(GetObject(value, "o"), "b"), MissingKey);
  EXPECT_THROW(Member(Value(1), "b"), WrongType);
}

TEST(SerializationTest, OtherThanObjectsAreWrapped) {
  EXPECT_EQ(GetJSONString(Value(7)), u"{\"SerializerWrappedObject\":7}");
  EXPECT_EQ(GetJSONString(Value::array({1, 2})), u"{\"SerializerWrappedObject\":[1,2]}");
  for (const Value& value : {Value(7), Value("x"), Value::array({1, 2}), Value{{"a", 1}}}) {
    EXPECT_EQ(JSONParse(GetJSONString(value)), value);
  }
  EXPECT_EQ(JSONParse(u"{\"SerializerWrappedObject\":{\"a\":1}}"), (Value{{"a", 1}}));
}

TEST(SerializationTest, WhatIsNoJSONThrows) {
  for (const char16_t* text :
       {u"", u"{", u"[1]", u"3", u"{\"a\":1}x", u"{\"a\":\"\\ud800\"}", u"{'a':1}"}) {
    EXPECT_THROW(JSONParse(text), Error) << utility::ToUTF8(text);
  }
  EXPECT_THROW(JSONParse(std::u16string(200000, u'[')), Error);
  std::u16string deep;
  for (int i = 0; i < 100000; ++i) deep += u"{\"a\":";
  EXPECT_THROW(JSONParse(deep), Error);
}

}  // namespace
}  // namespace tessel::serialization
