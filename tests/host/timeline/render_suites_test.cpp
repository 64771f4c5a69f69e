#include <atomic>
#include <map>
#include <mutex>
#include <random>
#include <thread>

#include "platform/tessel/threads.h"
#include "tests/host/timeline/timeline_fixture.h"

namespace calmframe::host {
namespace {

using tessel::threads::CompletionEvent;
using tessel::utility::Guid;

constexpr std::int64_t kFrame = 28224000;  // ticks at 25 frames a second

// What a request's callback saw.
struct Delivery {
  const HX_CutPixSuite1* frames = nullptr;
  HX_Frame frame = -1;
  int calls = 0;
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

class RenderSuitesTest : public TimelineTest {
 protected:
  static HX_RenderParams Params(int width = 6, int height = 4, int field_selection = 0) {
    static const std::uint32_t formats[] = {HX_FORMAT_BGRA8, HX_FORMAT_ARGB8, HX_FORMAT_ARGBF};
    return {formats, 3, width, height, 16, 15, 3, 0, field_selection, 3};
  }

  // The frame, or 0; the caller disposes of it.
  HX_Frame Render(HX_Node node, std::int64_t ticks, const HX_RenderParams& params = Params()) {
    Delivery delivery;
    std::int32_t id = 0;
    EXPECT_EQ(renders.RenderAsync(node, ticks, kFrame, &params, Delivery::Callback, &delivery, &id),
              HX_ERR_NONE);
    EXPECT_GT(id, 0);
    delivery.arrived.Wait();
    EXPECT_NE(delivery.thread, std::this_thread::get_id());
    return delivery.frame;
  }

  std::string Identifier(HX_Node node, std::int64_t ticks,
                         const HX_RenderParams& params = Params()) {
    HX_String text = nullptr;
    EXPECT_EQ(renders.MakeIdentifier(node, ticks, kFrame, params.width, params.height, 16, 15,
                                     &params, &text),
              HX_ERR_NONE);
    return Take(text);
  }
  static HX_Guid GuidOf(const std::string& text) {
    HX_Guid guid;
    const auto bytes = Guid::FromText(text).bytes();
    std::copy(bytes.begin(), bytes.end(), guid.bytes);
    return guid;
  }
  bool Cached(const HX_Guid& identifier) {
    HX_Frame frame = -1;
    EXPECT_EQ(cache.Lookup(&identifier, &frame), HX_ERR_NONE);
    if (frame == 0) return false;
    EXPECT_EQ(frames.Dispose(frame), HX_ERR_NONE);
    return true;
  }

  // Pixel (x, y) from the top, however the frame lies in memory.
  HX_Pixel8 At(HX_Frame frame, int x, int y) {
    std::uint8_t* pixels = nullptr;
    std::int32_t row_bytes = 0, width = 0, height = 0;
    std::uint32_t format = 0;
    EXPECT_EQ(frames.GetPixels(frame, &pixels), HX_ERR_NONE);
    EXPECT_EQ(frames.GetRowBytes(frame, &row_bytes), HX_ERR_NONE);
    EXPECT_EQ(frames.GetPixelFormat(frame, &format), HX_ERR_NONE);
    EXPECT_EQ(frames.GetSize(frame, &width, &height), HX_ERR_NONE);
    EXPECT_EQ(format & ~HX_FORMAT_TOP_DOWN, HX_FORMAT_ARGB8);
    const int row = format & HX_FORMAT_TOP_DOWN ? y : height - 1 - y;
    return reinterpret_cast<const HX_Pixel8*>(pixels + std::ptrdiff_t{row_bytes} * row)[x];
  }
  // Red of (x, y) and green of one frame, which then goes.
  std::pair<int, int> Sample(HX_Frame frame, int x, int y) {
    if (frame == 0) return {-1, -1};
    const HX_Pixel8 pixel = At(frame, x, y);
    EXPECT_EQ(frames.Dispose(frame), HX_ERR_NONE);
    return {pixel.red, pixel.green};
  }
};

TEST_F(RenderSuitesTest, AFrameIsDeliveredByItsTimeAndCachedByItsName) {
  const HX_Node node = InputNode();
  EXPECT_EQ(Sample(Render(node, 3 * kFrame), 5, 2), std::pair(25, 3));
  EXPECT_EQ(Sample(Render(node, 4 * kFrame - 1), 5, 2), std::pair(25, 3));
  EXPECT_EQ(Sample(Render(node, 19 * kFrame), 0, 3), std::pair(30, 19));
  EXPECT_TRUE(Cached(GuidOf(Identifier(node, 3 * kFrame))));
  EXPECT_FALSE(Cached(GuidOf(Identifier(node, 5 * kFrame))));
  // Past either end of the media there is none.
  EXPECT_EQ(Render(node, 20 * kFrame), 0);
  EXPECT_EQ(Render(node, -1), 0);
  EXPECT_FALSE(Cached(GuidOf(Identifier(node, 20 * kFrame))));
  EXPECT_EQ(services.failure(), "");
  graph.ReleaseNode(node);
}

TEST_F(RenderSuitesTest, NamesAreEqualForEqualFramesAlone) {
  const HX_Node node = InputNode();
  std::map<std::string, std::string> names;
  const auto name = [&](const char* what, const std::string& identifier) {
    EXPECT_TRUE(names.emplace(identifier, what).second) << what << " is " << names[identifier];
  };
  HX_RenderParams other_format = Params();
  const std::uint32_t deep[] = {HX_FORMAT_ARGB16};
  other_format.formats = deep;
  other_format.format_count = 1;
  name("frame 1", Identifier(node, kFrame));
  name("frame 2", Identifier(node, 2 * kFrame));
  name("half size", Identifier(node, kFrame, Params(3, 2)));
  name("16 bits", Identifier(node, kFrame, other_format));
  EXPECT_EQ(Identifier(node, kFrame, Params(6, 4, 1)), Identifier(node, kFrame))
      << "a progressive frame has no fields";
  layer->Change([](LayerState& state) { state.field_type = HX_FIELD_FIRST_ORDER; });
  const HX_Node fields = InputNode();
  EXPECT_EQ(Identifier(fields, kFrame), Identifier(node, kFrame));
  name("first field", Identifier(fields, kFrame, Params(6, 4, 1)));
  name("second field", Identifier(fields, kFrame + kFrame / 2, Params(6, 4, 1)));
  layer->InsertEffect(0, {50, "Upstream", "", {}});
  const HX_Node upstream = InputNode();
  name("behind an effect", Identifier(upstream, kFrame));
  layer->InsertEffect(2, {60, "Downstream", "", {}});
  const HX_Node below = NodeBelow(2);
  EXPECT_EQ(names[Identifier(below, kFrame)], "behind an effect") << "what is downstream is none";
  for (const HX_Node one : {node, fields, upstream, below}) graph.ReleaseNode(one);
}

TEST_F(RenderSuitesTest, FieldsComeInTheOrderTheyWereShot) {
  const auto field = [&](std::int32_t order, std::int64_t ticks, int y) {
    layer->Change([&](LayerState& state) { state.field_type = order; });
    const HX_Node node = InputNode();
    const auto sample = Sample(Render(node, ticks, Params(6, 4, 1)), 1, y);
    graph.ReleaseNode(node);
    return sample;
  };
  // The top field is lines 0 and 2 of the frame, the other one lines 1 and 3.
  constexpr auto kFirst = HX_FIELD_FIRST_ORDER, kSecond = HX_FIELD_SECOND_ORDER;
  EXPECT_EQ(field(kFirst, 2 * kFrame, 0), std::pair(1, 2));
  EXPECT_EQ(field(kFirst, 2 * kFrame, 3), std::pair(21, 2));
  EXPECT_EQ(field(kFirst, 2 * kFrame + kFrame / 2, 0), std::pair(11, 2));
  EXPECT_EQ(field(kFirst, 2 * kFrame + kFrame / 2, 2), std::pair(21, 2));
  EXPECT_EQ(field(kSecond, 2 * kFrame, 0), std::pair(11, 2));
  EXPECT_EQ(field(kSecond, 2 * kFrame + kFrame / 2, 0), std::pair(1, 2));
  // Half of an odd duration, rounded up to a whole tick.
  layer->Change([](LayerState& state) { state.ticks_per_frame = 28224001; });
  EXPECT_EQ(field(kFirst, 14112001, 0), std::pair(11, 0));
  EXPECT_EQ(field(kFirst, 14112000, 0), std::pair(1, 0));
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
  const HX_Node top = NodeBelow(0), own = NodeBelow(1), input = NodeBelow(2);
  EXPECT_EQ(Sample(Render(input, kFrame), 0, 0), std::pair(26, 1));  // (2 * 0 + 11) * 2 + 4
  EXPECT_EQ(Sample(Render(own, kFrame), 0, 0), std::pair(26, 1)) << "the effect draws nothing";
  EXPECT_EQ(Sample(Render(top, kFrame), 0, 0), std::pair(153, 1));
  for (const HX_Node one : {top, own, input}) graph.ReleaseNode(one);
  InputRequest request;
  request.time_ticks = kFrame;
  EXPECT_EQ(services.Input(effect, request)->row<HX_Pixel8>(0)[0].red, 26);
}

TEST_F(RenderSuitesTest, AFrameAskedForOftenIsMadeOnce) {
  std::atomic<int> drawn = 0;
  std::atomic<bool> hold = true;
  layer->InsertEffect(0, {50, "Counted", "", [&](std::int64_t, Picture&) {
                            ++drawn;
                            while (hold) std::this_thread::yield();
                          }});
  const HX_Node node = InputNode();
  const HX_RenderParams params = Params();
  Delivery deliveries[5];
  for (Delivery& delivery : deliveries) {
    std::int32_t id = 0;
    renders.RenderAsync(node, kFrame, kFrame, &params, Delivery::Callback, &delivery, &id);
  }
  while (drawn == 0) std::this_thread::yield();
  std::thread render([&] {
    InputRequest request;
    request.time_ticks = kFrame;
    EXPECT_TRUE(services.Input(effect, request));
  });
  hold = false;
  render.join();
  for (Delivery& delivery : deliveries) {
    delivery.arrived.Wait();
    EXPECT_EQ(Sample(delivery.frame, 1, 1), std::pair(11, 1));
  }
  EXPECT_EQ(drawn, 1);
  graph.ReleaseNode(node);
}

TEST_F(RenderSuitesTest, ReferencedPixelsOutliveTheirHandles) {
  services.SetCacheBytes(0);
  const HX_Node node = InputNode();
  const HX_Guid identifier = GuidOf(Identifier(node, kFrame));
  EXPECT_EQ(cache.Reference(&identifier), HX_ERR_NONE);
  const HX_Frame frame = Render(node, kFrame);
  std::uint8_t* pixels = nullptr;
  EXPECT_EQ(frames.GetPixels(frame, &pixels), HX_ERR_NONE);
  EXPECT_EQ(frames.Dispose(frame), HX_ERR_NONE);
  EXPECT_NE(frames.GetPixels(frame, &pixels), HX_ERR_NONE);
  Sample(Render(node, 2 * kFrame), 0, 0);
  EXPECT_TRUE(Cached(identifier));
  EXPECT_FALSE(Cached(GuidOf(Identifier(node, 2 * kFrame)))) << "nobody holds that one";
  EXPECT_EQ(pixels[1 + 4 * 3], 3);  // red of (3, 0)
  EXPECT_EQ(cache.Dereference(&identifier), HX_ERR_NONE);
  EXPECT_FALSE(Cached(identifier));
  graph.ReleaseNode(node);
}

TEST_F(RenderSuitesTest, InputIsScaledConvertedAndNullPastTheEnd) {
  InputRequest request;
  request.time_ticks = 2 * kFrame;
  request.kind = PixelKind::argbf;
  request.width = 3;
  request.height = 2;
  const PicturePtr half = services.Input(effect, request);
  ASSERT_TRUE(half);
  EXPECT_NEAR(half->row<HX_PixelFloat>(0)[0].red * 255, 5.5, 1e-4);  // of 0, 1, 10 and 11
  EXPECT_NEAR(half->row<HX_PixelFloat>(1)[2].red * 255, 29.5, 1e-4);
  EXPECT_EQ(services.Input(effect, request), half) << "from the cache";
  request.time_ticks = 20 * kFrame;
  EXPECT_FALSE(services.Input(effect, request));
  request.time_ticks = 0;
  EXPECT_FALSE(services.Input(nullptr, request));
  layer->RemoveEffect(kOwnId);
  EXPECT_FALSE(services.Input(effect, request));
}

TEST_F(RenderSuitesTest, LayoutsOfMemoryShowOnePicture) {
  const HX_Node node = InputNode();
  services.faults.bottom_up = true;
  services.faults.row_padding = 12;
  const HX_Frame frame = Render(node, kFrame);
  std::int32_t row_bytes = 0;
  std::uint32_t format = 0;
  frames.GetRowBytes(frame, &row_bytes);
  frames.GetPixelFormat(frame, &format);
  EXPECT_EQ(row_bytes, 36);
  EXPECT_EQ(format, HX_FORMAT_ARGB8);
  EXPECT_EQ(At(frame, 2, 0).red, 2);
  EXPECT_EQ(Sample(frame, 5, 3), std::pair(35, 1));
  InputRequest request;
  request.time_ticks = kFrame;
  const PicturePtr input = services.Input(effect, request);
  EXPECT_TRUE(input->top_down()) << "a render's frames are";
  EXPECT_EQ(input->row<HX_Pixel8>(3)[5].red, 35);
  graph.ReleaseNode(node);
}

TEST_F(RenderSuitesTest, FaultsAreAnsweredByCodesAndNullFrames) {
  const HX_Node node = InputNode();
  const HX_RenderParams params = Params();
  Delivery delivery;
  std::int32_t id = 77;
  const auto start = [&](const HX_RenderParams* with, HX_Node from) {
    return renders.RenderAsync(from, 0, kFrame, with, Delivery::Callback, &delivery, &id);
  };
  services.faults.render_refused = true;
  EXPECT_NE(start(&params, node), HX_ERR_NONE);
  services.faults.render_refused = false;
  services.faults.identifier_failed = true;
  HX_String text = nullptr;
  EXPECT_NE(renders.MakeIdentifier(node, 0, kFrame, 6, 4, 1, 1, &params, &text), HX_ERR_NONE);
  services.faults.identifier_failed = false;
  const HX_RenderParams empty = Params(0, 4);
  EXPECT_NE(start(&empty, node), HX_ERR_NONE);
  EXPECT_NE(renders.MakeIdentifier(node, 0, kFrame, 0, 4, 1, 1, &empty, &text), HX_ERR_NONE);
  HX_RenderParams strange = Params();
  strange.format_count = 1;
  EXPECT_NE(start(&strange, node), HX_ERR_NONE);
  EXPECT_NE(start(&params, node + 100), HX_ERR_NONE);
  EXPECT_NE(start(nullptr, node), HX_ERR_NONE);
  EXPECT_EQ(delivery.calls, 0);
  EXPECT_EQ(id, 77);

  services.faults.null_frame = true;
  EXPECT_EQ(Render(node, 0), 0);
  EXPECT_FALSE(Cached(GuidOf(Identifier(node, 0))));
  services.faults.null_frame = false;
  services.faults.early_callback = true;
  EXPECT_EQ(start(&params, node), HX_ERR_NONE);
  EXPECT_EQ(delivery.calls, 1) << "before the call returned";
  EXPECT_EQ(Sample(delivery.frame, 1, 0), std::pair(1, 0));
  graph.ReleaseNode(node);
}

TEST_F(RenderSuitesTest, AFrameThatCannotBeMadeIsNullAndTheFirstLineStays) {
  layer->InsertEffect(0, {50, "Breaks", "", [](std::int64_t frame, Picture&) {
                            throw std::runtime_error("line " + std::to_string(frame));
                          }});
  const HX_Node node = InputNode();
  EXPECT_EQ(Render(node, 3 * kFrame), 0);
  InputRequest request;
  EXPECT_FALSE(services.Input(effect, request));
  EXPECT_EQ(services.failure(), "line 3");
  const HX_RenderParams huge = Params(1 << 30, 1 << 30);
  EXPECT_EQ(Render(node, 0, huge), 0);
  graph.ReleaseNode(node);
}

TEST_F(RenderSuitesTest, ShutdownAnswersAllAndRefusesMore) {
  std::atomic<bool> hold = true;
  std::atomic<int> drawing = 0;
  layer->InsertEffect(0, {50, "Slow", "", [&](std::int64_t, Picture&) {
                            ++drawing;
                            while (hold) std::this_thread::yield();
                          }});
  const HX_Node node = InputNode();
  const HX_RenderParams params = Params();
  Delivery deliveries[6];
  std::int32_t ids[6];
  services.faults.late_callback_ms = 3600000;
  for (int i = 0; i < 6; ++i) {
    renders.RenderAsync(node, i * kFrame, kFrame, &params, Delivery::Callback, &deliveries[i],
                        &ids[i]);
  }
  while (drawing < 2) std::this_thread::yield();
  renders.Cancel(ids[4]);
  renders.Cancel(ids[0]);  // too late, it goes on
  std::thread closing([&] { services.Shutdown(); });
  // The threads go on with the others only now, and maybe closed.
  hold = false;
  closing.join();
  int delivered = 0;
  for (Delivery& delivery : deliveries) {
    EXPECT_EQ(delivery.calls, 1);
    if (delivery.frame != 0) {
      ++delivered;
      frames.Dispose(delivery.frame);
    }
  }
  EXPECT_EQ(deliveries[4].frame, 0);
  EXPECT_NE(deliveries[0].frame, 0);
  EXPECT_GE(delivered, 2);
  std::int32_t id = 0;
  EXPECT_NE(renders.RenderAsync(node, 0, kFrame, &params, Delivery::Callback, nullptr, &id),
            HX_ERR_NONE);
  graph.ReleaseNode(node);
  EXPECT_EQ(services.Input(effect, {})->width(), 6) << "renders of the host still work";
}

// A job's protocol on several threads: reference, request, wait or cancel, read, dereference; with
// the layer changing and the cache too small beside them.
TEST_F(RenderSuitesTest, JobsRequestCancelAndReadBesideChanges) {
  services.SetCacheBytes(500);  // five frames
  constexpr int kJobs = 3, kRounds = 150;
  std::vector<std::thread> jobs;
  std::atomic<int> read = 0;
  for (int job = 0; job < kJobs; ++job) {
    jobs.emplace_back([&, job] {
      std::mt19937 random(static_cast<unsigned>(job));
      const HX_RenderParams params = Params();
      for (int round = 0; round < kRounds; ++round) {
        const HX_Node node = InputNode();
        const int frame = static_cast<int>(random() % 22);
        const HX_Guid identifier = GuidOf(Identifier(node, frame * kFrame));
        cache.Reference(&identifier);
        Delivery delivery;
        std::int32_t id = 0;
        EXPECT_EQ(renders.RenderAsync(node, frame * kFrame, kFrame, &params, Delivery::Callback,
                                      &delivery, &id),
                  HX_ERR_NONE);
        const bool cancels = random() % 3 == 0;
        if (cancels) renders.Cancel(id);
        graph.ReleaseNode(node);
        delivery.arrived.Wait();
        EXPECT_TRUE(cancels || (delivery.frame != 0) == (frame < 20));
        if (delivery.frame != 0) {
          frames.Dispose(delivery.frame);
          HX_Frame cached = 0;
          cache.Lookup(&identifier, &cached);
          EXPECT_NE(cached, 0);
          EXPECT_EQ(Sample(cached, 2, 1), std::pair(12, frame));
          ++read;
        }
        cache.Dereference(&identifier);
      }
    });
  }
  for (int i = 0; i < 200; ++i) {
    layer->SetParameters(kOwnId, std::to_string(i));
    if (i % 20 == 0) layer->InsertEffect(0, {50, "Upstream", std::to_string(i), {}});
    InputRequest request;
    request.time_ticks = i % 20 * kFrame;
    const PicturePtr input = services.Input(effect, request);
    ASSERT_TRUE(input);
    EXPECT_EQ(input->row<HX_Pixel8>(0)[0].green, i % 20);
    if (i % 20 == 19) layer->RemoveEffect(50);
  }
  for (std::thread& job : jobs) job.join();
  EXPECT_GT(read, kJobs * kRounds / 3);
}

}  // namespace
}  // namespace calmframe::host
