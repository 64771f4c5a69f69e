#include "analysis/effect/analysis_ui_data.h"

#include <gmock/gmock.h>

#include <limits>

#include "analysis/effect/track_colors.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/support/frame_difference.h"
#include "tests/support/hosted_effect.h"

namespace kelp::analysis::effect {
namespace {

using calmframe::host::ChannelAt;
using calmframe::host::Difference;
using calmframe::host::HostedEffect;
using calmframe::host::Operations;
using calmframe::host::WorldBuffer;
using kelp::effect::StabilizerEffect;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr float kNaN = std::numeric_limits<float>::quiet_NaN();

// Two analysed frames, 10 and 11 of the clip, in 160 x 120.
class AnalysisUIDataTest : public ::testing::Test {
 protected:
  // Of floats, clear at first.
  struct Picture : WorldBuffer {
    Picture(int width, int height) : WorldBuffer(width, height, HX_FORMAT_ARGBF) {}
  };
  using Cells = marrow::tracking::TrackCells;
  using Look = std::function<void(StabilizerEffect& effect, HX_InData& in)>;

  void SetUp() override {
    hosted_.Place(10, 2);
    ASSERT_EQ(hosted_.Analyse(), 8);
  }
  // In a call of the host's, at the first frame, with these cells of both frames.
  void WithCells(const Cells& cells, const Look& look) {
    hosted_.Inside([&](StabilizerEffect& effect) {
      marrow::tracking::AllFeatures table;
      table.first_frame = 10;
      table.frame_count = 2;
      table.feature_count = static_cast<std::int32_t>(cells.size() / 2);
      *table.features = cells;
      KeepTable(*effect.GetState(), table);
      look(effect, *effect.context().in);
      KeepTable(*effect.GetState(), {});
    });
  }
  void WithPoints(const Look& look) {
    const Cells cells = {{20.25f, 15.5f, 1, 0}, {100, 80, 1, 0},     {60, 60, -10, 0},
                         {50, 10, -1, 0},       {kNaN, 10, 0, 0},    {99, 66, 1, 0},
                         {22.25f, 14.5f, 0, 0}, {101, 80.5f, -2, 0}, {61, 60, -11, 0},
                         {50, 10, 2, 0},        {9, kNaN, 0, 0},     {99, 67, 0, 0}};
    WithCells(cells, look);
  }

  // What was drawn over nothing, at a pixel: a channel of its own colours, none outside.
  static double Drawn(const WorldBuffer& picture, int x, int y, int channel) {
    const HX_Rect all = picture.rect();
    if (x < all.left || y < all.top || x >= all.right || y >= all.bottom) return 0;
    return ChannelAt(picture, x, y, channel) * ChannelAt(picture, x, y, 0);
  }
  // The middle of what was drawn within `reach` of a place, in pixels whose centres are whole
  // numbers.
  static std::pair<double, double> MiddleAround(const WorldBuffer& picture, double x, double y,
                                                int reach) {
    double sum = 0, sum_x = 0, sum_y = 0;
    for (int v = int(y) - reach; v <= int(y) + reach + 1; ++v) {
      for (int u = int(x) - reach; u <= int(x) + reach + 1; ++u) {
        const double drawn = Drawn(picture, u, v, 0);
        sum += drawn;
        sum_x += drawn * u;
        sum_y += drawn * v;
      }
    }
    EXPECT_GT(sum, 0) << x << " " << y;
    return {sum_x / sum, sum_y / sum};
  }
  static std::vector<std::int32_t> Tracks(const boost::shared_ptr<const ScreenPoints>& points) {
    std::vector<std::int32_t> tracks;
    for (const ScreenPoint& point : *points) tracks.push_back(point.track);
    return tracks;
  }
  static void Draw(StabilizerEffect& effect, WorldBuffer& picture, const TrackIds& selected = {},
                   const TrackIds& hovered = {}) {
    AnalysisUIData(effect).Draw(selected, hovered, picture.world());
  }
  calmframe::host::UserInterface& windows() { return hosted_.host().user_interface(); }

  HostedEffect hosted_{calmframe::host::ShakyClip{160, 120, 13, "user interface"}};
};

TEST_F(AnalysisUIDataTest, PointsAreTheLiveCellsOfTheFrame) {
  WithPoints([](StabilizerEffect& effect, HX_InData& in) {
    const AnalysisUIData first(effect);
    EXPECT_EQ(first.frame(), 0);
    EXPECT_THAT(Tracks(first.points()), ElementsAre(0, 1, 5));
    EXPECT_EQ(first.points()->at(0).x, 20.25f);
    EXPECT_EQ(first.points()->at(0).y, 15.5f);
    EXPECT_EQ(first.points()->at(0).goes_on, 1);
    EXPECT_EQ(first.points()->at(1).goes_on, 0);
    in.current_time = in.time_step;
    const AnalysisUIData second(effect);
    EXPECT_EQ(second.frame(), 1);
    EXPECT_EQ(second.analysis(), first.analysis());
    EXPECT_FALSE(first.analysis().IsNil());
    EXPECT_THAT(Tracks(second.points()), ElementsAre(0, 3, 5));
    EXPECT_EQ(second.points()->at(0).goes_on, 0) << "there is no next frame";
  });
  // Frames on either side of the analysed ones, and no analysis.
  for (const int start : {9, 12}) {
    hosted_.Place(start, 1);
    WithPoints([this](StabilizerEffect& effect, HX_InData&) {
      EXPECT_EQ(AnalysisUIData(effect).frame(), -1);
      Picture picture(160, 120);
      Draw(effect, picture);
      EXPECT_EQ(Drawn(picture, 20, 15, 0), 0);
      EXPECT_EQ(windows().invalidations(), 0u);
    });
  }
  WithCells({}, [](StabilizerEffect& effect, HX_InData&) {
    KeepTable(*effect.GetState(), {});
    EXPECT_THAT(*AnalysisUIData(effect).points(), IsEmpty());
    EXPECT_TRUE(AnalysisUIData(effect).analysis().IsNil());
  });
}

TEST_F(AnalysisUIDataTest, DotsLieOnTheirFeaturesAtEveryScaleAndAspect) {
  WithPoints([](StabilizerEffect& effect, HX_InData& in) {
    for (const std::int32_t aspect : {1, 2}) {
      in.pixel_aspect = {aspect, 1};
      for (const std::uint32_t half : {1u, 2u}) {
        in.downsample_x = in.downsample_y = {1, half};
        Picture whole(160 / half, 120 / half);
        Draw(effect, whole);
        // A pixel of the half picture covers two: its centre n is at 2 n + 1/2.
        const auto scaled = [&](double at) { return (at + 0.5) / half - 0.5; };
        for (const auto& [x, y] : {std::pair{20.25, 15.5}, {100.0, 80.0}}) {
          const auto [found_x, found_y] =
              MiddleAround(whole, scaled(x), scaled(y), half == 1 ? 7 : 3);
          EXPECT_NEAR(found_x, scaled(x), 0.05) << half;
          EXPECT_NEAR(found_y, scaled(y), 0.05) << half;
        }
        // A part of a larger output.
        Picture part(30, 20), cut(30, 20);
        part.world().origin_x = 10;
        part.world().origin_y = 6;
        Draw(effect, part);
        const HX_Rect rect = part.rect();
        calmframe::host::CopyWorld(whole.world(), cut.world(), &rect, nullptr);
        EXPECT_EQ(Difference(part, cut), 0) << half;
      }
    }
  });
}

// That depths show the same is asked of whole renders.
TEST_F(AnalysisUIDataTest, TheHostLearnsWhatChanged) {
  WithPoints([this](StabilizerEffect& effect, HX_InData&) {
    Picture picture(160, 120);
    Draw(effect, picture);
    ASSERT_EQ(windows().invalidations(), 1u);
    const HX_Rect changed = windows().last_invalidated();
    for (int y = 0; y < 120; ++y) {
      for (int x = 0; x < 160; ++x) {
        if (Drawn(picture, x, y, 0) == 0) continue;
        ASSERT_TRUE(x >= changed.left && x < changed.right) << x << " " << y;
        ASSERT_TRUE(y >= changed.top && y < changed.bottom) << x << " " << y;
      }
    }
    EXPECT_GT(changed.left, 10);
    EXPECT_LT(changed.bottom, 90);
    for (const char* name : {"transfer", "World.NewWorld", "hls_to_rgb"}) {
      Operations::Get().FailNth(1, name);
      EXPECT_THROW(Draw(effect, picture), std::int32_t) << name;
    }
    Operations::Get().FailNone();
    (*TableOf(*effect.GetState()).features)[0] = {-1e9f, 3e7f, 1, 0};
    Draw(effect, picture);
    EXPECT_EQ(windows().last_invalidated().left, -20000);
    EXPECT_EQ(windows().last_invalidated().bottom, 20000);
  });
}

// Over black: the middle has the fill, the ring at 1.1 units of 3 pixels an opaque line.
TEST_F(AnalysisUIDataTest, ColoursTellTracksAndWhatTheMouseIsAbout) {
  const Cells cells = {{20, 15, 1, 0}, {100, 80, 1, 0}, {60, 60, 1, 0},
                       {31, 27, 0, 0}, {110, 90, 0, 0}, {70, 65, 0, 0}};
  WithCells(cells, [](StabilizerEffect& effect, HX_InData& in) {
    TrackPalette palette(effect.context());
    const auto expect_at = [&](const WorldBuffer& picture, int x, int y,
                               const TrackColors& colors) {
      const auto &fill = colors.fill, &line = colors.line;
      const float fills[] = {fill.red, fill.green, fill.blue},
                  lines[] = {line.red, line.green, line.blue};
      for (int channel = 0; channel < 3; ++channel) {
        EXPECT_NEAR(Drawn(picture, x, y, 1 + channel), fills[channel] * fill.alpha, 0.01);
        if (line.alpha < 1) continue;
        EXPECT_NEAR(ChannelAt(picture, x, y - 3, 1 + channel), lines[channel], 0.01);
      }
    };
    Picture first(160, 120), second(160, 120), hot(160, 120);
    Draw(effect, first);
    in.current_time = in.time_step;
    Draw(effect, second);
    expect_at(first, 20, 15, palette.ColorsOf(0, false, false));
    expect_at(second, 31, 27, palette.ColorsOf(0, false, false));
    expect_at(first, 100, 80, palette.ColorsOf(1, false, false));
    expect_at(second, 110, 90, palette.ColorsOf(1, false, false));
    Draw(effect, hot, {0, 2, 77}, {1, 2});
    expect_at(hot, 31, 27, palette.ColorsOf(0, true, false));
    expect_at(hot, 110, 90, palette.ColorsOf(1, false, true));
    expect_at(hot, 70, 65, palette.ColorsOf(2, true, true));
  });
}

TEST_F(AnalysisUIDataTest, PointsUnderTheMouseComeNearestFirst) {
  WithPoints([](StabilizerEffect& effect, HX_InData& in) {
    in.pixel_aspect = {2, 1};
    AnalysisUIData data(effect);
    // On the screen of square pixels: 100.5 * 2, 80.5 and 99.5 * 2, 66.5.
    EXPECT_THAT(Tracks(data.PointsUnder(201, 81, 0.6)), ElementsAre(1));
    EXPECT_THAT(Tracks(data.PointsUnder(200, 76, 10)), ElementsAre(1, 5));
    EXPECT_THAT(Tracks(data.PointsUnder(200, 72, 10)), ElementsAre(5, 1));
    EXPECT_THAT(*data.PointsUnder(100, 80, 10), IsEmpty());

    EXPECT_TRUE(data.EqualsWithUpdate(AnalysisUIData(effect)));
    in.current_time = in.time_step;
    EXPECT_FALSE(data.EqualsWithUpdate(AnalysisUIData(effect)));
    in.current_time = 0;
    in.pixel_aspect = {1, 1};
    EXPECT_FALSE(data.EqualsWithUpdate(AnalysisUIData(effect)));
    in.pixel_aspect = {2, 1};
    ++in.height;
    EXPECT_FALSE(data.EqualsWithUpdate(AnalysisUIData(effect)));
  });
}

}  // namespace
}  // namespace kelp::analysis::effect
