#include "stabilizer/effect/src/parameter_table.h"

#include <gtest/gtest.h>

#include <fstream>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "platform/tessel/config.h"
#include "stabilizer/effect/src/stabilizer_strings.h"

namespace kelp::effect {
namespace {

using Columns = std::map<std::string, std::string>;

std::vector<std::string> Cells(const std::string& line) {
  std::vector<std::string> cells;
  std::istringstream text(line + ';');
  for (std::string cell; std::getline(text, cell, ';');) cells.push_back(cell);
  return cells;
}

// The lines of parameter_table.txt by its columns: a parameter each, in the order of the indices.
std::vector<Columns> DeclaredParameters() {
  std::ifstream file(CALMFRAME_TABLES "/parameter_table.txt");
  std::string line;
  std::getline(file, line);
  const std::vector<std::string> names = Cells(line);
  std::vector<Columns> rows;
  while (std::getline(file, line)) {
    const std::vector<std::string> cells = Cells(line);
    EXPECT_EQ(cells.size(), names.size()) << line;
    Columns& row = rows.emplace_back();
    for (std::size_t i = 0; i < cells.size(); ++i) row[names[i]] = cells[i];
  }
  return rows;
}

template <class... Values>
std::string Text(const Values&... values) {
  std::ostringstream text;
  (text << ... << values);
  return text.str();
}

class ParameterTableTest : public ::testing::Test {
 protected:
  HX_ParamDef Def(std::int32_t index) { return MakeParamDef(*ParameterTableRow(index), texts_); }

  Columns Described(std::int32_t index) {
    static const std::map<std::int32_t, const char*> kinds = {
        {4, "check"}, {7, "popup"}, {10, "float"}, {13, "start"}, {14, "end"}, {15, "button"}};
    const HX_ParamDef def = Def(index);
    const HX_ParamValue& u = def.u;
    Columns row = {{"index", Text(index)},
                   {"disk id", Text(def.disk_id)},
                   {"shown", IsExperimentalIndex(index) ? "experimental" : "always"},
                   {"kind", kinds.at(def.kind)},
                   {"flags", Text(std::hex, def.flags)},
                   {"ui flags", Text(def.ui_flags)},
                   {"name", def.name},
                   {"value", Text(ValueOf(def))}};
    if (def.kind == HX_PARAM_FLOAT_SLIDER) {
      row["valid"] = Text(u.fs.valid_min, "..", u.fs.valid_max);
      row["slider"] = Text(u.fs.slider_min, "..", u.fs.slider_max);
      row["default"] = Text(u.fs.default_value);
      row["decimals/display"] = Text(u.fs.precision, '/', u.fs.display);
      row["tolerance"] = Text(u.fs.tolerance);
    } else if (def.kind == HX_PARAM_POPUP) {
      row["default"] = Text(u.pd.default_value);
      row["count"] = Text(u.pd.count);
      row["items or label"] = u.pd.items;
    } else if (def.kind == HX_PARAM_CHECKBOX) {
      row["default"] = Text(u.bd.default_value);
    } else if (def.kind == HX_PARAM_BUTTON) {
      row["items or label"] = u.button.label;
    }
    for (std::int32_t id = -10000; id < -9969; ++id) {
      if (ParamIdToIndex(id) == index) row["generic id"] += Text(id);
    }
    return row;
  }

  const tessel::config::StringTable strings_{StabilizerStringTable().literals,
                                             StabilizerStringTable().count};
  ParameterTexts texts_{[this](std::int32_t number) { return strings_.Get(number); }};
};

TEST_F(ParameterTableTest, EveryRecordAsItIsDeclared) {
  const std::vector<Columns> rows = DeclaredParameters();
  ASSERT_EQ(rows.size(), kParamCount - 1u);
  for (std::int32_t index = 1; index < kParamCount; ++index) {
    Columns described = Described(index);
    EXPECT_EQ(Text(GetParamDefault(index)), described["value"]);
    for (const auto& [column, text] : rows[index - 1]) {
      EXPECT_EQ(described[column], text) << "index " << index << ", " << column;
    }
  }
  for (const std::int32_t index : {INT32_MIN, -10000, -1, 0, 98, INT32_MAX}) {
    EXPECT_FALSE(ParameterTableRow(index)) << index;
  }
}

TEST_F(ParameterTableTest, TranslatedNamesAreCutBetweenCharacters) {
  const std::string name = "\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4";  // 16 bytes
  const std::string long_name = name + name;
  ParameterTexts long_texts([&](std::int32_t) { return long_name.c_str(); });
  EXPECT_EQ(MakeParamDef(*ParameterTableRow(kResultIndex), long_texts).name,
            long_name.substr(0, 30));
  ParameterTexts none([](std::int32_t) -> const char* { return nullptr; });
  EXPECT_STREQ(MakeParamDef(*ParameterTableRow(kResultIndex), none).name, "");
}

// The status counter is looked up by its id alone.
TEST_F(ParameterTableTest, IndicesAndIdsAnswerEachOtherAndNothingElse) {
  for (std::int32_t id = -10000; id < -9970; ++id) {
    EXPECT_EQ(IndexToParamId(ParamIdToIndex(id)), id);
    EXPECT_EQ(GetParamDefault(id), GetParamDefault(ParamIdToIndex(id)));
  }
  for (const std::int32_t index : {0, 3, 5, 16, 30, 32, 57, 93, 97}) {
    EXPECT_EQ(IndexToParamId(index), kNoParam) << index;
  }
  for (const std::int32_t none : {INT32_MIN, -10001, -9969, -1, 98, INT32_MAX}) {
    EXPECT_EQ(ParamIdToIndex(none), kNoParam) << none;
    EXPECT_EQ(IndexToParamId(none), kNoParam) << none;
    EXPECT_EQ(GetParamDefault(none), 0) << none;
  }
}

}  // namespace
}  // namespace kelp::effect
