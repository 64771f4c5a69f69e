#pragma once

#include "analysis/effect/analysis_effect.h"
#include "stabilizer/effect/src/render_frames.h"
#include "stabilizer/effect/src/stabilizer_state.h"
#include "stabilizer/render/output_rect.h"

namespace kelp::effect {

using marrow::render::OutputRect;

// The stabilizer: what follows an analysis. The start and the watch of a solve, whether a change
// calls for a solve or for a new crop alone, the state of an instance and its handle, the block
// shared with renders, and the renders themselves.
class StabilizerEffect final : public analysis::effect::AnalysisEffect {
 public:
  explicit StabilizerEffect(const HostContext& context) noexcept : AnalysisEffect(context) {}

  void ShowAbout() override;
  void PrepareFrame() override;
  void StartPlugin() override;
  void DeclareParams() override;
  void StopPlugin() override;
  void CreateInstance() override { SetupInstance(); }
  void RestoreInstance() override { ReloadInstance(); }
  void FlattenInstance() override;
  void RefreshParams() override;
  void DestroyInstance() override { TeardownInstance(); }
  void RenderFrame() override;
  void PlanFrame() override;
  void RenderPlannedFrame() override;
  void ReportOutOfMemory() override;
  void ReportUnknownException() override;

  // By index. Host texts that the records point at live until the plug-in is stopped.
  HX_Err AddParam(std::int32_t index) override;
  double GetParamDefault(std::int32_t id) override;
  analysis::FrameStatus GetStatusForFrame(std::int64_t frame) override;
  const char* GetStatusMessage(analysis::FrameStatus status) override;
  boost::shared_ptr<analysis::effect::BannerCache> GetBannerCache() override;
  boost::shared_ptr<std::mutex> GetBannerCacheLock() override;
  bool IsFinishedStatus(analysis::FrameStatus status) override;
  void GetBannerColors(analysis::FrameStatus status, tesselui::drawbot::Color* first,
                       tesselui::drawbot::Color* second) override;
  bool IsBannerHidden() override;
  StabilizerState* GetState() override;
  std::int32_t ParamIdToIndex(std::int32_t id) override;
  std::int32_t IndexToParamId(std::int32_t index) override;
  bool IsExperimentalIndex(std::int32_t index) override;
  bool ServiceAnalysis(bool from_render) override;
  void RestartAnalysis() override;
  void DropSolveJob() override;
  void CreateStateInHandle(HX_Handle handle, bool keep_jobs) override;
  HX_Handle AllocateInstanceHandle(std::uint64_t size) override;
  void DestroyStateInHandle(HX_Handle handle) override;
  void CreateInstanceState(bool render_copy) override;
  std::string GetCancelMessage() override;
  bool IsBusy() override;
  void MarkNeedsSolve() override;
  void MarkAnalysisFailed() override;
  void PublishStatus(analysis::FrameStatus status) override;
  // The user interface instance's state alone is published.
  void PublishSharedData() override;
  void AttachSharedData(bool skip_publish) override;
  // Whether this was the last user.
  bool DetachSharedData() override;

  // An instance out of a flattened handle, or a render's empty copy out of none.
  virtual void ReloadInstance();

 private:
  // That of a restored instance, where the host was not told it when the instance was saved.
  analysis::FrameStatus UntoldStatus(const StabilizerState& state);
  // Compares what is stored with what the parameters ask for. None of them is supervised, so this
  // is where a slider's change takes effect.
  void CheckSolveParams(StabilizerState& state);
  // Whether it started one.
  bool StartSolveIfNeeded(StabilizerState& state);
  void FinishSolve(StabilizerState& state);
  // On the name of the Stabilization group: dots that move while a solve is at work.
  void ShowSolveProgress(const StabilizerState& state);
  // On the name of the Auto-scale group.
  void ShowAutoScale(const StabilizerState& state);
  // Once for each size.
  void ReportSizeMismatch(StabilizerState& state);

  // The renderer of the state's warps at the render's scale.
  Renderer MakeRenderer(const StabilizerState& state) const;
  // The output of a render of the whole frame: that of the layer unless the frame can be rendered
  // and may reach beyond it.
  OutputRect SetUpOutput();
  // Frames on either side of the current one that a plan orders.
  std::int64_t PlanMargin(const StabilizerState& state);
  FrameClock ClockOf(const StabilizerState& state);
  // Without may_warp, and where the frame can't be rendered, the input is drawn.
  void Render(RenderFrames& frames, HX_World& output, std::int32_t depth, bool may_warp);
  template <class Pixel>
  bool RenderStabilized(RenderFrames& frames, HX_World& output);
  void SendPolygon(const StabilizerState& state, std::size_t frame, const Renderer& renderer,
                   const RenderSettings& settings, const OutputRect& setup);
};

}  // namespace kelp::effect
