#include "stabilizer/effect/src/shared_data.h"

#include <gtest/gtest.h>

#include <atomic>
#include <barrier>
#include <boost/make_shared.hpp>
#include <thread>

#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/stabilizer/effect/stabilizer_host.h"

namespace kelp::effect {
namespace {

// An instance of a render on records of its own.
class RenderInstance {
 public:
  explicit RenderInstance(const FakeHost& host) : RenderInstance(host.in) {}
  explicit RenderInstance(const HX_InData& in) : in_(in) {
    in_.instance_handle = nullptr;
    EXPECT_EQ(Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
  }
  ~RenderInstance() { EXPECT_EQ(Call(HX_CMD_DESTROY_INSTANCE), HX_ERR_NONE); }

  HX_Err Call(std::uint32_t command, HX_World* output = nullptr) {
    out_ = {};
    out_.instance_handle = in_.instance_handle;
    out_.global_data = in_.global_data;
    const HX_Err code = Entry(command, &in_, &out_, nullptr, output, nullptr);
    in_.instance_handle = out_.instance_handle;
    return code;
  }
  StabilizerState& state() {
    return *StabilizerEffect(HostContext{0, &in_, &out_, nullptr, nullptr, nullptr}).GetState();
  }
  HX_InData& in() { return in_; }

 private:
  HX_InData in_;
  HX_OutData out_{};
};

TEST(SharedDataTest, ARenderTakesOverWhatWasPublished) {
  StabilizerHost test;
  StabilizerState& own = test.Analysed(ShakenTable(20, 40));
  RenderInstance render(test.host);
  EXPECT_EQ(test.opaque_uses, 2);
  EXPECT_TRUE(render.state().keep_jobs);
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  ASSERT_EQ(render.Call(HX_CMD_PREPARE_FRAME), HX_ERR_NONE);
  EXPECT_EQ(render.state().SolveProgressStatus(), analysis::FrameStatus::SolveInProgress);
  EXPECT_TRUE(render.state().needs_solve);
  test.TickUntilSolved();
  EXPECT_FALSE(render.state().warper);
  ASSERT_EQ(render.Call(HX_CMD_PREPARE_FRAME), HX_ERR_NONE);
  EXPECT_EQ(render.state().warper, own.warper);
  EXPECT_EQ(render.state().crop, own.crop);
  EXPECT_EQ(render.state().phase, SolvePhase::Solved);
  EXPECT_EQ(render.state().all_features.features, own.all_features.features);

  // A new analysis: the render's copy takes table and counts together, and sees that one runs.
  HX_ParamChangedExtra analyze{kAnalyzeIndex};
  ASSERT_EQ(test.Call(HX_CMD_PARAM_CHANGED, nullptr, &analyze), HX_ERR_NONE);
  ASSERT_EQ(render.Call(HX_CMD_PREPARE_FRAME), HX_ERR_NONE);
  EXPECT_EQ(render.state().all_features.frame_count, 0);
  EXPECT_TRUE(render.state().analyzer);
  // It neither starts nor cancels that one.
  ASSERT_EQ(render.Call(HX_CMD_IDLE_TICK), HX_ERR_NONE);
  EXPECT_EQ(render.state().analyzer->job_stage(), analysis::JobStage::NotStarted);
  test.Destroy();
  EXPECT_EQ(test.opaque_uses, 1);
}

TEST(SharedDataTest, WhatAnOutsideRendererMayDraw) {
  StabilizerHost test;
  const auto warper = ShiftingWarper(64, 48, {{0, 0}});
  const auto crop = boost::make_shared<cropper>(1, 64, 48);
  crop->cropWidth = 60;
  crop->cropHeight = 40;
  StabilizerState& state = test.Solved(warper, crop);
  const auto allowed = [&](Framing framing) {
    test.Set(kFramingIndex, static_cast<int>(framing));
    test.Effect().PublishSharedData();
    return state.shared->contents.gpu_allowed;
  };
  EXPECT_TRUE(allowed(Framing::stabilize_only));
  EXPECT_TRUE(allowed(Framing::crop));
  EXPECT_FALSE(allowed(Framing::synthesize_edges));
  state.crop.reset();
  EXPECT_TRUE(allowed(Framing::stabilize_only));
  EXPECT_FALSE(allowed(Framing::crop_auto_scale));
  state.needs_solve = true;
  EXPECT_FALSE(allowed(Framing::stabilize_only));
  state.needs_solve = false;
  state.warper.reset();
  EXPECT_FALSE(allowed(Framing::stabilize_only));
}

TEST(SharedDataTest, ThreadsThatAttachAtOnceShareOneBlock) {
  StabilizerHost test;
  for (int round = 0; round < 20; ++round) {
    constexpr int kThreads = 4;
    std::barrier<> together(kThreads);
    std::atomic<const StabilizerSharedData*> blocks[kThreads];
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i) {
      threads.emplace_back([&, i] {
        together.arrive_and_wait();
        RenderInstance render(test.host);
        blocks[i] = render.state().shared;
        together.arrive_and_wait();
      });
    }
    for (std::thread& thread : threads) thread.join();
    for (const auto& block : blocks) EXPECT_EQ(block, blocks[0]);
    EXPECT_EQ(test.opaque, nullptr) << "the last one deletes it";
  }
}

// The user interface solves, re-frames, saves and starts again while renders run.
TEST(SharedDataTest, RendersWhileTheUserInterfaceWorks) {
  StabilizerHost test;
  test.host.in.width = 64;
  test.host.in.height = 48;
  TestWorld source(64, 48, 8);
  test.host.params[0].u.ld = *source.get();
  const RenderInstance standing(test.host);
  std::atomic<bool> end{false};
  std::vector<std::thread> renders;
  for (int i = 0; i < 3; ++i) {
    // The records are copied here: the user interface's own change while the threads start.
    renders.emplace_back([&, i, in = test.host.in] {
      RenderInstance render(in);
      for (int frame = i; !end; frame = (frame + 1) % 8) {
        render.in().current_time = frame;
        EXPECT_EQ(render.Call(HX_CMD_PREPARE_FRAME), HX_ERR_NONE);
        TestWorld output(64, 48, 8);
        EXPECT_EQ(render.Call(HX_CMD_RENDER_FRAME, output.get()), HX_ERR_NONE);
      }
    });
  }
  auto table = ShakenTable(8, 30);
  for (auto& cell : *table.features) {
    cell.x /= 10;
    cell.y /= 8;
  }
  for (int round = 0; round < 3; ++round) {
    test.Analysed(table);
    for (int change = 0; change < 4; ++change) {
      {
        const std::lock_guard<std::recursive_mutex> lock(test.host.mutex());
        test.Set(change % 2 ? kSmoothnessIndex : kMaximumScaleIndex, 110 + 10 * change + round);
      }
      test.TickUntilSolved();
    }
    EXPECT_EQ(test.Call(HX_CMD_FLATTEN_INSTANCE), HX_ERR_NONE);
    EXPECT_EQ(test.Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
    test.Destroy();
  }
  end = true;
  for (std::thread& render : renders) render.join();
}

}  // namespace
}  // namespace kelp::effect
