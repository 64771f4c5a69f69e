#include "stabilizer/effect/src/parameter_table.h"

#include <gtest/gtest.h>

#include <fstream>
#include <map>
#include <sstream>
#include <string>

#include "platform/tessel/config.h"
#include "stabilizer/effect/src/stabilizer_strings.h"

namespace kelp::effect {
namespace {

template <class... Values>
std::string Text(const Values&... values) {
  std::ostringstream text;
  (text << ... << values);
  return text.str();
}

class ParameterTableTest : public ::testing::Test {
 protected:
  HX_ParamDef Def(std::int32_t index) { return MakeParamDef(*ParameterTableRow(index), texts_); }

  // As its line in parameter_table.txt has it.
  std::string Described(std::int32_t index) {
    static const std::map<std::int32_t, const char*> kinds = {
        {4, "check"}, {7, "popup"}, {10, "float"}, {13, "start"}, {14, "end"}, {15, "button"}};
    const HX_ParamDef def = Def(index);
    const HX_ParamValue& u = def.u;
    std::string own, generic;
    if (def.kind == HX_PARAM_FLOAT_SLIDER) {
      own = Text(u.fs.valid_min, "..", u.fs.valid_max, ';', u.fs.slider_min, "..", u.fs.slider_max,
                 ';', u.fs.default_value, ';', u.fs.tolerance, ';', u.fs.precision, '/',
                 u.fs.display);
    } else if (def.kind == HX_PARAM_POPUP) {
      own = Text(u.pd.default_value, ';', u.pd.count, ';', u.pd.items);
    } else if (def.kind == HX_PARAM_CHECKBOX) {
      own = Text(u.bd.default_value);
    } else if (def.kind == HX_PARAM_BUTTON) {
      own = u.button.label;
    }
    for (std::int32_t id = -10000; id < -9969; ++id) {
      if (ParamIdToIndex(id) == index) generic += Text(id);
    }
    const char* const shown = IsExperimentalIndex(index) ? "experimental" : "always";
    return Text(index, ';', def.disk_id, ';', shown, ';', kinds.at(def.kind), ';', std::hex,
                def.flags, std::dec, ';', def.ui_flags, ';', def.name, ';', ValueOf(def), ';',
                generic, ';', own);
  }

  const tessel::config::StringTable strings_{StabilizerStringTable().literals,
                                             StabilizerStringTable().count};
  ParameterTexts texts_{[this](std::int32_t number) { return strings_.Get(number); }};
};

TEST_F(ParameterTableTest, EveryRecordAsItIsDeclared) {
  std::ifstream file(CALMFRAME_TABLES "/parameter_table.txt");
  std::string line;
  std::getline(file, line);  // the columns' names
  for (std::int32_t index = 1; index < kParamCount; ++index) {
    ASSERT_TRUE(std::getline(file, line));
    EXPECT_EQ(Described(index), line);
    EXPECT_EQ(Text(GetParamDefault(index)), Text(ValueOf(Def(index))));
  }
  EXPECT_FALSE(std::getline(file, line)) << line;
  EXPECT_EQ(GetParamDefault(kMaxReprojectionErrorIndex), 0.0045) << "not narrowed";
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
