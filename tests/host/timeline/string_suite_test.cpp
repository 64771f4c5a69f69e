#include "tests/host/timeline/timeline_fixture.h"

namespace calmframe::host {
namespace {

class StringSuiteTest : public TimelineTest {};

TEST_F(StringSuiteTest, BothFormsOfOneText) {
  HX_String from8 = nullptr, from16 = nullptr, name = nullptr;
  ASSERT_EQ(strings.MakeFromUTF8("/a/\xF0\x9F\x8E\xA5 b.mp4", &from8), HX_ERR_NONE);
  const std::uint16_t* units = nullptr;
  ASSERT_EQ(strings.GetUTF16(from8, &units), HX_ERR_NONE);
  EXPECT_EQ(units[3], 0xD83C);
  EXPECT_EQ(units[4], 0xDFA5);
  ASSERT_EQ(strings.MakeFromUTF16(units, &from16), HX_ERR_NONE);
  EXPECT_EQ(Take(from16), "/a/\xF0\x9F\x8E\xA5 b.mp4");
  ASSERT_EQ(strings.GetFileName(from8, &name), HX_ERR_NONE);
  EXPECT_EQ(strings.Dispose(from8), HX_ERR_NONE);
  EXPECT_EQ(Take(name), "\xF0\x9F\x8E\xA5 b.mp4");

  const char* text = nullptr;
  EXPECT_NE(strings.GetUTF8(from8, &text), HX_ERR_NONE);
  EXPECT_NE(strings.Dispose(from8), HX_ERR_NONE);
  EXPECT_NE(strings.MakeFromUTF8(nullptr, &name), HX_ERR_NONE);
  mistakes = "String.Dispose of what is not lent\n";
}

}  // namespace
}  // namespace calmframe::host
