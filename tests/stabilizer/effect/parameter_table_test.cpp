#include "stabilizer/effect/src/parameter_table.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <map>
#include <set>
#include <sstream>
#include <string>

#include "platform/tessel/config.h"
#include "stabilizer/effect/src/stabilizer_strings.h"

namespace kelp::effect {
namespace {

// index;disk id;kind;flags (hexadecimal), + user interface flags;name; then
// of a float valid and slider range, default, decimals/display; of a popup default, count, items;
// of a checkbox its default; of a button its label.
constexpr char kDeclared[] = R"(
1;1;button;140;;Analyze
2;11;button;140+32;;Cancel
3;12;start;0;Stabilization
4;19;popup;102;Result;1;2;Smooth Motion|No Motion
5;20;float;122;Smoothness;0..1000;0..100;50;0/1
6;28;popup;102;Method;4;4;Position|Position, Scale, Rotation|Perspective|Subspace Warp
7;13;end;0;
8;8;start;0;Borders
9;22;popup;102;Framing;3;4;Stabilize Only|Stabilize, Crop|Stabilize, Crop, Auto-scale|Stabilize, Synthesize Edges
10;17;start;20;Auto-scale
11;4;float;122;Maximum Scale;100..10000;100..200;150;0/1
12;3;float;122;Action-safe Margin;0..100;0..20;0;0/1
13;18;end;0;
14;16;float;100;Additional Scale;0..10000;0..200;100;0/1
15;9;end;0;
16;24;start;20;Advanced
17;36;check;142;Detailed Analysis;0
18;37;popup;102;Rolling Shutter Ripple;1;2;Automatic Reduction|Enhanced Reduction
19;23;float;122;Crop Less <-> Smooth More;0..100;0..100;50;0/1
20;38;float;122;Synthesis Input Range (seconds);0..999;0.01..5;0.5;2/0
21;35;float;120;Synthesis Edge Feather;0..999;0..20;10;0/0
22;29;start;20;Synthesis Edge Cropping
23;31;float;120;Left;0..999;0..20;0;0/0
24;32;float;120;Top;0..999;0..20;0;0/0
25;33;float;120;Right;0..999;0..20;0;0/0
26;34;float;120;Bottom;0..999;0..20;0;0/0
27;30;end;0;
28;26;check;102;Hide Warning Banner;0
29;25;end;0;
30;302;float;102+512;AnalysisStatusCounter;0..2e+09;0..2000;0;0/0
31;100;start;20;Experimental
32;101;start;20;Trackers
33;102;float;40;Max Count, 0=auto;0..9999;100..2000;0;0/0
34;110;check;40;Presmoothing;1
35;111;float;40;Presmoothing Factor;0.001..2;0.001..1;0.1;2/0
36;113;float;40;Eigen Ratio Threshold;0..100;0..100;15;2/0
37;104;float;40;Selector X Radius, 0=auto;0..200;1..50;0;0/0
38;105;float;40;Selector Y Radius, 0=auto;0..200;1..50;0;0/0
39;106;float;40;Border Width to Avoid (pixels);1..2000;1..120;12;0/0
40;108;float;40;min_eig;1..10000;1..100;1;1/0
41;109;float;40;max_eig;1..10000;4000..10000;6000;1/0
42;107;float;40;Threshold (screens out weak);0.001..1;0.01..1;0.01;2/0
43;103;float;40;Min Spacing (pixels), 0=auto;0..200;0..50;0;0/0
44;123;float;40;Pyramidal Levels;1..10;1..10;5;0/0
45;124;float;40;Tracker X Radius, 0=auto;0..50;1..30;0;0/0
46;125;float;40;Tracker Y Radius, 0=auto;0..50;1..30;0;0/0
47;120;float;40;Max Iterations;1..100;1..30;25;0/0
48;121;float;40;Tolerance Translation;0..10;0..1;0.1;2/0
49;126;float;40;Color Correction Trans (0,2);0..2;0..2;0;0/0
50;128;check;40;Affine Verification;1
51;122;float;40;Tolerance Affine;0..10;0..1;0.05;2/0
52;129;float;40;Tolerance Color Lambda;0..10;0..1;0.05;2/0
53;130;float;40;Tolerance Color Delta;0..255;0..10;1;2/0
54;127;float;40;Color Correction Affine (0,2);0..2;0..2;2;0/0
55;131;float;40;Tolerance Min Corr., 0=auto;-1..1;0..1;0;2/0
56;133;float;40;Tolerance Primary Color, 0=off;0..255;0..64;5;2/0
57;200;end;0;
58;201;start;20;Stabilization
59;203;float;100;Rank;1..50;1..100;9;0/0
60;204;float;100;Window Duration;1..500;1..100;40;0/0
61;205;float;100;Window Step;1..100;1..5;5;0/0
62;206;float;100;Ignore Trackers Shorter Than;1..200;1..50;5;0/0
63;207;float;100+32;Kernel Size;1..400;1..200;100;0/0
64;208;float;100+32;Short Trajectory Duration;1..200;1..100;10;0/0
65;209;float;100;Max Reprojection Error;0..1;0..0.1;0.0045;4/0
66;211;float;100;Track Fade Weight Duration;1..400;1..200;100;0/0
67;212;float;100;Track Fade Weight Minimum;1..100;1..10;5;0/0
68;214;float;100;Max Factorization Frames;1..1000;1..300;300;0/0
69;291;float;100;Max Transition Iterations;0..50;1..30;10;0/0
70;216;float;100;Factorization Window Overlap;1..100;1..50;30;0/0
71;217;float;100;Transition Window Overlap;1..100;1..50;10;0/0
72;285;float;122+32;Transition Bisquare Sigma;1..10;1..8;5;1/0
73;292;check;2;Use New Solver;1
74;287;float;122;Transition Max Duration;100..500;100..500;200;0/0
75;288;float;122;Transition Stab Lambda, 0=auto;0..300;10..300;0;1/0
76;289;float;22;Transition TrackFadeWeight Dur.;5..100;5..100;30;0/0
77;281;check;102;Enable Conservative Factoriztn;1
78;293;float;122;Consrv Fctrz Threshold,0=auto;0..100;0..10;0;1/0
79;220;float;100;Sanity-chck Homog. Limit,0=auto;0..10000;30..90;0;0/0
80;210;float;100;Path Smooth Gaussian Sigma (30);0..1000;0..170;0;1/0
81;218;float;100;Path Smooth Bilateral Sigma;0..4000;0..1000;0;1/0
82;250;end;0;
83;7;float;122;Warp Factor;0..10;0..10;10;1/0
84;15;check;100;Deblur;0
85;272;float;100;Deblur Frame Range;2..99;2..9;3;0/0
86;275;float;100;Deblur Frame Threshold;0..100;0..100;5;0/0
87;277;float;100;Deblur Comparison Blur;0..100;0..20;9;1/0
88;273;float;100;Deblur Pixel Threshold;0..100;0..100;3;0/1
89;276;float;100;Deblur Pixel Threshold Softness;0..100;0..100;4;0/1
90;274;check;100;Show Deblur Map;0
91;279;popup;102;Deblur Debug;1;6;Off|Show Blurred Sharper Frame|Show Blurred This Frame|Show Sharper Frame|Show This Frame|Show Aligned Frame
92;278;float;0;Aligned Frame to Show;-50..50;-10..10;0;0/256
93;283;float;0;Synthesis Alpha Boost Factor;1..250;1..10;5;0/256
94;295;float;40;Prekill tracks shorter than:;0..200;0..50;5;0/0
95;280;check;100;Show Tracks;0
96;290;button;140;;Save TRK file
97;300;end;0;
)";

class ParameterTableTest : public ::testing::Test {
 protected:
  HX_ParamDef Def(std::int32_t index) { return MakeParamDef(*ParameterTableRow(index), texts_); }

  std::string Describe(std::int32_t index) {
    const HX_ParamDef def = Def(index);
    static const std::map<std::int32_t, const char*> kinds = {
        {4, "check"}, {7, "popup"}, {10, "float"}, {13, "start"}, {14, "end"}, {15, "button"}};
    std::ostringstream text;
    text << index << ';' << def.disk_id << ';' << kinds.at(def.kind) << ';' << std::hex << def.flags
         << std::dec;
    if (def.ui_flags != 0) text << '+' << def.ui_flags;
    text << ';' << def.name;
    const HX_ParamValue& u = def.u;
    if (def.kind == HX_PARAM_FLOAT_SLIDER) {
      text << ';' << u.fs.valid_min << ".." << u.fs.valid_max << ';' << u.fs.slider_min << ".."
           << u.fs.slider_max << ';' << u.fs.default_value << ';' << u.fs.precision << '/'
           << u.fs.display;
    } else if (def.kind == HX_PARAM_POPUP) {
      text << ';' << u.pd.default_value << ';' << u.pd.count << ';' << u.pd.items;
    } else if (def.kind == HX_PARAM_CHECKBOX) {
      text << ';' << u.bd.default_value;
    } else if (def.kind == HX_PARAM_BUTTON) {
      text << ';' << u.button.label;
    }
    return text.str();
  }

  const tessel::config::StringTable strings_{StabilizerStringTable().literals,
                                             StabilizerStringTable().count};
  ParameterTexts texts_{[this](std::int32_t number) { return strings_.Get(number); }};
};

TEST_F(ParameterTableTest, EveryRecordAsItIsDeclared) {
  std::istringstream lines(kDeclared);
  std::string line;
  std::getline(lines, line);
  for (std::int32_t index = 1; index < kParamCount; ++index) {
    ASSERT_TRUE(ParameterTableRow(index)) << index;
    ASSERT_TRUE(std::getline(lines, line));
    EXPECT_EQ(Describe(index), line);
  }
  EXPECT_FALSE(std::getline(lines, line));
  for (const std::int32_t index : {-10000, -1, 0, 98}) EXPECT_FALSE(ParameterTableRow(index));
}

TEST_F(ParameterTableTest, IdsAreUniqueGroupsCloseAndDefaultsLieInTheirRanges) {
  std::set<std::int32_t> ids;
  int depth = 0;
  for (std::int32_t index = 1; index < kParamCount; ++index) {
    SCOPED_TRACE(index);
    const HX_ParamDef def = Def(index);
    EXPECT_TRUE(ids.insert(def.disk_id).second);
    if (def.kind == HX_PARAM_GROUP_START) ++depth;
    if (def.kind == HX_PARAM_GROUP_END) --depth;
    ASSERT_GE(depth, 0);
    // What is declared without the experimental ones must stand alone.
    if (index == kFirstExperimentalIndex - 1) {
      EXPECT_EQ(depth, 0);
    }
    EXPECT_EQ(ValueOf(def), GetParamDefault(index));
    EXPECT_EQ(def.change_flag, 0);
    if (def.kind == HX_PARAM_FLOAT_SLIDER) {
      const HX_FloatSlider& slider = def.u.fs;
      EXPECT_GE(slider.default_value, slider.valid_min);
      EXPECT_LE(slider.default_value, slider.valid_max);
      EXPECT_EQ(slider.default_value, static_cast<float>(slider.value));
      EXPECT_EQ(slider.tolerance, 0.05f);
      EXPECT_LT(slider.slider_min, slider.slider_max);
      EXPECT_GE(slider.slider_min, slider.valid_min);
      // The rank's slider goes further than its values.
      if (index != kRankIndex) {
        EXPECT_LE(slider.slider_max, slider.valid_max);
      }
    } else if (def.kind == HX_PARAM_POPUP) {
      EXPECT_EQ(def.u.pd.value, def.u.pd.default_value);
      EXPECT_LE(def.u.pd.value, def.u.pd.count);
    }
  }
  EXPECT_EQ(depth, 0);
}

TEST_F(ParameterTableTest, NamesThatAreNotTranslatedFitTheRecordAndTranslatedOnesAreCut) {
  for (std::int32_t index = 1; index < kParamCount; ++index) {
    const std::string name = texts_.Get(ParameterTableRow(index)->name);
    EXPECT_LT(name.size(), std::size_t{HX_PARAM_NAME_SIZE}) << name;
  }
  const std::string name = "\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4";  // 16 bytes
  const std::string long_name = name + name;
  ParameterTexts long_texts([&](std::int32_t) { return long_name.c_str(); });
  EXPECT_EQ(MakeParamDef(*ParameterTableRow(kResultIndex), long_texts).name,
            long_name.substr(0, 30));
  ParameterTexts none([](std::int32_t) -> const char* { return nullptr; });
  EXPECT_STREQ(MakeParamDef(*ParameterTableRow(kResultIndex), none).name, "");
}

TEST_F(ParameterTableTest, IdsAndIndicesMapBothWays) {
  std::map<std::int32_t, std::int32_t> index_of = {{-10000, 1}, {-9999, 2},  {-9998, 17},
                                                   {-9973, 94}, {-9972, 95}, {-9971, 96}};
  for (std::int32_t id = -9997; id <= -9974; ++id) index_of[id] = id + 10030;
  std::map<std::int32_t, std::int32_t> id_of;
  for (const auto& [id, index] : index_of) id_of[index] = id;
  index_of[-9970] = 30;  // this way alone

  for (std::int32_t id = -10100; id <= 200; ++id) {
    EXPECT_EQ(ParamIdToIndex(id), index_of.count(id) ? index_of[id] : kNoParam) << id;
    EXPECT_EQ(IndexToParamId(id), id_of.count(id) ? id_of[id] : kNoParam) << id;
  }
  for (const std::int32_t id : {INT32_MIN, INT32_MAX}) {
    EXPECT_EQ(ParamIdToIndex(id), kNoParam);
    EXPECT_EQ(IndexToParamId(id), kNoParam);
  }
}

TEST_F(ParameterTableTest, DefaultsAnswerByIndexAndById) {
  EXPECT_EQ(GetParamDefault(59), 9);
  EXPECT_EQ(GetParamDefault(65), 0.0045);  // not narrowed
  EXPECT_EQ(GetParamDefault(34), 1);
  EXPECT_EQ(GetParamDefault(-9996), 1);
  EXPECT_EQ(GetParamDefault(-9973), 5);
  for (const std::int32_t id : {INT32_MIN, -10001, -9969, -1, 0, 1, 3, 7, 97, 98, INT32_MAX}) {
    EXPECT_EQ(GetParamDefault(id), 0) << id;
  }
}

}  // namespace
}  // namespace kelp::effect
