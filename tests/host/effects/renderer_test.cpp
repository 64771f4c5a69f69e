#include "host/effects/renderer.h"

#include <array>
#include <cmath>

#include "host/pixels/world_operations.h"
#include "tests/host/effects/probe_test.h"

namespace calmframe::host {
namespace {

using Rgb = std::vector<int>;
const Rgb kClear = {-1, -1, -1};

std::array<int, 4> Sides(const HX_Rect& rect) {
  return {rect.left, rect.top, rect.right, rect.bottom};
}

// In 255ths.
Rgb At(const WorldBuffer& buffer, int x, int y) {
  WorldBuffer one(1, 1, HX_FORMAT_ARGBF);
  const HX_Rect place = {x, y, x + 1, y + 1};
  EXPECT_EQ(CopyWorld(buffer.world(), one.world(), &place, nullptr), 0);
  const HX_PixelFloat& pixel = *one.row<HX_PixelFloat>(0);
  if (pixel.alpha == 0) return kClear;
  EXPECT_EQ(pixel.alpha, 1);
  Rgb rgb;
  for (const float channel : {pixel.red, pixel.green, pixel.blue}) {
    rgb.push_back(static_cast<int>(std::lround(channel * 255)));
  }
  return rgb;
}

class RendererTest : public FrameProbe {
 protected:
  RendererTest() { Begin(); }
  void Begin() {
    Start();
    effect = &session->Apply(MakeDrawnLayer());
    renderer = effect->MakeRenderer();
  }
  void TearDown() override {
    renderer.reset();
    ProbeTest::TearDown();
  }

  RenderedFrame Render(bool direct, const RenderRequest& request) {
    return direct ? renderer->Direct(request) : renderer->Planned(request);
  }

  Effect* effect = nullptr;
  std::unique_ptr<Renderer> renderer;
};

TEST_F(RendererTest, BothPathsDrawWhatIsAskedForAtItsPlace) {
  ASSERT_TRUE(renderer->result().ok());
  const HX_Rect whole = {0, 0, kClipWidth, kClipHeight}, grown = {-4, -4, 27, 24};
  const RenderRequest part{4, 8, {1, 1}, HX_Rect{10, -3, 14, 2}};
  const struct {
    RenderRequest request;
    int margin, offset;
    HX_Rect lies;
    int x, y;  // in layer coordinates
    Rgb shown;
  } cases[] = {
      {{3}, 0, 0, whole, 22, 19, {212, 3, 7}},     {{3, 16}, 0, 0, whole, 22, 19, {212, 3, 7}},
      {{3, 32}, 0, 0, whole, 22, 19, {212, 3, 7}}, {{5}, 0, -1, whole, 7, 8, {87, 4, 7}},
      {{5}, 0, 1, whole, 7, 8, {87, 6, 7}},        {{2}, 4, 0, grown, 5, 6, {65, 2, 7}},
      {{2, 16}, 4, 0, grown, -4, -4, kClear},      {part, 0, 0, {10, 0, 14, 2}, 13, 1, {23, 4, 7}}};
  for (const auto& c : cases) {
    margin = c.margin;
    offset = c.offset;
    for (const bool direct : {true, false}) {
      SCOPED_TRACE(testing::Message() << &c - cases << direct);
      const RenderedFrame frame = Render(direct, c.request);
      if (direct && c.request.bit_depth == 32) {
        EXPECT_FALSE(frame.result.ok());
        continue;
      }
      ASSERT_TRUE(frame.pixels);
      EXPECT_EQ(frame.pixels->world().format, FormatOfDepth(c.request.bit_depth));
      EXPECT_EQ(Sides(frame.pixels->rect()), Sides(c.lies));
      EXPECT_EQ(Sides(frame.full_rect), Sides(c.margin > 0 ? grown : whole));
      EXPECT_EQ(At(*frame.pixels, c.x - c.lies.left, c.y - c.lies.top), c.shown);
      EXPECT_EQ(frame.OnLayer()->world().width, kClipWidth);
      if (c.x >= 0) {
        EXPECT_EQ(At(*frame.OnLayer(), c.x, c.y), c.shown);
      }
    }
  }
}

TEST_F(RendererTest, WhereThereIsNothingNothingComes) {
  for (const bool direct : {true, false}) {
    EXPECT_FALSE(Render(direct, {0, 24}).result.ok());
    EXPECT_FALSE(Render(direct, {0, 8, {2, 1}}).result.ok());
    const RenderedFrame beside = Render(direct, {4, 8, {1, 1}, HX_Rect{50, 0, 60, 10}});
    EXPECT_TRUE(beside.result.ok());
    EXPECT_FALSE(beside.pixels);
    const RenderedFrame past = Render(direct, {kClipFrames});
    EXPECT_TRUE(past.result.ok());
    EXPECT_EQ(At(*past.OnLayer(), 3, 3), kClear);
    for (const int past_its_end : {-1, 1}) {
      offset = past_its_end;
      EXPECT_EQ(Render(direct, {offset < 0 ? 0 : kClipFrames - 1}).result.code, HX_ERR_UNKNOWN);
    }
    offset = 0;
  }
}

TEST_F(RendererTest, HalfResolutionAveragesAndRoundsUp) {
  for (const bool direct : {true, false}) {
    const RenderedFrame half = Render(direct, {1, 16, {1, 2}});
    ASSERT_TRUE(half.pixels);
    EXPECT_EQ(Sides(half.pixels->rect()), Sides({0, 0, 12, 10}));
    // Of two columns and of rows 8 and 9.
    EXPECT_NEAR(half.pixels->row<HX_Pixel16>(4)[0].red, 85.5 / 255 * 32768, 4);
    EXPECT_EQ(half.layer_width, 12);
  }
}

// An interlaced layer's second field stands half a frame later.
TEST_F(RendererTest, EachFieldIsRenderedAtItsTimeOnALayerThatBeginsElsewhere) {
  effect->shared()->layer()->Change([](LayerState& layer) {
    layer.start_frame = 6;
    layer.field_type = HX_FIELD_FIRST_ORDER;
  });
  for (const bool direct : {true, false}) {
    for (const bool second : {false, true}) {
      RenderRequest request{1};
      request.second_field = second;
      // Lines 0 2 4 ..., or 1 3 5 ... with the nearest of them above.
      EXPECT_EQ(At(*Render(direct, request).pixels, 5, 0), (Rgb{second ? 15 : 5, 7, 7}));
    }
  }
}

// Whatever becomes of a parameter meanwhile, a render has the one that it began with.
TEST_F(RendererTest, ParametersStayAsTheyWereWhenTheRenderBegan) {
  TearDown();
  on[HX_CMD_DECLARE_PARAMS] = [](const Call& call) -> HX_Err {
    HX_ParamDef amount{20, HX_PARAM_FLOAT_SLIDER, "Amount", 0, 0, 0, {}};
    amount.u.fs.value = 5;
    call.out->num_params = 2;
    return call.cb().add_param(nullptr, -1, &amount);
  };
  std::vector<double> seen;
  on[HX_CMD_RENDER_FRAME] = on[HX_CMD_RENDER_PLANNED_FRAME] = [&](const Call& call) -> HX_Err {
    const HX_InData& in = *call.in;
    HX_ParamDef amount = *call.params[1];
    amount.u.fs.value += 1;
    const auto utils = call.Suite<HX_ParamUtilsSuite3>(HX_PARAM_UTILS_SUITE, 3);
    EXPECT_EQ(utils->SetParamValue(call.ref(), 1, &amount), HX_ERR_NONE);
    call.cb().checkout_param(call.ref(), 1, in.current_time, in.time_step, in.time_scale, &amount);
    seen.push_back(amount.u.fs.value);
    call.cb().checkin_param(call.ref(), &amount);
    return HX_ERR_NONE;
  };
  Begin();
  for (const bool direct : {true, false}) Render(direct, {1});
  EXPECT_EQ(seen, (std::vector<double>{5, 6}));
}

}  // namespace
}  // namespace calmframe::host
