#include "analysis/effect/analysis_ui_data.h"

#include <gmock/gmock.h>

#include <cmath>

#include "analysis/effect/track_colors.h"
#include "analysis/src/read_job_input.h"
#include "tests/analysis/effect/test_effect.h"
#include "tests/effect/fake_pixels.h"

namespace kelp::analysis::effect {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr float kNaN = std::numeric_limits<float>::quiet_NaN();

// Two analysed frames, 10 and 11 of the clip, in 160 x 120.
class AnalysisUIDataTest : public EffectTest {
 protected:
  AnalysisUIDataTest() {
    EXPECT_EQ(Apply(), 0);
    AnalysisState& state = *State();
    state.EndAnalyzer(&host_.in, &host_.out);
    state.job_input = ReadJobInput(&host_.in, &host_.out);
    state.source_identity = tessel::utility::Guid::MakeUnique();
    state.first_frame = layer_.start = 10;
    state.all_features.feature_count = 6;
    state.all_features.frame_count = 2;
    *state.all_features.features = {{20.25f, 15.5f, 1, 0}, {100, 80, 1, 0},     {60, 60, -10, 0},
                                    {50, 10, -1, 0},       {kNaN, 10, 0, 0},    {99, 66, 1, 0},
                                    {22.25f, 14.5f, 0, 0}, {101, 80.5f, -2, 0}, {61, 60, -11, 0},
                                    {50, 10, 2, 0},        {9, kNaN, 0, 0},     {99, 67, 0, 0}};
  }

  struct Picture {
    explicit Picture(int width, int height, std::uint32_t format = HX_FORMAT_ARGBF)
        : data(std::size_t(width) * height * 4) {
      world = {data.data(), width * FakePixelBytes(format), width, height, 0, 0, 0,
               format,      {0, 0, width, height}};
      for (int y = 0; y < height; ++y) {
        for (int x = 0; x < width; ++x) StoreFakePixel(world, x, y, {1, 0, 0, 0});
      }
    }
    // The middle of what was drawn within `reach` of a place, in pixels whose centres are whole
    // numbers; every channel counts.
    std::pair<double, double> MiddleAround(double x, double y, int reach) const {
      double sum = 0, sum_x = 0, sum_y = 0;
      for (int v = int(y) - reach; v <= int(y) + reach + 1; ++v) {
        for (int u = int(x) - reach; u <= int(x) + reach + 1; ++u) {
          if (u < 0 || v < 0 || u >= world.width || v >= world.height) continue;
          const FakePixel p = LoadFakePixel(world, u, v);
          const double drawn = p.r + p.g + p.b;
          sum += drawn;
          sum_x += drawn * u;
          sum_y += drawn * v;
        }
      }
      EXPECT_GT(sum, 0) << x << " " << y;
      return {sum_x / sum, sum_y / sum};
    }
    std::vector<float> data;
    HX_World world{};
  };

  std::vector<std::int32_t> Tracks(const boost::shared_ptr<const ScreenPoints>& points) {
    std::vector<std::int32_t> tracks;
    for (const ScreenPoint& point : *points) tracks.push_back(point.track);
    return tracks;
  }
  void Draw(Picture& picture, const TrackIds& selected = {}, const TrackIds& hovered = {}) {
    TestEffect effect(Context());
    AnalysisUIData(effect).Draw(selected, hovered, picture.world);
  }
};

TEST_F(AnalysisUIDataTest, PointsAreTheLiveCellsOfTheFrame) {
  TestEffect effect(Context());
  const AnalysisUIData first(effect);
  EXPECT_EQ(first.frame(), 0);
  EXPECT_EQ(first.analysis(), State()->source_identity);
  EXPECT_THAT(Tracks(first.points()), ElementsAre(0, 1, 5));
  EXPECT_EQ(first.points()->at(0).x, 20.25f);
  EXPECT_EQ(first.points()->at(0).y, 15.5f);
  EXPECT_EQ(first.points()->at(0).goes_on, 1);
  EXPECT_EQ(first.points()->at(1).goes_on, 0);
  host_.in.current_time = 1;
  const AnalysisUIData second(effect);
  EXPECT_EQ(second.frame(), 1);
  EXPECT_THAT(Tracks(second.points()), ElementsAre(0, 3, 5));
  EXPECT_EQ(second.points()->at(0).goes_on, 0) << "there is no next frame";

  // Frames on either side of the analysed ones, and no analysis.
  for (const int start : {9, 12}) {
    host_.in.current_time = 0;
    layer_.start = start;
    AnalysisUIData outside(effect);
    EXPECT_EQ(outside.frame(), -1);
    EXPECT_THAT(*outside.points(), IsEmpty());
    Picture picture(160, 120);
    const std::vector<float> before = picture.data;
    outside.Draw({}, {}, picture.world);
    EXPECT_EQ(picture.data, before);
    EXPECT_THAT(host_.invalidated, IsEmpty());
  }
  State()->all_features = {};
  EXPECT_THAT(*AnalysisUIData(effect).points(), IsEmpty());
  EXPECT_TRUE(AnalysisUIData(effect).analysis().IsNil());
}

TEST_F(AnalysisUIDataTest, DotsLieOnTheirFeaturesAtEveryScaleAndAspect) {
  for (const std::int32_t aspect : {1, 2}) {
    host_.in.pixel_aspect = {aspect, 1};
    for (const std::uint32_t half : {1u, 2u}) {
      host_.in.downsample_x = host_.in.downsample_y = {1, half};
      Picture whole(160 / half, 120 / half);
      Draw(whole);
      // A pixel of the half picture covers two: its centre n is at 2 n + 1/2.
      const auto scaled = [&](double at) { return (at + 0.5) / half - 0.5; };
      for (const auto& [x, y] : {std::pair{20.25, 15.5}, {100.0, 80.0}}) {
        const auto [found_x, found_y] = whole.MiddleAround(scaled(x), scaled(y), half == 1 ? 7 : 3);
        EXPECT_NEAR(found_x, scaled(x), 0.05) << half;
        EXPECT_NEAR(found_y, scaled(y), 0.05) << half;
      }
      // A part of a larger output, from (10, 6) on.
      Picture part(30, 20);
      part.world.origin_x = 10;
      part.world.origin_y = 6;
      Draw(part);
      for (int y = 0; y < 20; ++y) {
        for (int x = 0; x < 30; ++x) {
          const FakePixel a = LoadFakePixel(part.world, x, y);
          const FakePixel b = LoadFakePixel(whole.world, x + 10, y + 6);
          ASSERT_EQ(a.r, b.r) << x << " " << y;
          ASSERT_EQ(a.g, b.g);
        }
      }
    }
  }
}

TEST_F(AnalysisUIDataTest, DepthsShowTheSameAndTheHostLearnsWhatChanged) {
  Picture exact(160, 120, HX_FORMAT_ARGBF);
  Draw(exact);
  for (const std::uint32_t format : {HX_FORMAT_ARGB8, HX_FORMAT_ARGB16}) {
    Picture picture(160, 120, format);
    Draw(picture);
    for (int y = 0; y < 120; ++y) {
      for (int x = 0; x < 160; ++x) {
        const FakePixel a = LoadFakePixel(picture.world, x, y);
        const FakePixel b = LoadFakePixel(exact.world, x, y);
        ASSERT_NEAR(a.r, b.r, 0.003);
        ASSERT_NEAR(a.b, b.b, 0.003);
        ASSERT_EQ(a.a, 1);
      }
    }
  }
  ASSERT_EQ(host_.invalidated.size(), 3u);
  const HX_Rect changed = host_.invalidated.back();
  for (int y = 0; y < 120; ++y) {
    for (int x = 0; x < 160; ++x) {
      const bool inside =
          x >= changed.left && x < changed.right && y >= changed.top && y < changed.bottom;
      ASSERT_TRUE(inside || LoadFakePixel(exact.world, x, y).r == 0) << x << " " << y;
    }
  }
  EXPECT_GT(changed.left, 10);
  EXPECT_LT(changed.bottom, 90);

  (*State()->all_features.features)[0] = {-1e9f, 3e7f, 1, 0};
  Draw(exact);
  EXPECT_EQ(host_.invalidated.back().left, -20000);
  EXPECT_EQ(host_.invalidated.back().bottom, 20000);
  for (int n = 1; n < 40; ++n) {
    host_.ForgetOperations();
    host_.FailOperation(n);
    bool failed = false;
    try {
      Draw(exact);
    } catch (std::int32_t) {
      failed = true;
    }
    if (host_.operations().size() < std::size_t(n)) return;
    const std::string& name = host_.operations()[std::size_t(n) - 1].name;
    if (name == "transfer" || name == "World.NewWorld" || name == "hls_to_rgb") {
      EXPECT_TRUE(failed) << name;
    }
  }
  FAIL() << "no end of host calls";
}

// Over black: the middle has the fill, the ring at 1.1 units of 3 pixels an opaque line.
TEST_F(AnalysisUIDataTest, ColoursTellTracksAndWhatTheMouseIsAbout) {
  *State()->all_features.features = {{20, 15, 1, 0},  {100, 80, 1, 0}, {60, 60, 1, 0},
                                     {50, 10, -1, 0}, {0, 0, -1, 0},   {0, 0, -1, 0},
                                     {31, 27, 0, 0},  {110, 90, 0, 0}, {70, 65, 0, 0},
                                     {50, 10, -1, 0}, {0, 0, -1, 0},   {0, 0, -1, 0}};
  const kelp::effect::HostContext context = Context();
  TrackPalette palette(context);
  const auto expect_at = [&](const Picture& picture, int x, int y, const TrackColors& colors) {
    const FakePixel middle = LoadFakePixel(picture.world, x, y);
    EXPECT_NEAR(middle.r, colors.fill.red * colors.fill.alpha, 0.01);
    EXPECT_NEAR(middle.g, colors.fill.green * colors.fill.alpha, 0.01);
    EXPECT_NEAR(middle.b, colors.fill.blue * colors.fill.alpha, 0.01);
    if (colors.line.alpha < 1) return;
    const FakePixel ring = LoadFakePixel(picture.world, x, y - 3);
    EXPECT_NEAR(ring.r, colors.line.red, 0.01);
    EXPECT_NEAR(ring.g, colors.line.green, 0.01);
    EXPECT_NEAR(ring.b, colors.line.blue, 0.01);
  };
  Picture first(160, 120), second(160, 120);
  Draw(first);
  host_.in.current_time = 1;
  Draw(second);
  expect_at(first, 20, 15, palette.ColorsOf(0, false, false));
  expect_at(second, 31, 27, palette.ColorsOf(0, false, false));
  expect_at(first, 100, 80, palette.ColorsOf(1, false, false));
  expect_at(second, 110, 90, palette.ColorsOf(1, false, false));

  Picture hot(160, 120);
  Draw(hot, {0, 2, 77}, {1, 2});
  expect_at(hot, 31, 27, palette.ColorsOf(0, true, false));
  expect_at(hot, 110, 90, palette.ColorsOf(1, false, true));
  expect_at(hot, 70, 65, palette.ColorsOf(2, true, true));
}

TEST_F(AnalysisUIDataTest, PointsUnderTheMouseComeNearestFirst) {
  host_.in.pixel_aspect = {2, 1};
  TestEffect effect(Context());
  AnalysisUIData data(effect);
  // On the screen of square pixels: 100.5 * 2, 80.5 and 99.5 * 2, 66.5.
  EXPECT_THAT(Tracks(data.PointsUnder(201, 81, 0.6)), ElementsAre(1));
  EXPECT_THAT(Tracks(data.PointsUnder(200, 76, 10)), ElementsAre(1, 5));
  EXPECT_THAT(Tracks(data.PointsUnder(200, 72, 10)), ElementsAre(5, 1));
  EXPECT_THAT(*data.PointsUnder(100, 80, 10), IsEmpty());

  TestEffect::log.overlay_scale = 0.5;
  const AnalysisUIData smaller(effect);
  EXPECT_TRUE(data.EqualsWithUpdate(smaller));
  EXPECT_EQ(data.overlay_scale(), 0.5);
  EXPECT_THAT(Tracks(data.PointsUnder(100.5, 40.25, 0.1)), ElementsAre(1));
  host_.in.current_time = 1;
  EXPECT_FALSE(data.EqualsWithUpdate(AnalysisUIData(effect)));
  host_.in.current_time = 0;
  host_.in.pixel_aspect = {1, 1};
  EXPECT_FALSE(data.EqualsWithUpdate(AnalysisUIData(effect)));
  host_.in.pixel_aspect = {2, 1};
  host_.in.height = 121;
  EXPECT_FALSE(data.EqualsWithUpdate(AnalysisUIData(effect)));
}

}  // namespace
}  // namespace kelp::analysis::effect
