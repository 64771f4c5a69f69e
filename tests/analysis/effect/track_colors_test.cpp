#include "analysis/effect/track_colors.h"

#include <gtest/gtest.h>

#include <map>

#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/support/hosted_effect.h"

namespace kelp::analysis::effect {
namespace {

using calmframe::host::HostedEffect;
using calmframe::host::Operations;

TEST(TrackColorsTest, HuesLeaveTheYellowsFreeAndAreAllInUse) {
  // 997 n / 12 modulo 300, moved by 60 when above 30.
  constexpr double hues[] = {0,      143.08, 226.17, 309.25, 92.33,  175.42,
                             258.50, 341.58, 124.67, 207.75, 290.83, 13.92};
  for (int number = 0; number < kTrackHues; ++number) {
    EXPECT_NEAR(TrackHue(number), hues[number], 0.01) << number;
  }
  std::map<int, int> uses;
  for (std::int32_t id = 0; id < 2400; ++id) ++uses[TrackHueNumber(id)];
  EXPECT_EQ(uses.size(), 12u);
  for (const auto& [number, count] : uses) EXPECT_NEAR(count, 200, 49) << number;
  // What a project's user has seen once: 48271 (9301 id mod 2^32) mod (2^31 - 1), mod 12.
  EXPECT_EQ(TrackHueNumber(1), 48271ll * 9301 % 2147483647 % 12);
  EXPECT_EQ(TrackHueNumber(2000), 48271ll * 9301 * 2000 % 2147483647 % 12);
}

TEST(TrackColorsTest, LineAndFillByWhatTheMouseIsAbout) {
  HostedEffect hosted(calmframe::host::SmallClip());
  hosted.Apply();
  std::int32_t red = 0;
  while (TrackHueNumber(red) != 0) ++red;
  hosted.Inside([red](kelp::effect::StabilizerEffect& effect) {
    TrackPalette palette(effect.context());
    const auto expect = [&](bool selected, bool hovered, const tesselui::drawbot::Color& line,
                            const tesselui::drawbot::Color& fill) {
      const TrackColors colors = palette.ColorsOf(red, selected, hovered);
      for (const auto& [is, should] : {std::pair{colors.line, line}, {colors.fill, fill}}) {
        EXPECT_NEAR(is.red, should.red, 0.002);
        EXPECT_NEAR(is.green, should.green, 0.002);
        EXPECT_NEAR(is.blue, should.blue, 0.002);
        EXPECT_FLOAT_EQ(is.alpha, should.alpha);
      }
    };
    expect(false, false, {1, 0.4f, 0.4f, 1}, {0.6f, 0.24f, 0.24f, 0.65f});
    expect(false, true, {0.6f, 0.24f, 0.24f, 0.65f}, {1, 1, 1, 0.75f});
    expect(true, false, {1, 1, 0.4f, 0.75f}, {1, 1, 0.7f, 0.75f});
    expect(true, true, {1, 1, 0.7f, 0.75f}, {1, 1, 1, 0.75f});
    const auto asked = HostedEffect::OperationsOf([&] {
      for (std::int32_t id = 0; id < 100; ++id) palette.ColorsOf(id, false, false);
    });
    EXPECT_EQ(asked.size(), 11u) << "each hue once";
    Operations::Get().FailNth(1);
    TrackPalette fresh(effect.context());
    EXPECT_THROW(fresh.ColorsOf(1, false, false), std::int32_t);
    Operations::Get().FailNone();
  });
}

}  // namespace
}  // namespace kelp::analysis::effect
