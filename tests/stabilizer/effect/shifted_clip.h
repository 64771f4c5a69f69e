#pragma once

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cstdint>
#include <cstring>
#include <functional>
#include <optional>
#include <utility>
#include <vector>

#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/support/hosted_effect.h"
#include "tests/support/shifting_warper.h"

namespace calmframe::host {

using Colour = std::function<HX_PixelFloat(std::int64_t frame, int x, int y)>;

// Column x of the clip has red x / 100, row y green y / 100, frame f blue f / 16.
inline HX_PixelFloat Ramp(std::int64_t frame, int x, int y) {
  return {1.0f, static_cast<float>(x) / 100, static_cast<float>(y) / 100,
          static_cast<float>(frame) / 16};
}

// A clip of 64 x 48 that was solved as the test says: it came out of a project.
class ShiftedClipTest : public ::testing::Test {
 protected:
  static constexpr int kWidth = 64, kHeight = 48;
  using Values = std::vector<std::pair<std::int32_t, double>>;
  using Shifts = std::vector<marrow::stabilization::point2>;

  // One frame a shift; a map of that radius. The controls' values are those that it is solved for.
  void Solve(const Shifts& shifts, const Values& controls, std::int32_t map_radius = 0,
             const Colour& colour = Ramp) {
    Load(kelp::effect::ShiftingWarper(kWidth, kHeight, shifts, map_radius), controls, colour);
  }
  void Load(const boost::shared_ptr<const marrow::stabilization::CPWarper>& warper,
            const Values& controls, const Colour& colour = Ramp,
            const std::function<void(kelp::effect::SavedState& state)>& change = {}) {
    const SourceInfo info{.width = kWidth,
                          .height = kHeight,
                          .frame_count = warper->frameCount(),
                          .content = tessel::utility::Guid::MakeUnique()};
    hosted_.emplace(MakeDrawnSource(info, [colour](std::int64_t frame, Picture& picture) {
      FillPicture(picture, [&](int x, int y) { return colour(frame, x, y); });
    }));
    hosted_->Apply();
    for (const auto& [index, value] : controls) hosted_->Set(index, value);
    ASSERT_EQ(hosted_->Settle(), 8);
    hosted_->Open(hosted_->Altered(hosted_->Save(), [&](kelp::effect::SavedState& state) {
      KeepWarps(state, warper);
      KeepCrop(state, {});
      if (change) change(state);
    }));
    ASSERT_TRUE(hosted_->effect().creation().ok());
    ASSERT_EQ(hosted_->Status(), 8);
  }

  // All that there is to show, of a frame of the layer.
  static RenderRequest Whole(std::int64_t frame, int depth = 8, std::uint32_t half = 1) {
    return {frame, depth, {1, half}, HX_Rect{-100, -100, 200, 200}};
  }
  std::shared_ptr<WorldBuffer> Draw(const RenderRequest& request, Path path = Path::planned) {
    const RenderedFrame frame = hosted_->Render(request, path);
    EXPECT_TRUE(frame.result.ok()) << frame.result.Line("frame");
    EXPECT_TRUE(frame.pixels);
    return frame.pixels;
  }
  // Both paths where both know the depth, which have to give the same; the planned one's.
  std::shared_ptr<WorldBuffer> DrawBoth(const RenderRequest& request) {
    const auto planned = Draw(request);
    if (request.bit_depth < 32) {
      EXPECT_TRUE(Same(*planned, *Draw(request, Path::direct)));
    }
    return planned;
  }
  static bool Same(const WorldBuffer& a, const WorldBuffer& b) {
    bool same = Sides(a.rect()) == Sides(b.rect());
    for (int y = 0; same && y < a.world().height; ++y) {
      same = std::memcmp(a.row<char>(y), b.row<char>(y),
                         a.world().width * BytesPerPixel(a.world().format)) == 0;
    }
    return same;
  }
  // By places of the layer: the source's column and row that are shown there.
  static void ExpectShown(const WorldBuffer& pixels, int x, int y, double column, double row) {
    const double tolerance = pixels.world().format == HX_FORMAT_ARGB8 ? 0.4 : 2e-3;
    EXPECT_NEAR(100 * ChannelAt(pixels, x, y, 1), column, tolerance) << x << ", " << y;
    EXPECT_NEAR(100 * ChannelAt(pixels, x, y, 2), row, tolerance) << x << ", " << y;
    EXPECT_NEAR(ChannelAt(pixels, x, y, 0), 1, tolerance);
  }
  static std::vector<int> Sides(const HX_Rect& rect) {
    return {rect.left, rect.top, rect.right, rect.bottom};
  }
  // Frames that the plan of a render orders.
  std::size_t OrdersOf(std::int64_t frame) {
    const auto names = HostedEffect::OperationsOf([&] { Draw(Whole(frame)); });
    return static_cast<std::size_t>(std::count(names.begin(), names.end(), "plan.checkout_layer"));
  }
  HostedEffect& hosted() { return *hosted_; }

 private:
  std::optional<HostedEffect> hosted_;
};

}  // namespace calmframe::host
