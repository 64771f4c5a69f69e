#include "analysis/host/video_segment_render_suite_job.h"

#include <gmock/gmock.h>

#include <atomic>
#include <boost/make_shared.hpp>
#include <functional>
#include <new>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "analysis/src/analysis.h"
#include "analysis/src/identities.h"
#include "platform/tessel/config.h"
#include "platform/tessel/importer.h"
#include "tests/effect/host_records.h"

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

std::uint8_t Grey(std::int64_t frame, int x, int y) {
  return static_cast<std::uint8_t>(20 * frame + 7 * x + 3 * y);
}

// What the tables that stand in for the host's do beside what those do.
std::vector<std::pair<std::int64_t, HX_RenderParams>> renders;
std::int64_t rate_ticks = 0;
std::string changed_key, changed_value;  // a property of the media; absent for an empty value
std::function<void()> on_lookup;
struct Delivered {
  std::int32_t width, height;
  std::uint32_t format;
} delivered;

// A job over a clip of no length, whose body is the test's own.
class VideoSegmentRenderSuiteJobTest : public calmframe::host::HostRecords {
 protected:
  VideoSegmentRenderSuiteJobTest()
      : HostRecords([this](std::int64_t frame, Picture& picture) {
          on_draw_(frame);
          calmframe::host::FillPicture(picture, [frame](int x, int y) {
            const float grey = Grey(frame, x, y) / 255.0f;
            return HX_PixelFloat{1, grey, grey, grey};
          });
        }) {
    host_->media().SetCacheBytes(0);
    host_->media().faults.row_padding = 8;
    input_.FieldType = 0;
    input_.StepTime = {1, 25};
  }
  void TearDown() override {
    for (CompletionEvent& held : held_) held.Signal();
    End();
    HostRecords::TearDown();
  }

  // The job is gone, and its thread.
  void End() {
    job_.reset();
    tessel::threads::Shutdown();
  }
  Job& Make() {
    job_ = boost::make_shared<Job>(
        &in_, &out_, input_,
        boost::make_shared<analysis::Analysis>(marrow::tracking::SelectorParams(),
                                               marrow::tracking::TrackerParams()));
    return *job_;
  }
  void Start(const Body& body) {
    Make().AddRunFunction([body](analysis::Job&) { body(); });
    job_->Start(job_);
  }
  // The state that the body, in the background, ends in.
  JobState Run(const Body& body) {
    Start(body);
    tessel::threads::Shutdown();
    Operations::Get().FailNone();
    return job_->GetStatus().state;
  }
  // What the body's whole run asks the host for.
  std::multiset<std::string> OperationsOf(const Body& body) {
    Operations::Get().Record(true);
    Run(body);
    Operations::Get().Record(false);
    const std::vector<std::string> names = Operations::Get().recorded();
    return {names.begin(), names.end()};
  }

  RationalTime At(int frame) const { return input_.StepTime * frame; }
  bool Request(int frame) { return job_->RequestFrame(At(frame), 0); }
  struct Frame {
    std::int32_t row_bytes = 0;
    bool flipped = false;
    std::uint32_t format = 0;
    const std::uint8_t* pixels = nullptr;
  };
  Frame Get(int frame) {
    Frame f;
    job_->GetFrame(At(frame), 0, &f.row_bytes, &f.flipped, &f.format, &f.pixels);
    return f;
  }
  void Fetch(int frame) {
    Request(frame);
    Get(frame);
  }

  analysis::JobInput input_;
  boost::shared_ptr<Job> job_;
  std::function<void(std::int64_t frame)> on_draw_ = [](std::int64_t) {};
  // For on_draw_, which may be called until the end: draws go on; one has begun.
  CompletionEvent held_[3], drawing_;
};

TEST_F(VideoSegmentRenderSuiteJobTest, AFrameThatSeveralAskForIsRenderedOnceAndReadInPlace) {
  for (const bool early : {false, true}) {
    host_->media().faults.early_callback = early;
    host_->media().faults.bottom_up = early;
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
        EXPECT_EQ(f.pixels[f.row_bytes * row + 4 * x + 1], Grey(4, x, 7));
      }
      for (int reader = 0; reader < 3; ++reader) job_->ReleaseFrame(At(4), 0);
      EXPECT_EQ(Get(4).pixels, f.pixels);  // the last reference is still there
    };
    const auto operations = OperationsOf(body);
    EXPECT_EQ(operations.count("Video Segment Render.RenderAsync"), 1u);
    EXPECT_EQ(operations.count("Video Segment Render.Cancel"), 0u);
    EXPECT_EQ(job_->GetStatus().state, JobState::Finished);
  }
}

TEST_F(VideoSegmentRenderSuiteJobTest, RequestsTellTheHostTimesInTicksAndFields) {
  layer_->Change([](LayerState& layer) {
    layer.ticks_per_frame = 23543520;  // of 30000/1001
    layer.field_type = 1;
  });
  input_.StepTime = {1001, 30000};
  input_.FieldType = 1;
  static const auto host = TableOf<HX_VideoSegmentRenderSuite3>(HX_VIDEO_SEGMENT_RENDER_SUITE, 3);
  static HX_VideoSegmentRenderSuite3 table = host;
  table.RenderAsync = [](HX_Node node, std::int64_t time, std::int64_t rate,
                         const HX_RenderParams* params, HX_RenderCallback callback, void* record,
                         std::int32_t* id) {
    renders.push_back({time, *params});
    rate_ticks = rate;
    return host.RenderAsync(node, time, rate, params, callback, record, id);
  };
  Replace(HX_VIDEO_SEGMENT_RENDER_SUITE, &table);
  renders.clear();
  EXPECT_EQ(Run([&] {
              job_->RequestFrame(input_.StepTime / 2 * 3, 0);
              job_->RequestFrame(At(1), 2);
            }),
            JobState::Finished);
  End();
  ASSERT_EQ(renders.size(), 2u);
  EXPECT_EQ(renders[0].first, 35315280);  // 1.5 * 23543520
  EXPECT_EQ(rate_ticks, 23543520);
  EXPECT_EQ(renders[1].second.field_type, 2);
  EXPECT_EQ(renders[1].second.field_selection, 0);
  const HX_RenderParams& p = renders[0].second;
  EXPECT_THAT((std::vector<int>{p.format_count, p.width, p.height, p.par_num, p.par_den, p.quality,
                                p.field_type, p.field_selection, p.final_value}),
              ElementsAre(1, kWidth, kHeight, 16, 15, 3, 0, 1, 3));
}

// A frame comes behind the one that was asked for after it, and both when the job has looked for
// the first in vain.
TEST_F(VideoSegmentRenderSuiteJobTest, EachFrameIsWaitedForWhateverElseComes) {
  static const auto host = TableOf<HX_CutPixCacheSuite5>(HX_CUTPIX_CACHE_SUITE, 5);
  static HX_CutPixCacheSuite5 table = host;
  table.Lookup = [](const HX_Guid* identifier, HX_Frame* frame) {
    const HX_Err code = host.Lookup(identifier, frame);
    on_lookup();
    return code;
  };
  Replace(HX_CUTPIX_CACHE_SUITE, &table);
  static std::atomic<int> wanted, lookups;
  on_lookup = [this] {
    if (wanted < 0) return;
    ++lookups;
    held_[wanted].Signal();
  };
  on_draw_ = [this](std::int64_t frame) {
    const std::int64_t first = frame / 2 * 2;
    held_[first].Wait();
    while (frame == first && host_->media().counts().requests > 1) std::this_thread::yield();
    // Who doesn't wait looks again now.
    for (int i = 0; i < 2000 && lookups < 2; ++i) std::this_thread::yield();
  };
  EXPECT_EQ(Run([&] {
              for (const int frame : {0, 2}) {
                wanted = -1;
                lookups = 0;
                Request(frame);
                Request(frame + 1);
                wanted = frame;
                Get(frame);
              }
            }),
            JobState::Finished)
      << job_->GetErrorText();
}

TEST_F(VideoSegmentRenderSuiteJobTest, WhatIsStillWantedAtTheEndIsCancelledAndMayComeLate) {
  on_draw_ = [this](std::int64_t) { held_[0].Wait(); };
  const auto body = [&] {
    for (int frame = 0; frame < 3; ++frame) Request(frame);  // more than there are render threads
    EXPECT_TRUE(Request(1));                                 // on its way
  };
  EXPECT_EQ(OperationsOf(body).count("Video Segment Render.Cancel"), 3u);
  EXPECT_EQ(job_->GetStatus().state, JobState::Finished);
  End();  // the callbacks come when the job is gone
}

// All that its next fetch asks for is there, and the host draws many frames meanwhile.
TEST_F(VideoSegmentRenderSuiteJobTest, RestsWhileTheHostPauses) {
  CompletionEvent begun, go_on;
  std::atomic<bool> fetched = false;
  on_draw_ = [this](std::int64_t frame) {
    if (frame == kFrames - 1) drawing_.Signal();
  };
  Start([&] {
    Fetch(0);
    begun.Signal();
    go_on.Wait();
    for (int frame = 1; frame < kFrames; ++frame) Request(frame);
    Get(1);
    fetched = true;
    drawing_.Wait();  // the end cancels what is not drawn
  });
  begun.Wait();
  tessel::importer::PauseBackgroundWork(true);
  go_on.Signal();
  drawing_.Wait();
  EXPECT_FALSE(fetched);
  tessel::importer::PauseBackgroundWork(false);
  tessel::threads::Shutdown();
  EXPECT_TRUE(fetched);
  EXPECT_EQ(job_->GetStatus().state, JobState::Finished);
}

TEST_F(VideoSegmentRenderSuiteJobTest, TheHostIsToldOfEachFetchAndOfTheEnd) {
  constexpr char kNotice[] = "Private Effect.ForceRerender";
  const auto fetch = [this] { Fetch(0); };
  EXPECT_EQ(OperationsOf([] {}).count(kNotice), 1u);
  EXPECT_EQ(OperationsOf(fetch).count(kNotice), 2u);
  EXPECT_EQ(OperationsOf([] { throw std::bad_alloc(); }).count(kNotice), 1u);
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
    EXPECT_EQ(Run([this, name = operation] {
                Operations::Get().FailAlways(name);
                Fetch(0);
              }),
              JobState::Failed)
        << operation;
    EXPECT_EQ(job_->GetErrorText(), text) << operation;
  }
  EXPECT_EQ(host_->media().counts().nodes, 0u);  // the media's went with the run
}

TEST_F(VideoSegmentRenderSuiteJobTest, WithoutAFrameOfTheReadersSizeAndFormatTheJobFails) {
  const auto fails = [this](const Body& body) {
    EXPECT_EQ(Run(body), JobState::Failed);
    EXPECT_EQ(job_->GetErrorText(), Job::kNoFrame);
  };
  fails([this] { Get(3); });  // nobody asked for it: there is nothing to wait for
  for (const bool early : {false, true}) {
    host_->media().faults.early_callback = early;
    host_->media().faults.null_frame = true;
    fails([this] { Fetch(0); });
  }
  host_->media().faults.null_frame = false;
  static HX_CutPixSuite1 table = TableOf<HX_CutPixSuite1>(HX_CUTPIX_SUITE, 1);
  table.GetSize = [](HX_Frame, std::int32_t* width, std::int32_t* height) -> HX_Err {
    *width = delivered.width;
    *height = delivered.height;
    return HX_ERR_NONE;
  };
  table.GetPixelFormat = [](HX_Frame, std::uint32_t* format) -> HX_Err {
    *format = delivered.format;
    return HX_ERR_NONE;
  };
  Replace(HX_CUTPIX_SUITE, &table);
  for (const Delivered frame : {Delivered{kWidth - 1, kHeight, HX_FORMAT_ARGB8},
                                {kWidth, kHeight + 1, HX_FORMAT_ARGB8},
                                {kWidth, kHeight, HX_FORMAT_ARGB16}}) {
    delivered = frame;
    fails([this] { Fetch(0); });
  }
}

TEST_F(VideoSegmentRenderSuiteJobTest, MediaWithoutASizeIsNotBegun) {
  static const auto host = TableOf<HX_VideoSegmentSuite5>(HX_VIDEO_SEGMENT_SUITE, 5);
  static const auto strings = TableOf<HX_StringSuite1>(HX_STRING_SUITE, 1);
  static HX_VideoSegmentSuite5 table = host;
  table.GetProperty = [](HX_Node node, const char* key, HX_String* text) -> HX_Err {
    if (key != changed_key) return host.GetProperty(node, key, text);
    if (changed_value.empty()) return HX_ERR_UNKNOWN;
    return strings.MakeFromUTF8(changed_value.c_str(), text);
  };
  Replace(HX_VIDEO_SEGMENT_SUITE, &table);
  const std::pair<const char*, const char*> properties[] = {
      {HX_PROPERTY_STREAM_WIDTH, ""},    {HX_PROPERTY_STREAM_HEIGHT, ""},
      {HX_PROPERTY_STREAM_PAR_NUM, ""},  {HX_PROPERTY_STREAM_PAR_DEN, ""},
      {HX_PROPERTY_STREAM_WIDTH, "-24"}, {HX_PROPERTY_STREAM_WIDTH, "4294967320"},
      {HX_PROPERTY_STREAM_HEIGHT, "0"},  {HX_PROPERTY_STREAM_HEIGHT, "10 or so"}};
  for (const auto& [key, value] : properties) {
    changed_key = key;
    changed_value = value;
    EXPECT_EQ(Run([] { ADD_FAILURE() << "begun"; }), JobState::Failed);
    EXPECT_EQ(job_->GetErrorText(), Job::kNoNodeProperty) << key << " " << value;
  }
}

TEST_F(VideoSegmentRenderSuiteJobTest, WithoutTheMediaThereIsNoJob) {
  host_->media().faults.node_missing = true;  // nothing stands under the layer
  EXPECT_THROW(Make(), tessel::config::Error);
  host_->media().faults.node_missing = false;
  const LayerState layer = *layer_->state();
  layer_->Change([](LayerState& l) { l.effects = {{1000000, "somebody else's", "", {}}}; });
  EXPECT_THROW(Make(), tessel::config::Error);
  layer_->Change([&](LayerState& l) {
    l = layer;
    l.effects.resize(1100, {1000000, "too deep above", "", {}});
  });
  EXPECT_THROW(Make(), std::int32_t);
}

TEST_F(VideoSegmentRenderSuiteJobTest, FramesComeFromTheInputOfTheEffectsOwnNode) {
  const auto fill = [](float grey) {
    return [grey](std::int64_t, Picture& picture) {
      calmframe::host::FillPicture(picture, [=](int, int) {
        return HX_PixelFloat{1, grey, grey, grey};
      });
    };
  };
  layer_->InsertEffect(0, {calmframe::host::NewRuntimeId(), "below", "", fill(0.2f)});
  layer_->InsertEffect(2, {calmframe::host::NewRuntimeId(), "above", "", fill(0.8f)});
  EXPECT_EQ(Run([this] {
              Request(0);
              EXPECT_EQ(Get(0).pixels[1], 51);
            }),
            JobState::Finished);
}

}  // namespace
}  // namespace kelp
