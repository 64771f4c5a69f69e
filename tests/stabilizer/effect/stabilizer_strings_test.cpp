#include "stabilizer/effect/src/stabilizer_strings.h"

#include <gtest/gtest.h>

#include <map>
#include <string>

#include "analysis/effect/analysis_strings.h"
#include "platform/tessel/config.h"

namespace kelp::effect {
namespace {

using tessel::config::Localizer;

// Those that are no parameter's name or item; ParameterTableTest reads the others.
TEST(StabilizerStringsTest, NumberedTextsAsTheHostGivesThem) {
  const HX_StringTable& table = StabilizerStringTable();
  EXPECT_EQ(table.number, 4700u);
  EXPECT_EQ(table.count, 40u);
  EXPECT_EQ(table.literals[39], nullptr);
  const tessel::config::StringTable texts(table.literals, table.count);
  const std::map<std::int32_t, std::string> expected = {
      {0, "Calmframe, v%d.%d\n\nStabilizes footage without manual tracking."},
      {1, ""},
      {2, "Not enough memory to allocate stabilizer data."},
      {3, ""},
      {4, ""},
      {5, "Stabilization finished:"},
      {6, "%d%% (frame %d%s of %d)"},
      {7, "Stabilizer analysis canceled."},
      {8, "Time remaining: %d minutes"},
      {9, "Time remaining: %d seconds"},
      {10, ""},
      {11, ""},
      {26, ""},
      {30, "Synthesis Input Range (seconds)"},  // its note for translators is gone
      {38, "Time remaining: %d minute"}};
  for (const auto& [number, text] : expected) {
    ASSERT_TRUE(texts.Get(number)) << number;
    EXPECT_EQ(texts.Get(number), text) << number;
  }
  EXPECT_EQ(texts.Get(39), nullptr);
}

TEST(StabilizerStringsTest, EachEntryIsTranslatedByItsOwnNumber) {
  const HX_StringTable& table = StabilizerStringTable();
  std::map<std::string, std::string> translation;
  for (int number = 0; number < 39; ++number) {
    const std::string digits = (number < 10 ? "000" : "00") + std::to_string(number);
    translation["$$$/OV/Stabilizer/LStr/" + digits] = "text " + std::to_string(number);
  }
  Localizer::SetTable(translation);
  const tessel::config::StringTable texts(table.literals, table.count);
  Localizer::SetTable({});
  for (int number = 0; number < 39; ++number) {
    const std::string text = texts.Get(number);
    if (!text.empty()) {
      EXPECT_EQ(text, "text " + std::to_string(number));
    }
  }
}

TEST(StabilizerStringsTest, WordingsOfAStatus) {
  const std::map<std::int32_t, std::string> stabilizer = {
      {2, "Frame not analyzed for stabilization; click Analyze."},
      {5, "Stabilizing (step 2 of 2)"},
      {6, "Stabilizing"},
      {7, "Stabilizing"},
      {10, "Stabilization failed."},
      {11, "Unable to stabilize."},
      {12, "To avoid extreme cropping set Framing to Stabilize Only or adjust other parameters."}};
  const std::map<std::int32_t, std::string> analysis = {
      {1, "Click Analyze to begin."},
      {2, "Frame not analyzed; click Analyze."},
      {3, "New frames need analyzing; click Analyze."},
      {4, "Analyzing in background (step 1 of 2)"},
      {5, "Solving (step 2 of 2)"},
      {6, "Solving"},
      {7, "Solving"},
      {9, "Analysis failed."},
      {10, "Analysis solve failed."},
      {11, "Unable to analyze."}};
  const auto text = [](const char* literal) {
    return literal ? Localizer::Localize(literal) : std::string();
  };
  const auto expected = [](const std::map<std::int32_t, std::string>& texts, std::int32_t status) {
    const auto found = texts.find(status);
    return found == texts.end() ? std::string() : found->second;
  };
  for (std::int32_t status = -1; status <= 13; ++status) {
    EXPECT_EQ(text(StabilizerStatusLiteral(status)), expected(stabilizer, status)) << status;
    EXPECT_EQ(text(analysis::effect::AnalysisStatusLiteral(status)), expected(analysis, status))
        << status;
  }
}

}  // namespace
}  // namespace kelp::effect
