#include "analysis/host/video_segment_render_suite_job.h"

#include <gmock/gmock.h>

#include <boost/make_shared.hpp>
#include <functional>
#include <memory>

#include "analysis/src/analysis.h"
#include "platform/tessel/config.h"
#include "platform/tessel/threads.h"
#include "tests/analysis/host/fake_renderer.h"
#include "tests/analysis/src/fake_host.h"
#include "tests/effect/fake_host.h"

namespace kelp {
namespace {

using analysis::JobInput;
using analysis::JobState;
using analysis::RationalTime;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr int kWidth = 24, kHeight = 10;

// A job over a clip of no length, whose body is the test's own.
class VideoSegmentRenderSuiteJobTest : public ::testing::Test {
 protected:
  VideoSegmentRenderSuiteJobTest() {
    for (const auto& suite : analysis::FakeHost::SuiteTables()) {
      if (suite.name != HX_PRIVATE_EFFECT_SUITE) {
        host_.Offer(suite.name, suite.version, suite.table);
      }
    }
    layer_.count = 10;
    layer_.top = layer_.AddPlainClip("media");
    Media().properties = {{HX_PROPERTY_STREAM_WIDTH, std::to_string(kWidth)},
                          {HX_PROPERTY_STREAM_HEIGHT, std::to_string(kHeight)},
                          {HX_PROPERTY_STREAM_PAR_NUM, "16"},
                          {HX_PROPERTY_STREAM_PAR_DEN, "15"}};
    renderer_ = std::make_unique<FakeRenderer>(host_);
    input_.FieldType = 0;
    input_.StepTime = {1, 25};
  }
  ~VideoSegmentRenderSuiteJobTest() override {
    End();
    renderer_->Stop();
    EXPECT_EQ(renderer_->Leaks(), "");
    EXPECT_EQ(host_.Leaks(), "");
    renderer_.reset();
  }

  analysis::FakeHost::Node& Media() { return layer_.nodes[0]; }
  // The job is gone, and its thread.
  void End() {
    job_.reset();
    tessel::threads::Shutdown();
  }
  VideoSegmentRenderSuiteJob& Make() {
    job_ = boost::make_shared<VideoSegmentRenderSuiteJob>(
        &host_.in, &host_.out, input_,
        boost::make_shared<analysis::Analysis>(marrow::tracking::SelectorParams(),
                                               marrow::tracking::TrackerParams()));
    return *job_;
  }
  // The body in the background; the state it ends in.
  JobState Run(std::function<void()> body) {
    Make();
    job_->AddRunFunction([body](analysis::Job&) { body(); });
    job_->Start(job_);
    tessel::threads::Shutdown();
    return job_->GetStatus().state;
  }
  RationalTime At(int frame) const { return input_.StepTime * frame; }
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

  analysis::FakeHost layer_;
  ::FakeHost host_;
  std::unique_ptr<FakeRenderer> renderer_;
  JobInput input_;
  boost::shared_ptr<VideoSegmentRenderSuiteJob> job_;
};

TEST_F(VideoSegmentRenderSuiteJobTest, AFrameThatSeveralAskForIsRenderedOnceAndReadInPlace) {
  for (const auto callbacks : {FakeRenderer::Callbacks::kLater, FakeRenderer::Callbacks::kEarly}) {
    renderer_->callbacks = callbacks;
    renderer_->top_down = callbacks == FakeRenderer::Callbacks::kEarly;
    const std::size_t before = renderer_->requests().size();
    const JobState end = Run([&] {
      std::int32_t width = 0, height = 0;
      job_->GetFrameSize(&width, &height);
      EXPECT_EQ(width, kWidth);
      EXPECT_EQ(height, kHeight);
      for (int reader = 0; reader < 3; ++reader) job_->RequestFrame(At(4), 0);
      const Frame f = Get(4);
      EXPECT_TRUE(job_->RequestFrame(At(4), 0));  // in the cache by now
      EXPECT_EQ(f.row_bytes, kWidth * 4 + 8);
      EXPECT_EQ(f.flipped, !renderer_->top_down);
      const int row = renderer_->top_down ? 7 : kHeight - 1 - 7;
      for (int x = 0; x < kWidth; ++x) {
        EXPECT_EQ(f.pixels[f.row_bytes * row + 4 * x + 1],
                  FakeRenderer::Grey(4 * 28224000LL, x, 7));
      }
      for (int reader = 0; reader < 3; ++reader) job_->ReleaseFrame(At(4), 0);
      EXPECT_EQ(Get(4).pixels, f.pixels);  // the last reference is still there
    });
    EXPECT_EQ(end, JobState::Finished);
    EXPECT_EQ(renderer_->requests().size(), before + 1);
  }
  EXPECT_GE(host_.rerenders(), 4);
}

TEST_F(VideoSegmentRenderSuiteJobTest, RequestsTellTheHostTimesInTicksAndFields) {
  layer_.ticks = renderer_->ticks_per_frame = 23543520;  // 30000/1001 a second
  input_.StepTime = {1001, 30000};
  input_.FieldType = 1;
  EXPECT_EQ(Run([&] {
              const RationalTime half = input_.StepTime / 2 * 3;
              job_->RequestFrame(half, 0);
              job_->RequestFrame(At(1), 2);
            }),
            JobState::Finished);
  const auto requests = renderer_->requests();
  ASSERT_EQ(requests.size(), 2u);
  EXPECT_EQ(requests[0].time_ticks, 35315280);  // 1.5 * 23543520
  EXPECT_EQ(requests[0].rate_ticks, 23543520);
  EXPECT_EQ(requests[0].params.field_selection, 1);
  EXPECT_EQ(requests[1].params.field_type, 2);
  EXPECT_EQ(requests[1].params.field_selection, 0);
  const HX_RenderParams& p = requests[0].params;
  EXPECT_EQ(p.format_count, 1);
  EXPECT_THAT((std::vector<int>{p.width, p.height, p.par_num, p.par_den, p.quality, p.field_type,
                                p.final_value}),
              ElementsAre(kWidth, kHeight, 16, 15, 3, 0, 3));
}

TEST_F(VideoSegmentRenderSuiteJobTest, ARenderWithoutAFrameEndsTheWaitAndFailsTheJob) {
  renderer_->null_frames = true;
  for (const auto callbacks : {FakeRenderer::Callbacks::kLater, FakeRenderer::Callbacks::kEarly}) {
    renderer_->callbacks = callbacks;
    EXPECT_EQ(Run([&] {
                job_->RequestFrame(At(0), 0);
                Get(0);
              }),
              JobState::Failed);
    EXPECT_EQ(job_->GetErrorText(), VideoSegmentRenderSuiteJob::kNoFrame);
  }
  // Nobody asked for it: there is nothing to wait for.
  EXPECT_EQ(Run([&] { Get(3); }), JobState::Failed);
  // A frame of another size than the readers' images.
  renderer_->null_frames = false;
  renderer_->delivered_width = kWidth - 1;
  EXPECT_EQ(Run([&] {
              job_->RequestFrame(At(0), 0);
              Get(0);
            }),
            JobState::Failed);
}

TEST_F(VideoSegmentRenderSuiteJobTest, WhatIsStillWantedAtTheEndIsCancelledAndMayComeLate) {
  renderer_->callbacks = FakeRenderer::Callbacks::kHeld;
  EXPECT_EQ(Run([&] {
              job_->RequestFrame(At(0), 0);
              job_->RequestFrame(At(1), 0);
              EXPECT_TRUE(job_->RequestFrame(At(1), 0));  // on its way
            }),
            JobState::Finished);
  EXPECT_EQ(renderer_->cancelled(), 2);
  EXPECT_EQ(renderer_->requests().size(), 2u);
  End();  // the callbacks come when the job is gone
  renderer_->Deliver();
}

TEST_F(VideoSegmentRenderSuiteJobTest, ACancelLetsTheWaitEndByItsDelivery) {
  renderer_->callbacks = FakeRenderer::Callbacks::kHeld;
  Make();
  job_->AddRunFunction([this](analysis::Job&) {
    job_->RequestFrame(At(0), 0);
    job_->RequestFrame(At(1), 0);
    Get(0);
    if (job_->GetStatus().state >= JobState::Cancelled) throw analysis::TerminateException();
    ADD_FAILURE() << "the cancel was not seen";
  });
  job_->Start(job_);
  renderer_->WaitForHeld(2);
  job_->Cancel();
  renderer_->Deliver();
  tessel::threads::Shutdown();
  EXPECT_TRUE(job_->WasCancelled());
}

TEST_F(VideoSegmentRenderSuiteJobTest, EveryRefusalOfTheHostHasItsText) {
  const auto request = [&] { job_->RequestFrame(At(0), 0); };
  renderer_->refuse_renders = true;
  EXPECT_EQ(Run(request), JobState::Failed);
  EXPECT_EQ(job_->GetErrorText(), VideoSegmentRenderSuiteJob::kNoRender);
  renderer_->refuse_identifiers = true;
  EXPECT_EQ(Run(request), JobState::Failed);
  EXPECT_EQ(job_->GetErrorText(), VideoSegmentRenderSuiteJob::kNoFrameIdentifier);

  bool ran = false;
  const auto body = [&ran] { ran = true; };
  for (const char* key : {HX_PROPERTY_STREAM_WIDTH, HX_PROPERTY_STREAM_PAR_DEN}) {
    const auto properties = Media().properties;
    Media().properties.erase(key);
    EXPECT_EQ(Run(body), JobState::Failed);
    EXPECT_EQ(job_->GetErrorText(), VideoSegmentRenderSuiteJob::kNoNodeProperty);
    Media().properties = properties;
  }
  Media().properties[HX_PROPERTY_STREAM_HEIGHT] = "tall";
  EXPECT_EQ(Run(body), JobState::Failed);
  EXPECT_EQ(job_->GetErrorText(), VideoSegmentRenderSuiteJob::kNoNodeProperty);
  EXPECT_FALSE(ran);
  EXPECT_EQ(layer_.node_references, 0);  // the node went with the run
}

TEST_F(VideoSegmentRenderSuiteJobTest, WithoutASuiteOrTheMediaThereIsNoJob) {
  for (const char* suite : {HX_CUTPIX_SUITE, HX_CUTPIX_CACHE_SUITE, HX_SEQUENCE_INFO_SUITE,
                            HX_VIDEO_SEGMENT_SUITE, HX_VIDEO_SEGMENT_RENDER_SUITE,
                            HX_PRIVATE_EFFECT_SUITE, HX_UTILITY_SUITE, HX_STRING_SUITE}) {
    host_.Prepare();
    host_.RefuseSuite(suite);
    EXPECT_THROW(Make(), std::int32_t) << suite;
    EXPECT_STREQ(host_.out.return_msg, "Not able to acquire OVK Suite.");
    EXPECT_TRUE(host_.ShowsMessage());
    host_.OfferAllSuites();
    EXPECT_EQ(host_.Leaks(), "");
  }
  // Somebody else's effect stands on the clip; nothing stands under the layer.
  layer_.runtime_id = 78;
  EXPECT_THROW(Make(), tessel::config::Error);
  layer_.runtime_id = 77;
  layer_.top = -1;
  EXPECT_THROW(Make(), tessel::config::Error);
}

TEST_F(VideoSegmentRenderSuiteJobTest, FramesComeFromTheInputOfTheEffectsOwnNode) {
  // Another effect on the clip from above: the owner is found beneath it. Without properties the
  // media beneath the wrong node would fail the job.
  const int other = layer_.AddNode({"", "", {{HX_PROPERTY_RUNTIME_INSTANCE_ID, "5"}}, {}, {}});
  layer_.top = layer_.AddNode({"", "", {}, {other}, {layer_.top}});
  EXPECT_EQ(Run([] {}), JobState::Finished);
}

}  // namespace
}  // namespace kelp
