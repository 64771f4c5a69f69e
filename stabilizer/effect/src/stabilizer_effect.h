#pragma once

#include "analysis/effect/analysis_effect.h"
#include "stabilizer/effect/src/stabilizer_state.h"
#include "stabilizer/render/output_rect.h"

namespace kelp::effect {

// The stabilizer: what follows an analysis. Of its own it has the parameters, the statuses, and the
// life of an instance and its handle; the rest is done by services: SolveService starts and watches
// a solve, RenderService draws, shared_service.h has the block that renders share, and
// stored_service.h what projects keep.
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
  // Whether the source is still the analysed one, for frames and host.
  void NoteSource(analysis::Validity validity);
};

}  // namespace kelp::effect
