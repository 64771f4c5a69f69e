#include "platform/hx/hx.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <utility>

namespace {

constexpr std::size_t Nth(int position) {
  return (position - 1) * sizeof(void (*)(void));
}

// What hosts and plug-ins that were compiled before call.
TEST(HxTest, CallersFindOperationsByPosition) {
  EXPECT_EQ(offsetof(HX_PrivateEffectSuite3, ForceRerender), Nth(5));
  EXPECT_EQ(offsetof(HX_AnalysisHostSuite1, MayStart), Nth(4));
  EXPECT_EQ(offsetof(HX_AnalysisHostSuite1, GetCompressionPreference), Nth(5));
  EXPECT_EQ(offsetof(HX_AnalysisHostSuite1, ScheduleAnalysis), Nth(6));
  EXPECT_EQ(offsetof(HX_AnalysisHostSuite1, GetRefusal), Nth(7));
  EXPECT_EQ(offsetof(HX_OpaqueEffectDataSuite1, Find), Nth(1));
  EXPECT_EQ(offsetof(HX_OpaqueEffectDataSuite1, Set), Nth(2));
  EXPECT_EQ(offsetof(HX_OpaqueEffectDataSuite1, Release), Nth(3));
  EXPECT_EQ(offsetof(HX_VideoSegmentRenderSuite3, RenderAsync), Nth(1));
  EXPECT_EQ(offsetof(HX_VideoSegmentRenderSuite3, MakeIdentifier), Nth(2));
  EXPECT_EQ(offsetof(HX_VideoSegmentRenderSuite3, Cancel), Nth(10));
  EXPECT_EQ(offsetof(HX_CutPixCacheSuite5, Lookup), Nth(6));
  EXPECT_EQ(offsetof(HX_CutPixCacheSuite5, Reference), Nth(7));
  EXPECT_EQ(offsetof(HX_CutPixCacheSuite5, Dereference), Nth(8));
}

TEST(HxTest, FormatCodesReadAsTheirCharactersInMemory) {
  for (const auto& [text, code] : {std::pair{"argb", std::uint32_t{HX_FORMAT_ARGB8}},
                                   {"arg6", HX_FORMAT_ARGB16},
                                   {"argf", HX_FORMAT_ARGBF},
                                   {"bgra", HX_FORMAT_BGRA8}}) {
    EXPECT_EQ(std::memcmp(text, &code, 4), 0) << text;
    EXPECT_EQ(code & HX_FORMAT_TOP_DOWN, 0u) << text;
  }
}

}  // namespace
