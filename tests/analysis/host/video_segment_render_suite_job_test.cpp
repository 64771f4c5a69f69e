#include "analysis/host/video_segment_render_suite_job.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <atomic>
#include <boost/make_shared.hpp>
#include <functional>
#include <new>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "analysis/src/analysis.h"
#include "platform/tessel/config.h"
#include "platform/tessel/importer.h"
#include "tests/support/host_records.h"

namespace kelp {
namespace {

using analysis::JobState;
using analysis::RationalTime;
using calmframe::host::LayerState;
using calmframe::host::Operations;
using calmframe::host::Picture;
using tessel::threads::CompletionEvent;
using ::testing::ElementsAre;
using Job = VideoSegmentRenderSuiteJob;
using Body = std::function<void()>;

// What the tables that stand in for the host's do beside what those do.
struct Render {
  std::int64_t time, rate;
  HX_RenderParams params;
};
std::vector<Render> renders;
std::string changed_key, changed_value;  // a property of the media; absent for an empty value
enum { kNothing, kWidthOfFrames, kHeightOfFrames, kFormatOfFrames } wrong;
std::function<void()> on_lookup;

// A job over a clip of no length, whose body is the test's own.
class VideoSegmentRenderSuiteJobTest : public calmframe::host::HostRecords {
 protected:
  VideoSegmentRenderSuiteJobTest() : HostRecords([this](std::int64_t frame) { on_draw_(frame); }) {
    media().SetCacheBytes(0);
    media().faults.row_padding = 8;
  }
  ~VideoSegmentRenderSuiteJobTest() override {
    for (CompletionEvent& held : held_) held.Signal();
    End();
    media().Shutdown();  // frames may be drawn until then
  }

  // The job is gone, and its thread.
  void End() {
    job_.reset();
    tessel::threads::Shutdown();
  }
  void Make() {
    job_ = boost::make_shared<Job>(
        &in_, &out_, input_,
        boost::make_shared<analysis::Analysis>(marrow::tracking::SelectorParams(),
                                               marrow::tracking::TrackerParams()));
  }
  void Start(const Body& body) {
    Make();
    job_->AddRunFunction([body](analysis::Job&) { body(); });
    job_->Start(job_);
  }
  // The state that the body, in the background, ends in.
  JobState Run(const Body& body) {
    Start(body);
    tessel::threads::Shutdown();
    Operations::Get().FailNone();
    return job_->GetStatus().state;
  }
  void ExpectFailure(const Body& body, const char* text) {
    EXPECT_EQ(Run(body), JobState::Failed);
    EXPECT_EQ(job_->GetErrorText(), text);
  }
  // How often the body's whole run asks the host for an operation.
  std::ptrdiff_t Calls(const char* operation, const Body& body) {
    const auto names = hosted_.OperationsOf([&] { Run(body); });
    return std::count(names.begin(), names.end(), operation);
  }

  RationalTime At(int frame) const { return input_.StepTime * frame; }
  bool Request(int frame) { return job_->RequestFrame(At(frame), 0); }
  struct Frame {
    std::int32_t row_bytes;
    bool flipped;
    std::uint32_t format;
    const std::uint8_t* pixels;
  };
  Frame Get(int frame) {
    Frame f{};
    job_->GetFrame(At(frame), 0, &f.row_bytes, &f.flipped, &f.format, &f.pixels);
    return f;
  }
  void Fetch(int frame) {
    Request(frame);
    Get(frame);
  }

  analysis::JobInput input_ = {u"", {}, 0, {}, {}, {1, 25}};
  boost::shared_ptr<Job> job_;
  std::function<void(std::int64_t frame)> on_draw_ = [](std::int64_t) {};
  CompletionEvent held_[3];  // for on_draw_: draws go on
};

TEST_F(VideoSegmentRenderSuiteJobTest, AFrameThatSeveralAskForIsRenderedOnceAndReadInPlace) {
  const auto source = layer().state()->source->Fetch(4, calmframe::host::PixelKind::argb8);
  for (const bool early : {false, true}) {
    media().faults.early_callback = early;
    media().faults.bottom_up = early;
    const auto body = [&] {
      std::int32_t width = 0, height = 0;
      job_->GetFrameSize(&width, &height);
      EXPECT_EQ(width, kWidth);
      EXPECT_EQ(height, kHeight);
      for (int reader = 0; reader < 3; ++reader) Request(4);
      const Frame f = Get(4);
      EXPECT_TRUE(Request(4));  // in the cache by now
      EXPECT_EQ(f.row_bytes, kWidth * 4 + 8);
      EXPECT_EQ(f.flipped, early);
      const int row = early ? kHeight - 1 - 7 : 7;
      for (int x = 0; x < kWidth; ++x) {
        EXPECT_EQ(f.pixels[f.row_bytes * row + 4 * x + 1], source->row<HX_Pixel8>(7)[x].red);
      }
      for (int reader = 0; reader < 3; ++reader) job_->ReleaseFrame(At(4), 0);
      EXPECT_EQ(Get(4).pixels, f.pixels);  // the last reference is still there
    };
    EXPECT_EQ(Calls("Video Segment Render.RenderAsync", body), 1);
    EXPECT_EQ(job_->GetStatus().state, JobState::Finished);
  }
}

TEST_F(VideoSegmentRenderSuiteJobTest, RequestsTellTheHostTimesInTicksAndFields) {
  layer().Change([](LayerState& state) {
    state.ticks_per_frame = 23543520;  // of 30000/1001
    state.field_type = 1;
  });
  input_.StepTime = {1001, 30000};
  input_.FieldType = 1;
  Changed<HX_VideoSegmentRenderSuite3>().RenderAsync =
      [](HX_Node node, std::int64_t time, std::int64_t rate, const HX_RenderParams* params,
         HX_RenderCallback callback, void* record, std::int32_t* id) {
        renders.push_back({time, rate, *params});
        return kHosts<HX_VideoSegmentRenderSuite3>.RenderAsync(node, time, rate, params, callback,
                                                               record, id);
      };
  renders.clear();
  const auto body = [this] {
    job_->RequestFrame(input_.StepTime / 2 * 3, 0);
    job_->RequestFrame(At(1), 2);
  };
  EXPECT_EQ(Run(body), JobState::Finished);
  ASSERT_EQ(renders.size(), 2u);
  EXPECT_EQ(renders[0].time, 35315280);  // 1.5 * 23543520
  EXPECT_EQ(renders[0].rate, 23543520);
  EXPECT_EQ(renders[1].params.field_type, 2);
  EXPECT_EQ(renders[1].params.field_selection, 0);
  const HX_RenderParams& p = renders[0].params;
  EXPECT_THAT((std::vector<int>{p.format_count, p.width, p.height, p.par_num, p.par_den, p.quality,
                                p.field_type, p.field_selection, p.final_value}),
              ElementsAre(1, kWidth, kHeight, 16, 15, 3, 0, 1, 3));
}

// A frame comes behind the one that was asked for after it, and both when the job has looked for
// the first in vain.
TEST_F(VideoSegmentRenderSuiteJobTest, EachFrameIsWaitedForWhateverElseComes) {
  Changed<HX_CutPixCacheSuite5>().Lookup = [](const HX_Guid* identifier, HX_Frame* frame) {
    const HX_Err code = kHosts<HX_CutPixCacheSuite5>.Lookup(identifier, frame);
    on_lookup();
    return code;
  };
  static std::atomic<int> wanted, lookups;
  on_lookup = [this] {
    if (wanted < 0) return;
    ++lookups;
    held_[wanted].Signal();
  };
  on_draw_ = [this](std::int64_t frame) {
    const std::int64_t first = frame / 2 * 2;
    held_[first].Wait();
    while (frame == first && media().counts().requests > 1) std::this_thread::yield();
    // Who doesn't wait looks again now.
    for (int i = 0; i < 2000 && lookups < 2; ++i) std::this_thread::yield();
  };
  const auto body = [&] {
    for (const int frame : {0, 2}) {
      wanted = -1;
      lookups = 0;
      Request(frame);
      Request(frame + 1);
      wanted = frame;
      Get(frame);
    }
  };
  EXPECT_EQ(Run(body), JobState::Finished) << job_->GetErrorText();
}

TEST_F(VideoSegmentRenderSuiteJobTest, WhatIsStillWantedAtTheEndIsCancelledAndMayComeLate) {
  on_draw_ = [this](std::int64_t) { held_[0].Wait(); };
  const auto body = [&] {
    for (int frame = 0; frame < 3; ++frame) Request(frame);  // more than there are render threads
    EXPECT_TRUE(Request(1));                                 // on its way
  };
  EXPECT_EQ(Calls("Video Segment Render.Cancel", body), 3);
  EXPECT_EQ(job_->GetStatus().state, JobState::Finished);
  End();  // the callbacks come when the job is gone
}

// All that its next fetch asks for is there, and the host draws many frames meanwhile.
TEST_F(VideoSegmentRenderSuiteJobTest, RestsWhileTheHostPauses) {
  CompletionEvent begun, go_on, drawn;
  std::atomic<bool> fetched = false;
  on_draw_ = [&](std::int64_t frame) {
    if (frame == kFrames - 1) drawn.Signal();
  };
  Start([&] {
    Fetch(0);
    begun.Signal();
    go_on.Wait();
    for (int frame = 1; frame < kFrames; ++frame) Request(frame);
    Get(1);
    fetched = true;
    drawn.Wait();  // the end cancels what is not drawn
  });
  begun.Wait();
  tessel::importer::PauseBackgroundWork(true);
  go_on.Signal();
  drawn.Wait();
  EXPECT_FALSE(fetched);
  tessel::importer::PauseBackgroundWork(false);
  tessel::threads::Shutdown();
  EXPECT_TRUE(fetched);
  EXPECT_EQ(job_->GetStatus().state, JobState::Finished);
}

TEST_F(VideoSegmentRenderSuiteJobTest, TheHostIsToldOfEachFetchAndOfTheEnd) {
  constexpr char kNotice[] = "Private Effect.ForceRerender";
  EXPECT_EQ(Calls(kNotice, [] {}), 1);
  EXPECT_EQ(Calls(kNotice, [this] { Fetch(0); }), 2);
  EXPECT_EQ(Calls(kNotice, [] { throw std::bad_alloc(); }), 1);
  EXPECT_EQ(job_->GetStatus().state, JobState::Failed);
}

TEST_F(VideoSegmentRenderSuiteJobTest, EveryRefusalOfTheHostHasItsText) {
  const std::pair<const char*, const char*> refusals[] = {
      {"CutPix.GetPixels", Job::kNoFrame},
      {"CutPix.GetRowBytes", Job::kNoFrame},
      {"CutPix.GetPixelFormat", Job::kNoFrame},
      {"CutPix.GetSize", Job::kNoFrame},
      {"CutPix Cache.Lookup", Job::kNoFrame},
      {"CutPix Cache.Reference", Job::kUnknownError},
      {"Video Segment Render.RenderAsync", Job::kNoRender},
      {"Video Segment Render.MakeIdentifier", Job::kNoFrameIdentifier},
      {"String.GetUTF8", Job::kNoFrameIdentifier}};
  for (const auto& [operation, text] : refusals) {
    SCOPED_TRACE(operation);
    const auto body = [this, name = operation] {
      Operations::Get().FailAlways(name);
      Fetch(0);
    };
    ExpectFailure(body, text);
  }
  EXPECT_EQ(media().counts().nodes, 0u);  // the media's went with the run
}

TEST_F(VideoSegmentRenderSuiteJobTest, WithoutAFrameOfTheReadersSizeAndFormatTheJobFails) {
  const auto fetch = [this] { Fetch(0); };
  ExpectFailure([this] { Get(3); }, Job::kNoFrame);  // nobody asked for it: there is no wait
  for (const bool early : {false, true}) {
    media().faults.early_callback = early;
    media().faults.null_frame = true;
    ExpectFailure(fetch, Job::kNoFrame);
  }
  media().faults.null_frame = false;
  auto& table = Changed<HX_CutPixSuite1>();
  table.GetSize = [](HX_Frame, std::int32_t* width, std::int32_t* height) -> HX_Err {
    *width = kWidth - (wrong == kWidthOfFrames);
    *height = kHeight + (wrong == kHeightOfFrames);
    return HX_ERR_NONE;
  };
  table.GetPixelFormat = [](HX_Frame, std::uint32_t* format) -> HX_Err {
    *format = wrong == kFormatOfFrames ? HX_FORMAT_ARGB16 : HX_FORMAT_ARGB8;
    return HX_ERR_NONE;
  };
  for (const auto what : {kWidthOfFrames, kHeightOfFrames, kFormatOfFrames}) {
    wrong = what;
    ExpectFailure(fetch, Job::kNoFrame);
  }
  wrong = kNothing;
  EXPECT_EQ(Run(fetch), JobState::Finished);
}

TEST_F(VideoSegmentRenderSuiteJobTest, MediaWithoutASizeIsNotBegun) {
  Changed<HX_StringSuite1>();
  Changed<HX_VideoSegmentSuite5>().GetProperty = [](HX_Node node, const char* key,
                                                    HX_String* text) -> HX_Err {
    if (key != changed_key) return kHosts<HX_VideoSegmentSuite5>.GetProperty(node, key, text);
    if (changed_value.empty()) return HX_ERR_UNKNOWN;
    return kHosts<HX_StringSuite1>.MakeFromUTF8(changed_value.c_str(), text);
  };
  const std::pair<const char*, const char*> properties[] = {
      {HX_PROPERTY_STREAM_WIDTH, ""},    {HX_PROPERTY_STREAM_HEIGHT, ""},
      {HX_PROPERTY_STREAM_PAR_NUM, ""},  {HX_PROPERTY_STREAM_PAR_DEN, ""},
      {HX_PROPERTY_STREAM_WIDTH, "-24"}, {HX_PROPERTY_STREAM_WIDTH, "4294967320"},
      {HX_PROPERTY_STREAM_HEIGHT, "0"},  {HX_PROPERTY_STREAM_HEIGHT, "10 or so"}};
  for (const auto& property : properties) {
    std::tie(changed_key, changed_value) = property;
    SCOPED_TRACE(changed_key + " " + changed_value);
    ExpectFailure([] { ADD_FAILURE() << "begun"; }, Job::kNoNodeProperty);
  }
}

TEST_F(VideoSegmentRenderSuiteJobTest, WithoutTheMediaThereIsNoJob) {
  media().faults.node_missing = true;  // nothing stands under the layer
  EXPECT_THROW(Make(), tessel::config::Error);
  media().faults.node_missing = false;
  layer().Change([](LayerState& l) {
    l.effects.resize(1100, {1000000, "too deep above", "", {}});
  });
  EXPECT_THROW(Make(), std::int32_t);
  layer().Change([](LayerState& l) { l.effects = {{1000000, "somebody else's", "", {}}}; });
  EXPECT_THROW(Make(), tessel::config::Error);
}

TEST_F(VideoSegmentRenderSuiteJobTest, FramesComeFromTheInputOfTheEffectsOwnNode) {
  const auto fill = [](float grey) {
    return [grey](std::int64_t, Picture& picture) {
      FillPicture(picture, [=](int, int) { return HX_PixelFloat{1, grey, grey, grey}; });
    };
  };
  layer().InsertEffect(0, {calmframe::host::NewRuntimeId(), "below", "", fill(0.2f)});
  layer().InsertEffect(2, {calmframe::host::NewRuntimeId(), "above", "", fill(0.8f)});
  const auto body = [this] {
    Request(0);
    EXPECT_EQ(Get(0).pixels[1], 51);
  };
  EXPECT_EQ(Run(body), JobState::Finished);
}

}  // namespace
}  // namespace kelp
