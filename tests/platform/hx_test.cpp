#include <gtest/gtest.h>

#include <cstring>
#include <map>
#include <string>

#include "tests/platform/hx_layout.h"

namespace {

std::map<std::string, std::size_t> LayoutInC() {
  std::size_t count = 0;
  const HX_LayoutEntry* entries = hx_layout_in_c(&count);
  std::map<std::string, std::size_t> layout;
  for (std::size_t i = 0; i < count; ++i) layout[entries[i].name] = entries[i].value;
  return layout;
}

TEST(HxTest, BothLanguagesSeeOneLayout) {
  const auto in_c = LayoutInC();
  const HX_LayoutEntry in_cpp[] = {HX_LAYOUT(HX_LAYOUT_SIZE, HX_LAYOUT_OFFSET)};
  EXPECT_EQ(in_c.size(), std::size(in_cpp));
  for (const HX_LayoutEntry& entry : in_cpp) {
    ASSERT_TRUE(in_c.count(entry.name)) << entry.name;
    EXPECT_EQ(in_c.at(entry.name), entry.value) << entry.name;
  }
}

TEST(HxTest, CallersFindOperationsByPosition) {
  const std::map<std::string, std::size_t> positions = {
      {"HX_PrivateEffectSuite3.ForceRerender", 5},
      {"HX_AnalysisHostSuite1.MayStart", 4},
      {"HX_AnalysisHostSuite1.GetCompressionPreference", 5},
      {"HX_AnalysisHostSuite1.ScheduleAnalysis", 6},
      {"HX_AnalysisHostSuite1.GetRefusal", 7},
      {"HX_OpaqueEffectDataSuite1.Find", 1},
      {"HX_OpaqueEffectDataSuite1.Set", 2},
      {"HX_OpaqueEffectDataSuite1.Release", 3},
      {"HX_VideoSegmentRenderSuite3.RenderAsync", 1},
      {"HX_VideoSegmentRenderSuite3.MakeIdentifier", 2},
      {"HX_VideoSegmentRenderSuite3.Cancel", 10},
      {"HX_CutPixCacheSuite5.Lookup", 6},
      {"HX_CutPixCacheSuite5.Reference", 7},
      {"HX_CutPixCacheSuite5.Dereference", 8},
  };
  const auto in_c = LayoutInC();
  for (const auto& [name, position] : positions) {
    EXPECT_EQ(in_c.at(name), (position - 1) * sizeof(void (*)(void))) << name;
  }
}

TEST(HxTest, FormatCodesReadAsTheirCharactersInMemory) {
  const std::map<std::string, std::uint32_t> codes = {{"argb", HX_FORMAT_ARGB8},
                                                      {"arg6", HX_FORMAT_ARGB16},
                                                      {"argf", HX_FORMAT_ARGBF},
                                                      {"bgra", HX_FORMAT_BGRA8}};
  for (const auto& [text, code] : codes) {
    EXPECT_EQ(std::memcmp(text.data(), &code, 4), 0) << text;
    EXPECT_EQ(code & HX_FORMAT_TOP_DOWN, 0u) << text;
  }
}

}  // namespace
