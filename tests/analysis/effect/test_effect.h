#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <boost/make_shared.hpp>
#include <chrono>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "analysis/effect/analysis_effect.h"
#include "analysis/effect/analysis_parameter_rows.h"
#include "analysis/effect/banner_cache.h"
#include "effect/entry.h"
#include "effect/handle.h"
#include "effect/host_context.h"
#include "effect/host_text.h"
#include "platform/tessel/threads.h"
#include "tests/analysis/host/fake_renderer.h"
#include "tests/analysis/src/fake_host.h"
#include "tests/effect/fake_host.h"

namespace kelp::analysis::effect {

// What the effect below was told, by all its objects.
struct TestLog {
  int restarts = 0, needs_solve = 0, failed = 0, dropped_solves = 0, published = 0;
  double overlay_scale = 1;
  boost::shared_ptr<BannerCache> banners;
  boost::shared_ptr<std::mutex> banner_lock = boost::make_shared<std::mutex>();
};

enum TestIndex : std::int32_t {
  kAnalyzeAt = 1,
  kCancelAt = 2,
  kDetailedAt = 3,
  kCounterAt = 4,
  kSaveAt = 5,
  kTestParamCount = 6  // all others are not declared
};

// An analysing effect that makes nothing of its analysis. Its handle holds a pointer to the state.
class TestEffect final : public AnalysisEffect {
 public:
  explicit TestEffect(const kelp::effect::HostContext& context) noexcept
      : AnalysisEffect(context) {}
  static inline TestLog log;

  void DeclareParams() override { DeclareParamCount(kTestParamCount); }
  void CreateInstance() override { SetupInstance(); }
  void DestroyInstance() override { TeardownInstance(); }
  void ReportOutOfMemory() override {
    kelp::effect::ReportOutOfMemoryOnFrame(context(), GetCurrentFrame(true).frame);
  }
  void ReportUnknownException() override {
    kelp::effect::ReportUnknownExceptionOnFrame(context(), GetCurrentFrame(true).frame);
  }
  HX_Err AddParam(std::int32_t index) override {
    return AnalysisEffect::AddParam(IndexToParamId(index));
  }
  boost::shared_ptr<BannerCache> GetBannerCache() override {
    if (!log.banners) log.banners = boost::make_shared<BannerCache>();
    return log.banners;
  }
  boost::shared_ptr<std::mutex> GetBannerCacheLock() override { return log.banner_lock; }
  AnalysisState* GetState() override {
    if (!context().in->instance_handle) return nullptr;
    return *Slot(context().in->instance_handle).as<AnalysisState*>();
  }
  std::int32_t ParamIdToIndex(std::int32_t id) override {
    for (std::int32_t i = 1; i < kTestParamCount; ++i) {
      if (IndexToParamId(i) == id) return i;
    }
    return -1;
  }
  std::int32_t IndexToParamId(std::int32_t index) override {
    constexpr std::int32_t ids[] = {-1,
                                    kAnalyzeParam,
                                    kCancelParam,
                                    kDetailedAnalysisParam,
                                    kAnalysisStatusCounterParam,
                                    kSaveTrackFileParam};
    return index > 0 && index < kTestParamCount ? ids[index] : -1;
  }
  bool IsExperimentalIndex(std::int32_t index) override {
    return index <= 0 || index >= kTestParamCount;
  }
  void RestartAnalysis() override {
    ++log.restarts;
    TeardownInstance();
    CreateInstanceState(false);
    StartAnalysis();
    PublishStatus(FrameStatus::AnalysisInProgress);
  }
  double GetOverlayScale() override { return log.overlay_scale; }
  void DropSolveJob() override { ++log.dropped_solves; }
  void CreateStateInHandle(HX_Handle handle, bool keep_jobs) override {
    const kelp::effect::HandleLock slot = Slot(handle);
    auto* const state = *slot.as<AnalysisState*>() = new AnalysisState;
    state->keep_jobs = keep_jobs;
  }
  HX_Handle AllocateInstanceHandle(std::uint64_t) override {
    const HX_Handle handle = context().in->cb->new_handle(sizeof(AnalysisState*));
    if (!handle) throw std::int32_t{HX_ERR_NO_INSTANCE};
    return handle;
  }
  void DestroyStateInHandle(HX_Handle handle) override {
    const kelp::effect::HandleLock slot = Slot(handle);
    delete std::exchange(*slot.as<AnalysisState*>(), nullptr);
  }
  std::string GetCancelMessage() override { return "Stabilizer analysis canceled."; }
  void MarkNeedsSolve() override { ++log.needs_solve; }
  void MarkAnalysisFailed() override { ++log.failed; }
  void PublishSharedData() override { ++log.published; }

  using AnalysisEffect::UpdateStartStopButtonEnablement;

 private:
  kelp::effect::HandleLock Slot(HX_Handle handle) { return {*context().in->cb, handle}; }
};

// The effect on a clip of 25 frames a second in a host that renders it.
class EffectTest : public ::testing::Test {
 protected:
  static constexpr int kWidth = 160, kHeight = 120;

  explicit EffectTest(int frames = 4) {
    TestEffect::log = {};
    for (const auto& suite : FakeHost::SuiteTables()) {
      if (suite.name != HX_PRIVATE_EFFECT_SUITE) {
        host_.Offer(suite.name, suite.version, suite.table);
      }
    }
    layer_.count = frames;
    layer_.top = layer_.AddPlainClip("media " + std::to_string(++clips));
    layer_.nodes[0].properties = {{HX_PROPERTY_STREAM_WIDTH, std::to_string(kWidth)},
                                  {HX_PROPERTY_STREAM_HEIGHT, std::to_string(kHeight)},
                                  {HX_PROPERTY_STREAM_PAR_NUM, "1"},
                                  {HX_PROPERTY_STREAM_PAR_DEN, "1"}};
    renderer_ = std::make_unique<FakeRenderer>(host_);
    host_.in.width = kWidth;
    host_.in.height = kHeight;
    host_.in.total_time = frames;
    EXPECT_EQ(Call(HX_CMD_DECLARE_PARAMS), 0);
    EXPECT_EQ(host_.params.size(), std::size_t{kTestParamCount});
  }
  ~EffectTest() override {
    host_.FailOperation(0);
    EXPECT_EQ(Call(HX_CMD_DESTROY_INSTANCE), 0);
    if (renderer_->callbacks == FakeRenderer::Callbacks::kHeld) renderer_->Resume();
    tessel::threads::Shutdown();
    TestEffect::log = {};
    renderer_->Stop();
    EXPECT_EQ(renderer_->Leaks(), "");
    EXPECT_EQ(host_.Leaks(), "");
    renderer_.reset();
  }

  HX_Err Call(std::uint32_t command, void* extra = nullptr) {
    params_.clear();
    for (HX_ParamDef& param : host_.params) params_.push_back(&param);
    return host_.Call(kelp::effect::EffectMain<TestEffect>, command, params_.data(), nullptr,
                      extra);
  }
  HX_Err Apply() { return Call(HX_CMD_CREATE_INSTANCE); }
  HX_Err Tick() { return Call(HX_CMD_IDLE_TICK); }
  HX_Err Refresh() { return Call(HX_CMD_REFRESH_PARAMS); }
  HX_Err Change(std::int32_t index) {
    HX_ParamChangedExtra extra{index};
    return Call(HX_CMD_PARAM_CHANGED, &extra);
  }
  // The instance's analyzer or null; a look that is no operation of the host's.
  boost::shared_ptr<Analyzer> FindAnalyzer() const {
    if (!host_.in.instance_handle) return {};
    const std::string bytes = host_.handle_bytes(host_.in.instance_handle);
    AnalysisState* state = nullptr;
    std::copy_n(bytes.data(), sizeof state, reinterpret_cast<char*>(&state));
    return state ? state->analyzer : boost::shared_ptr<Analyzer>();
  }
  bool Analyses() const { return FindAnalyzer() != nullptr; }
  // Until the job of a started analysis is in its last state.
  void WaitForJob() const {
    const boost::shared_ptr<Analyzer> analyzer = FindAnalyzer();
    if (!analyzer || analyzer->job_stage() == JobStage::NotStarted) return;
    while (analyzer->GetStatus().state < JobState::Failed) std::this_thread::yield();
  }
  // Ticks until nothing is analysed any more.
  void Settle() {
    for (int i = 0; i < 20000 && Analyses(); ++i) {
      EXPECT_EQ(Tick(), 0) << host_.out.return_msg;
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    EXPECT_FALSE(Analyses());
  }

  // For calls of operations, and for looks.
  kelp::effect::HostContext Context(std::uint32_t command = HX_CMD_REFRESH_PARAMS) {
    return {command, &host_.in, &host_.out, params_.data(), nullptr, nullptr};
  }
  AnalysisState* State() { return TestEffect(Context()).GetState(); }
  int Counter() const { return static_cast<int>(host_.params[kCounterAt].u.fs.value); }
  bool Enabled(int index) const { return !(host_.params[index].ui_flags & HX_PARAM_UI_DISABLED); }
  std::string Label() const { return host_.params[kCancelAt].name; }
  int Updates() const {
    int count = 0;
    for (const auto& operation : host_.operations()) {
      count += operation.name == "Param Utils.UpdateParamUI";
    }
    return count;
  }

  static inline int clips = 0;  // each test's is another, for the process's registry
  FakeHost layer_;
  ::FakeHost host_;
  std::unique_ptr<FakeRenderer> renderer_;
  std::vector<HX_ParamDef*> params_;
};

}  // namespace kelp::analysis::effect
