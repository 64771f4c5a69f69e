#include "stabilizer/effect/src/stabilizer_strings.h"

#include <gtest/gtest.h>

#include <fstream>
#include <string>
#include <vector>

#include "analysis/effect/analysis_strings.h"

namespace kelp::effect {
namespace {

// As the lines of stabilizer_strings.txt have them: what the text is for, and the keyed literal.
std::vector<std::string> EveryText() {
  std::vector<std::string> lines;
  const auto add = [&lines](const std::string& place, const char* literal) {
    if (literal) lines.push_back(place + ';' + literal);
  };
  const HX_StringTable& table = StabilizerStringTable();
  for (std::uint32_t i = 0; i < table.count; ++i) {
    add(std::to_string(table.number) + '/' + std::to_string(i), table.literals[i]);
  }
  for (int status = -1; status < 20; ++status) {
    add("status " + std::to_string(status), StabilizerStatusLiteral(status));
  }
  for (int status = -1; status < 20; ++status) {
    add("status " + std::to_string(status) + " of an analysis",
        analysis::effect::AnalysisStatusLiteral(status));
  }
  add("effect name", kEffectName);
  add("auto-scale readout", kAutoScaleReadout);
  add("version too old", kVersionTooOld);
  add("version too new", kVersionTooNew);
  add("bad data", kBadSerializedData);
  add("grid mismatch", kGridMismatch);
  add("cancel button", analysis::effect::kCancelButtonInitializing);
  return lines;
}

TEST(StabilizerStringsTest, EveryTextAndItsKey) {
  std::ifstream file(CALMFRAME_TABLES "/stabilizer_strings.txt");
  std::vector<std::string> expected;
  for (std::string line; std::getline(file, line);) expected.push_back(line);
  EXPECT_EQ(EveryText(), expected);
  EXPECT_EQ(StabilizerStringTable().count, 40u);  // the last one ends the table
}

}  // namespace
}  // namespace kelp::effect
