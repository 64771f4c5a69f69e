#include <atomic>
#include <map>
#include <thread>

#include "platform/tessel/threads.h"
#include "tests/host/timeline/timeline_fixture.h"

namespace calmframe::host {
namespace {

using tessel::threads::CompletionEvent;
using tessel::utility::Guid;

// What a request's callback saw.
struct Delivery {
  HX_Frame frame = -1;
  int calls = 0;
  std::int32_t id = 77;
  std::thread::id thread;
  CompletionEvent arrived;

  static void Callback(HX_Frame frame, void* record) {
    auto* const delivery = static_cast<Delivery*>(record);
    delivery->frame = frame;
    delivery->thread = std::this_thread::get_id();
    ++delivery->calls;
    delivery->arrived.Signal();
  }
};

// An effect's drawing, which waits in each frame until it is let go.
struct Gate {
  std::atomic<int> drawn = 0;
  CompletionEvent reached, open;
  EffectOperator Effect() {
    return {50, "Gate", "", [this](std::int64_t, Picture&) {
              if (++drawn == wanted) reached.Signal();
              open.Wait();
            }};
  }
  int wanted = 1;  // at once, before it is reached
};

class RenderSuitesTest : public TimelineTest {
 protected:
  using RedAndGreen = std::pair<int, int>;

  static HX_RenderParams Params(int width = 6, int height = 4, int field_selection = 0) {
    static const std::uint32_t formats[] = {HX_FORMAT_BGRA8, HX_FORMAT_ARGB8, HX_FORMAT_ARGBF};
    return {formats, 3, width, height, 16, 15, 3, 0, field_selection, 3};
  }

  HX_Err Ask(HX_Node node, std::int64_t ticks, Delivery& delivery,
             const HX_RenderParams& params = Params()) {
    return renders.RenderAsync(node, ticks, kFrame, &params, Delivery::Callback, &delivery,
                               &delivery.id);
  }
  // The frame, or 0; the caller disposes of it.
  HX_Frame Render(HX_Node node, std::int64_t ticks, const HX_RenderParams& params = Params()) {
    Delivery delivery;
    EXPECT_EQ(Ask(node, ticks, delivery, params), HX_ERR_NONE);
    EXPECT_GT(delivery.id, 0);
    delivery.arrived.Wait();
    EXPECT_NE(delivery.thread, std::this_thread::get_id());
    return delivery.frame;
  }
  RedAndGreen Shown(HX_Node node, std::int64_t ticks, int x, int y,
                    const HX_RenderParams& params = Params()) {
    return Sample(Render(node, ticks, params), x, y);
  }
  PicturePtr Input(std::int64_t frame, PixelKind kind = PixelKind::argb8, int width = 0,
                   int height = 0) {
    return services.Input(
        effect, {.time_ticks = frame * kFrame, .kind = kind, .width = width, .height = height});
  }

  std::string Identifier(HX_Node node, std::int64_t ticks,
                         const HX_RenderParams& params = Params()) {
    HX_String text = nullptr;
    EXPECT_EQ(renders.MakeIdentifier(node, ticks, kFrame, params.width, params.height, 16, 15,
                                     &params, &text),
              HX_ERR_NONE);
    return Take(text);
  }
  HX_Guid GuidAt(HX_Node node, std::int64_t ticks) {
    HX_Guid guid;
    const auto bytes = Guid::FromText(Identifier(node, ticks)).bytes();
    std::copy(bytes.begin(), bytes.end(), guid.bytes);
    return guid;
  }
  bool Cached(const HX_Guid& identifier) {
    HX_Frame frame = -1;
    EXPECT_EQ(cache.Lookup(&identifier, &frame), HX_ERR_NONE);
    return frame != 0 && frames.Dispose(frame) == HX_ERR_NONE;
  }

  // Pixel (x, y) from the top, however the frame lies in memory; the frame then goes.
  RedAndGreen Sample(HX_Frame frame, int x, int y) {
    if (frame == 0) return {-1, -1};
    std::uint8_t* pixels = nullptr;
    std::int32_t row_bytes = 0, width = 0, height = 0;
    std::uint32_t format = 0;
    EXPECT_EQ(frames.GetPixels(frame, &pixels), HX_ERR_NONE);
    EXPECT_EQ(frames.GetRowBytes(frame, &row_bytes), HX_ERR_NONE);
    EXPECT_EQ(frames.GetPixelFormat(frame, &format), HX_ERR_NONE);
    EXPECT_EQ(frames.GetSize(frame, &width, &height), HX_ERR_NONE);
    EXPECT_EQ(format & ~HX_FORMAT_TOP_DOWN, HX_FORMAT_ARGB8);
    EXPECT_EQ(row_bytes, 4 * width + services.faults.row_padding);
    const int row = format & HX_FORMAT_TOP_DOWN ? y : height - 1 - y;
    const auto* at = pixels + std::ptrdiff_t{row_bytes} * row + 4 * x;
    const RedAndGreen sample(at[1], at[2]);
    EXPECT_EQ(frames.Dispose(frame), HX_ERR_NONE);
    return sample;
  }
};

TEST_F(RenderSuitesTest, AFrameIsDeliveredByItsTimeAndCachedByItsName) {
  services.faults.bottom_up = true;
  services.faults.row_padding = 12;
  const Node node = InputNode();
  const struct {
    std::int64_t ticks;
    RedAndGreen shown;  // past either end of the media there is nothing
  } cases[] = {{3 * kFrame, {25, 3}},
               {4 * kFrame - 1, {25, 3}},
               {19 * kFrame, {25, 19}},
               {20 * kFrame, {-1, -1}},
               {-1, {-1, -1}}};
  for (const auto& c : cases) {
    EXPECT_EQ(Shown(node, c.ticks, 5, 2), c.shown) << c.ticks;
    EXPECT_EQ(Cached(GuidAt(node, c.ticks)), c.shown.first >= 0) << c.ticks;
  }
  EXPECT_FALSE(Cached(GuidAt(node, 5 * kFrame)));
  EXPECT_TRUE(Input(3)->top_down()) << "a render's frames are";
  EXPECT_EQ(Input(3)->row<HX_Pixel8>(2)[5].red, 25);
  EXPECT_EQ(services.failure(), "");
}

TEST_F(RenderSuitesTest, NamesAreEqualForEqualFramesAlone) {
  std::map<std::string, std::string> names;
  const auto name = [&](const char* what, const std::string& identifier) {
    EXPECT_TRUE(names.emplace(identifier, what).second) << what << " is " << names[identifier];
  };
  HX_RenderParams other_format = Params();
  const std::uint32_t deep[] = {HX_FORMAT_ARGB16};
  other_format.formats = deep;
  other_format.format_count = 1;
  const Node node = InputNode();
  const std::string first = Identifier(node, kFrame);
  name("frame 1", first);
  name("frame 2", Identifier(node, 2 * kFrame));
  name("half size", Identifier(node, kFrame, Params(3, 2)));
  name("half height", Identifier(node, kFrame, Params(6, 2)));
  name("16 bits", Identifier(node, kFrame, other_format));
  EXPECT_EQ(Identifier(node, kFrame, Params(6, 4, 1)), first) << "progressive, without fields";
  layer->Change([](LayerState& state) { state.field_type = HX_FIELD_FIRST_ORDER; });
  const Node fields = InputNode();
  EXPECT_EQ(Identifier(fields, kFrame), first);
  name("first field", Identifier(fields, kFrame, Params(6, 4, 1)));
  name("second field", Identifier(fields, kFrame + kFrame / 2, Params(6, 4, 1)));
  layer->InsertEffect(0, {50, "Upstream", "", {}});
  name("behind an effect", Identifier(InputNode(), kFrame));
  layer->InsertEffect(2, {60, "Downstream", "", {}});
  EXPECT_EQ(names[Identifier(NodeBelow(2), kFrame)], "behind an effect");
}

TEST_F(RenderSuitesTest, FieldsComeInTheOrderTheyWereShot) {
  // The top field is lines 0 and 2 of the frame, the other one lines 1 and 3.
  constexpr auto kFirst = HX_FIELD_FIRST_ORDER, kSecond = HX_FIELD_SECOND_ORDER;
  constexpr std::int64_t kOdd = 28224001;  // half of it is rounded up to a whole tick
  const struct {
    std::int32_t order;
    std::int64_t ticks_per_frame, ticks;
    int y, red;
  } cases[] = {{kFirst, kFrame, 2 * kFrame, 0, 1},
               {kFirst, kFrame, 2 * kFrame, 3, 21},
               {kFirst, kFrame, 2 * kFrame + kFrame / 2, 0, 11},
               {kFirst, kFrame, 2 * kFrame + kFrame / 2, 2, 21},
               {kSecond, kFrame, 2 * kFrame, 0, 11},
               {kSecond, kFrame, 2 * kFrame + kFrame / 2, 0, 1},
               {kFirst, kOdd, 2 * kOdd + 14112000, 0, 1},
               {kFirst, kOdd, 2 * kOdd + 14112001, 0, 11}};
  for (const auto& c : cases) {
    layer->Change([&](LayerState& state) {
      state.field_type = c.order;
      state.ticks_per_frame = c.ticks_per_frame;
    });
    EXPECT_EQ(Shown(InputNode(), c.ticks, 1, c.y, Params(6, 4, 1)), RedAndGreen(c.red, 2))
        << c.order << " " << c.ticks << " " << c.y;
  }
}

TEST_F(RenderSuitesTest, EffectsBeneathAreDrawnAndThoseAboveAreNot) {
  const auto adds = [](int amount) {
    return [amount](std::int64_t frame, Picture& picture) {
      auto& red = picture.row<HX_Pixel8>(0)[0].red;
      red = static_cast<std::uint8_t>(2 * red + amount + static_cast<int>(frame));
    };
  };
  layer->InsertEffect(0, {50, "First", "", adds(10)});
  layer->InsertEffect(1, {51, "Second", "", adds(3)});
  layer->InsertEffect(3, {60, "Downstream", "", adds(100)});
  EXPECT_EQ(Shown(NodeBelow(2), kFrame, 0, 0), RedAndGreen(26, 1));  // (2 * 0 + 11) * 2 + 4
  EXPECT_EQ(Shown(NodeBelow(1), kFrame, 0, 0), RedAndGreen(26, 1)) << "the effect draws nothing";
  EXPECT_EQ(Shown(NodeBelow(0), kFrame, 0, 0), RedAndGreen(153, 1));
  EXPECT_EQ(Input(1)->row<HX_Pixel8>(0)[0].red, 26);
}

TEST_F(RenderSuitesTest, AFrameAskedForOftenIsMadeOnce) {
  Gate gate;
  layer->InsertEffect(0, gate.Effect());
  const Node node = InputNode();
  Delivery deliveries[5];
  for (Delivery& delivery : deliveries) Ask(node, kFrame, delivery);
  gate.reached.Wait();
  std::jthread render([&] { EXPECT_TRUE(Input(1)); });
  gate.open.Signal();
  render.join();
  for (Delivery& delivery : deliveries) {
    delivery.arrived.Wait();
    EXPECT_EQ(Sample(delivery.frame, 1, 1), RedAndGreen(11, 1));
  }
  EXPECT_EQ(gate.drawn, 1);
}

TEST_F(RenderSuitesTest, ReferencedPixelsOutliveTheirHandles) {
  services.SetCacheBytes(0);
  const Node node = InputNode();
  const HX_Guid identifier = GuidAt(node, kFrame);
  EXPECT_EQ(cache.Reference(&identifier), HX_ERR_NONE);
  const HX_Frame frame = Render(node, kFrame);
  std::uint8_t* pixels = nullptr;
  EXPECT_EQ(frames.GetPixels(frame, &pixels), HX_ERR_NONE);
  EXPECT_EQ(frames.Dispose(frame), HX_ERR_NONE);
  EXPECT_NE(frames.GetPixels(frame, &pixels), HX_ERR_NONE);
  EXPECT_TRUE(Cached(identifier));
  EXPECT_EQ(pixels[1 + 4 * 3], 3);  // red of (3, 0)
  EXPECT_EQ(cache.Dereference(&identifier), HX_ERR_NONE);
  EXPECT_FALSE(Cached(identifier));
}

// Equal media in two services of a process: each has its own frames, and its own failures.
TEST_F(RenderSuitesTest, AnotherServicesFramesAreNobodyElses) {
  const auto its_effect = reinterpret_cast<HX_EffectRef>(&services);
  const auto its_layer = boost::make_shared<Layer>(MakeDrawnSource(
      DrawnInfo(6, 4, 20), [](std::int64_t, Picture&) { throw std::runtime_error("its own"); }));
  its_layer->InsertEffect(0, {kOwnId, "Own", "", {}});
  auto other = std::make_unique<MediaServices>();
  other->AttachEffect(its_effect, its_layer, kOwnId);
  HX_Segments segments = 0;
  HX_Node top = 0, input = 0;
  ASSERT_EQ(sequence.AcquireSegments(its_effect, &segments), HX_ERR_NONE);
  ASSERT_EQ(graph.GetSegmentNodeAt(segments, 0, &top), HX_ERR_NONE);
  ASSERT_EQ(graph.GetInput(top, 0, &input), HX_ERR_NONE);
  EXPECT_EQ(sequence.ReleaseSegments(segments), HX_ERR_NONE);
  EXPECT_EQ(graph.ReleaseNode(top), HX_ERR_NONE);
  const Node own = InputNode(), its(graph, input);
  const HX_Guid identifier = GuidAt(own, kFrame), its_identifier = GuidAt(its, kFrame);
  EXPECT_EQ(Shown(own, kFrame, 3, 0), RedAndGreen(3, 1));
  EXPECT_EQ(Shown(its, kFrame, 3, 0), RedAndGreen(-1, -1));
  EXPECT_TRUE(Cached(identifier));
  EXPECT_FALSE(Cached(its_identifier));
  EXPECT_EQ(services.failure(), "");
  EXPECT_EQ(other->failure(), "its own");
  EXPECT_EQ(services.counts().delivered, 1u);
  EXPECT_EQ(other->counts().delivered, 0u);
  // A reference stands in the cache it is of, also when that is gone.
  EXPECT_EQ(cache.Reference(&its_identifier), HX_ERR_NONE);
  EXPECT_EQ(services.counts().references, 0u);
  MediaServices::DetachEffect(its_effect);
  other.reset();
  EXPECT_EQ(cache.Dereference(&its_identifier), HX_ERR_NONE);
  Delivery delivery;
  EXPECT_NE(Ask(its, kFrame, delivery), HX_ERR_NONE) << "closed, though its node is still lent";
}

TEST_F(RenderSuitesTest, InputIsScaledConvertedAndNullPastTheEnd) {
  const PicturePtr half = Input(2, PixelKind::argbf, 3, 2);
  ASSERT_TRUE(half);
  EXPECT_NEAR(half->row<HX_PixelFloat>(0)[0].red * 255, 5.5, 1e-4);  // of 0, 1, 10 and 11
  EXPECT_NEAR(half->row<HX_PixelFloat>(1)[2].red * 255, 29.5, 1e-4);
  EXPECT_EQ(Input(2, PixelKind::argbf, 3, 2), half) << "from the cache";
  EXPECT_FALSE(Input(20));
  EXPECT_FALSE(services.Input(nullptr, {}));
  layer->RemoveEffect(kOwnId);
  EXPECT_FALSE(Input(0));
}

TEST_F(RenderSuitesTest, WhatCannotBeRenderedIsRefusedOrNull) {
  const Node node = InputNode();
  HX_RenderParams strange = Params();
  strange.format_count = 1;
  Delivery delivery;
  HX_String text = nullptr;
  for (const HX_RenderParams& params : {Params(0, 4), Params(6, -1), strange}) {
    EXPECT_NE(Ask(node, 0, delivery, params), HX_ERR_NONE);
    EXPECT_NE(renders.MakeIdentifier(node, 0, kFrame, 6, 4, 1, 1, &params, &text), HX_ERR_NONE);
  }
  EXPECT_NE(Ask(node + 100, 0, delivery), HX_ERR_NONE);
  EXPECT_NE(renders.RenderAsync(node, 0, kFrame, nullptr, Delivery::Callback, &delivery, nullptr),
            HX_ERR_NONE);
  services.faults.render_refused = true;
  EXPECT_NE(Ask(node, 0, delivery), HX_ERR_NONE);
  services.faults.render_refused = false;
  EXPECT_EQ(delivery.calls, 0);
  EXPECT_EQ(delivery.id, 77);

  services.faults.early_callback = true;
  EXPECT_EQ(Ask(node, 0, delivery), HX_ERR_NONE);
  EXPECT_EQ(delivery.calls, 1) << "before the call returned";
  EXPECT_EQ(Sample(delivery.frame, 1, 0), RedAndGreen(1, 0));
  EXPECT_EQ(Render(node, 0, Params(1 << 30, 1 << 30)), 0);

  layer->InsertEffect(0, {50, "Breaks", "", [](std::int64_t frame, Picture&) {
                            throw std::runtime_error("line " + std::to_string(frame));
                          }});
  EXPECT_EQ(Render(InputNode(), 3 * kFrame), 0);
  EXPECT_FALSE(Input(0));
  EXPECT_EQ(services.failure(), "line 3") << "the first one stays";
}

TEST_F(RenderSuitesTest, ShutdownAnswersAllAndRefusesMore) {
  Gate gate;
  gate.wanted = 2;
  layer->InsertEffect(0, gate.Effect());
  const Node node = InputNode();
  Delivery deliveries[6], late;
  services.faults.late_callback_ms = 3600000;
  for (int i = 0; i < 6; ++i) Ask(node, i * kFrame, deliveries[i]);
  gate.reached.Wait();
  renders.Cancel(deliveries[4].id);
  renders.Cancel(deliveries[0].id);  // too late, it goes on
  std::jthread closing([&] { services.Shutdown(); });
  // The threads go on with the others only now, and maybe closed.
  gate.open.Signal();
  closing.join();
  for (int i = 0; i < 6; ++i) {
    EXPECT_EQ(deliveries[i].calls, 1);
    EXPECT_TRUE(i != 4 || deliveries[i].frame == 0);
    EXPECT_TRUE(i > 1 || deliveries[i].frame != 0);
    if (deliveries[i].frame != 0) frames.Dispose(deliveries[i].frame);
  }
  EXPECT_NE(Ask(node, 0, late), HX_ERR_NONE);
  EXPECT_EQ(Input(0)->width(), 6) << "renders of the host still work";
}

}  // namespace
}  // namespace calmframe::host
