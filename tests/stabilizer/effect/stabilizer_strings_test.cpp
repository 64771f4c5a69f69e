#include "stabilizer/effect/src/stabilizer_strings.h"

#include <gtest/gtest.h>

#include <fstream>
#include <sstream>
#include <string>

#include "analysis/effect/analysis_strings.h"

namespace kelp::effect {
namespace {

// As the lines of stabilizer_strings.txt have them: what the text is for, and the keyed literal.
TEST(StabilizerStringsTest, EveryTextAndItsKey) {
  std::ostringstream lines;
  const auto add = [&lines](const std::string& place, const char* literal) {
    if (literal) lines << place << ';' << literal << '\n';
  };
  const HX_StringTable& table = StabilizerStringTable();
  EXPECT_EQ(table.count, 40u);  // the last one ends the table
  for (std::uint32_t i = 0; i < table.count; ++i) {
    add(std::to_string(table.number) + '/' + std::to_string(i), table.literals[i]);
  }
  const auto add_statuses = [&add](const char* of, const char* (*literal)(std::int32_t)) {
    for (int status = -1; status < 20; ++status) {
      add("status " + std::to_string(status) + of, literal(status));
    }
  };
  add_statuses("", StabilizerStatusLiteral);
  add_statuses(" of an analysis", analysis::effect::AnalysisStatusLiteral);
  add("effect name", kEffectName);
  add("auto-scale readout", kAutoScaleReadout);
  add("version too old", kVersionTooOld);
  add("version too new", kVersionTooNew);
  add("bad data", kBadSerializedData);
  add("grid mismatch", kGridMismatch);
  add("cancel button", analysis::effect::kCancelButtonInitializing);
  std::ostringstream expected;
  expected << std::ifstream(CALMFRAME_TABLES "/stabilizer_strings.txt").rdbuf();
  EXPECT_EQ(lines.str(), expected.str());
}

}  // namespace
}  // namespace kelp::effect
