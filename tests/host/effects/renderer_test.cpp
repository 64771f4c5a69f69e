#include "host/effects/renderer.h"

#include <gtest/gtest.h>

#include <cmath>
#include <thread>
#include <vector>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "tests/host/effects/drawn_clip.h"
#include "tests/host/effects/probe.h"

namespace calmframe::host {
namespace {

using namespace probe;

// Red, green and blue of a pixel in 255ths; -1 where it is clear.
std::vector<int> At(const WorldBuffer& buffer, int x, int y) {
  const double full = buffer.world().format == HX_FORMAT_ARGB16  ? 32768
                      : buffer.world().format == HX_FORMAT_ARGBF ? 1
                                                                 : 255;
  std::vector<double> channels;
  for (int c = 0; c < 4; ++c) {
    channels.push_back(full == 255   ? buffer.row<std::uint8_t>(y)[x * 4 + c]
                       : full == 1.0 ? buffer.row<float>(y)[x * 4 + c]
                                     : buffer.row<std::uint16_t>(y)[x * 4 + c]);
  }
  if (channels[0] == 0) return {-1, -1, -1};
  EXPECT_EQ(channels[0], full);
  std::vector<int> rgb;
  for (int c = 1; c < 4; ++c) {
    rgb.push_back(static_cast<int>(std::lround(channels[c] / full * 255)));
  }
  return rgb;
}

class RendererTest : public testing::Test {
 protected:
  RendererTest() : host_(PROBE_PLUGIN), session_(host_), effect_(session_.Apply(MakeDrawnLayer())) {
    host_.worlds().SetRowPadding(8);
  }
  void TearDown() override {
    session_.Remove(effect_);
    host_.Stop();
    EXPECT_EQ(host_.LeakReport(), "");
  }

  Host host_;
  Session session_;
  Effect& effect_;
};

TEST_F(RendererTest, BothPathsDrawTheFrameAtEachDepth) {
  const auto renderer = effect_.MakeRenderer();
  ASSERT_TRUE(renderer->result().ok());
  for (const int depth : {8, 16, 32}) {
    const RenderRequest request{3, depth};
    const RenderedFrame planned = renderer->Planned(request);
    ASSERT_TRUE(planned.pixels) << depth;
    EXPECT_EQ(planned.pixels->world().width, kClipWidth);
    EXPECT_EQ(planned.pixels->world().row_bytes, kClipWidth * depth / 2 + 8);
    EXPECT_EQ(At(*planned.pixels, 32, 19), (std::vector<int>{60, 32, 19}));
    EXPECT_EQ(effect_.shared()->PolygonOf(3), (std::vector<float>{0, 0, 33, 20}));
    const RenderedFrame direct = renderer->Direct(request);
    if (depth == 32) {
      EXPECT_FALSE(direct.result.ok());
    } else {
      ASSERT_TRUE(direct.pixels) << direct.full_rect.right << " " << direct.layer_width << " "
                                 << direct.full_rect.bottom;
      EXPECT_EQ(At(*direct.pixels, 32, 19), (std::vector<int>{60, 32, 19}));
    }
  }
  EXPECT_FALSE(renderer->Planned({0, 24}).result.ok());
}

TEST_F(RendererTest, AGrownOutputLiesAroundTheLayer) {
  effect_.SetParam(kMode, kGrown);
  const auto renderer = effect_.MakeRenderer();
  for (const bool direct : {true, false}) {
    const RenderRequest request{2};
    const RenderedFrame grown = direct ? renderer->Direct(request) : renderer->Planned(request);
    ASSERT_TRUE(grown.pixels);
    EXPECT_EQ(grown.full_rect.left, -kMargin);
    EXPECT_EQ(grown.full_rect.bottom, kClipHeight + kMargin);
    EXPECT_EQ(grown.pixels->world().origin_y, -kMargin);
    EXPECT_EQ(At(*grown.pixels, 0, 0), (std::vector<int>{-1, -1, -1}));
    EXPECT_EQ(At(*grown.pixels, kMargin + 5, kMargin + 6), (std::vector<int>{40, 5, 6}));
    const auto frame = grown.OnLayer();
    EXPECT_EQ(frame->world().width, kClipWidth);
    EXPECT_EQ(At(*frame, 5, 6), (std::vector<int>{40, 5, 6}));
  }
}

TEST_F(RendererTest, APartComesAtItsPlace) {
  const auto renderer = effect_.MakeRenderer();
  RenderRequest request{4};
  request.part = HX_Rect{10, -3, 14, 2};
  for (const bool direct : {true, false}) {
    const RenderedFrame part = direct ? renderer->Direct(request) : renderer->Planned(request);
    ASSERT_TRUE(part.pixels);
    EXPECT_EQ(part.pixels->world().origin_x, 10);
    EXPECT_EQ(part.pixels->world().origin_y, 0);
    EXPECT_EQ(part.pixels->world().width, 4);
    EXPECT_EQ(part.pixels->world().height, 2);
    EXPECT_EQ(At(*part.pixels, 3, 1), (std::vector<int>{80, 13, 1}));
    EXPECT_EQ(part.full_rect.right, kClipWidth);
  }
  request.part = HX_Rect{50, 0, 60, 10};
  EXPECT_TRUE(renderer->Planned(request).result.ok());
  EXPECT_FALSE(renderer->Planned(request).pixels);
}

TEST_F(RendererTest, HalfResolutionAveragesAndRoundsUp) {
  const auto renderer = effect_.MakeRenderer();
  RenderRequest request{1, 16, {1, 2}};
  for (const bool direct : {true, false}) {
    const RenderedFrame half = direct ? renderer->Direct(request) : renderer->Planned(request);
    ASSERT_TRUE(half.pixels);
    EXPECT_EQ(half.pixels->world().width, 17);
    EXPECT_EQ(half.pixels->world().height, 10);
    // Rows 8 and 9, and about columns 2 and 3, of a 255th each.
    EXPECT_NEAR(half.pixels->row<HX_Pixel16>(4)[1].blue, 8.5 / 255 * 32768, 2);
    EXPECT_EQ(half.layer_width, 17);
  }
}

TEST_F(RendererTest, FramesBesideAndPastTheEnd) {
  effect_.SetParam(kMode, kNeighbours);
  const auto renderer = effect_.MakeRenderer();
  EXPECT_EQ(At(*renderer->Planned({5}).pixels, 7, 7), (std::vector<int>{100, 7, 7}));
  // The neighbour isn't there: its order succeeds, its pixels are an error.
  EXPECT_EQ(renderer->Planned({kClipFrames - 1}).result.code, HX_ERR_UNKNOWN);
  EXPECT_EQ(renderer->Planned({0}).result.code, HX_ERR_UNKNOWN);
  effect_.SetParam(kMode, kPlain);
  const RenderedFrame past = renderer->Planned({kClipFrames});
  EXPECT_TRUE(past.result.ok());
  EXPECT_FALSE(past.pixels);
  EXPECT_EQ(At(*past.OnLayer(), 3, 3), (std::vector<int>{-1, -1, -1}));
  EXPECT_EQ(At(*renderer->Direct({kClipFrames}).pixels, 3, 3), (std::vector<int>{-1, -1, -1}));
  // The layer begins later in the media.
  effect_.shared()->layer()->Change([](LayerState& layer) { layer.start_frame = 6; });
  EXPECT_EQ(At(*renderer->Planned({1}).pixels, 0, 1), (std::vector<int>{140, 0, 1}));
}

TEST_F(RendererTest, RenderersWorkAtOnceWhileTheEffectTicksAndSaves) {
  std::vector<std::thread> threads;
  for (int t = 0; t < 3; ++t) {
    threads.emplace_back([this, t] {
      const auto renderer = effect_.MakeRenderer();
      for (int i = 0; i < 40; ++i) {
        const int frame = (i + t) % kClipFrames;
        const RenderedFrame rendered =
            i % 2 ? renderer->Direct({frame}) : renderer->Planned({frame, 8, {1, 2}});
        EXPECT_TRUE(rendered.pixels);
        EXPECT_EQ(At(*rendered.OnLayer(), 2, 2)[0], frame * 20);
      }
    });
  }
  SavedEffect saved;
  for (int i = 0; i < 40; ++i) {
    effect_.Press(kStart);
    effect_.SetParam(kMode, i % 2 ? kPlain : kGrown);
    session_.Tick();
    EXPECT_TRUE(effect_.Save(&saved).ok());
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
}  // namespace calmframe::host
