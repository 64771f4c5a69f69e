#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <mutex>
#include <string>

#include "analysis/src/analysis_state.h"
#include "analysis/src/validity.h"
#include "effect/generic_effect.h"
#include "platform/tesselui/drawbot.h"
#include "tracking/selector_params.h"
#include "tracking/tracker_params.h"

namespace kelp::analysis::effect {

class BannerCache;

// What the banner of a frame tells.
struct StatusRecord {
  FrameStatus status = FrameStatus::None;
  std::string text;  // of GeneralFailure: what the host said, or empty

  auto operator<=>(const StatusRecord&) const = default;
};

// A frame of the clip: its absolute index, fields counted as frames.
struct CurrentFrame {
  bool valid = false;
  std::int64_t frame = 0;
  bool limited = false;  // stands in for one outside of the layer or of what was analysed
};

// An effect that needs a long background analysis of its input before it can render: the Analyze
// and Cancel buttons, the status of each frame, whether the stored analysis is still good, and the
// service of a running one. It knows nothing of what is made from the analysis.
//
// Everything runs on the user interface thread, except what a render asks of its own instance: the
// parameter reads, the statuses, the banner. Host codes are thrown; see ThrowIfFailed. Parameters
// go by index, or by the ids of AnalysisParam. The order of the virtual operations is the order of
// the table that other callers know.
class AnalysisEffect : public kelp::effect::GenericEffect {
 public:
  void ParamChanged() override;
  void RefreshParams() override;
  void IdleTick() override;
  void CustomDataOp() override;

  // Declares the parameter of an AnalysisParam id; any other number adds nothing.
  HX_Err AddParam(std::int32_t id) override;
  // 0 for an id that is none of AnalysisParam.
  virtual double GetParamDefault(std::int32_t id);

  // The value at the call's time, as ParameterReader reads it.
  virtual double GetFloatParam(std::int32_t id);
  virtual std::int32_t GetIntParam(std::int32_t id);
  virtual bool GetBoolParam(std::int32_t id);
  virtual std::int32_t GetPopupParam(std::int32_t id);

  // `frame` as in CurrentFrame. Does not throw for what the host can't tell: that is
  // GeneralFailure, with the host's message moved from the host-out into the state's error_text.
  virtual FrameStatus GetStatusForFrame(std::int64_t frame);
  // Keyed literal; null for a status without a text, which has no banner.
  virtual const char* GetStatusMessage(FrameStatus status);

  // In the global data. The cache is made when it is first asked for, and asked for and used under
  // its lock alone.
  virtual boost::shared_ptr<BannerCache> GetBannerCache() = 0;
  virtual boost::shared_ptr<std::mutex> GetBannerCacheLock() = 0;

  virtual bool IsFailureStatus(FrameStatus status);
  // These three are about the current frame.
  virtual bool ShowsOverlay();
  virtual bool NeedsOverlayOrBanner();
  virtual bool IsRenderableFrame();
  // Whether a frame of that status can be rendered.
  virtual bool IsFinishedStatus(FrameStatus status);

  // The colours of the stripes, with their alpha; equal ones make a flat bar.
  virtual void GetBannerColors(FrameStatus status, tesselui::drawbot::Color* first,
                               tesselui::drawbot::Color* second);
  // The user wants no banner. Asked by the render.
  virtual bool IsBannerHidden();

  // That of the host-in's instance handle; null without a handle and in one without a state.
  virtual AnalysisState* GetState() = 0;

  // kNoParam (-1) where there is none. That of kDeletedTrackPointsParam is where a host that keeps
  // that parameter has it; it is not declared, and its index has no id.
  virtual std::int32_t ParamIdToIndex(std::int32_t id) = 0;
  virtual std::int32_t IndexToParamId(std::int32_t index) = 0;
  virtual double GetOverlayScale();
  virtual bool IsExperimentalIndex(std::int32_t index) = 0;
  // The parameter is not declared.
  virtual bool IsParamAbsent(std::int32_t index);

  // The idle step; whether it had something to do. In a render nothing new is started.
  virtual bool ServiceAnalysis(bool from_render);
  // Moves the state's analyzer, which it must have, on by one step: starts it, watches it, takes
  // its results. May replace handle and state.
  virtual void PollAnalysis(AnalysisState& state);
  // A new state with an analysis that has not started.
  virtual void RestartAnalysis() = 0;
  // The state gets an analyzer; the next poll starts it. Nothing without a state.
  virtual void StartAnalysis();
  // Null params: nobody is told of a changed status. A null state has nothing to cancel.
  virtual void CancelAnalysis(AnalysisState* state, HX_ParamDef** params, bool show_text);
  // Stops work on the results and waits for its effect.
  virtual void DropSolveJob();
  virtual void HandleParamChange(const HX_ParamChangedExtra& extra);

  // Of the parameters, automatic values filled in for the host-in's size.
  virtual marrow::tracking::SelectorParams GetSelectorParams();
  virtual marrow::tracking::TrackerParams GetTrackerParams();

  // A new instance, whose analysis begins at once. Only the handle can fail.
  virtual void SetupInstance();
  // Ends what the instance runs, unless its state keeps jobs, and takes its handle back.
  virtual void TeardownInstance();
  // The state, if any, and the handle.
  virtual void DestroyInstanceHandle(HX_Handle handle);
  virtual void CreateStateInHandle(HX_Handle handle, bool keep_jobs) = 0;
  // Of `size` bytes behind its header; throws HX_ERR_NO_INSTANCE, with a message.
  virtual HX_Handle AllocateInstanceHandle(std::uint64_t size) = 0;
  // Nothing in a handle without a state.
  virtual void DestroyStateInHandle(HX_Handle handle) = 0;
  // A new handle in both host records in place of what stood there, with an empty state unless the
  // source is 1 by 1. `render_copy` is the state's keep_jobs.
  virtual void CreateInstanceState(bool render_copy);

  virtual std::string GetCancelMessage() = 0;
  // Whether there is anything to wait for.
  virtual bool IsBusy();
  // The results have changed.
  virtual void MarkNeedsSolve();
  virtual void MarkAnalysisFailed();

  // Makes every view of the host see the status: ticks the hidden counter, whose last two digits
  // are the status. Nothing for None.
  virtual void PublishStatus(FrameStatus status);

  // The block that the renders of the instance share.
  virtual void PublishSharedData();
  virtual void AttachSharedData(bool skip_publish);
  virtual bool DetachSharedData();

  // The frame of the call's time, which is limited to the layer first if `clamped`; at most the
  // last analysed one, or that counted from the layer's start. Invalid without a state, without
  // frames, and where the host can't tell; never throws.
  CurrentFrame GetCurrentFrame(bool clamped);
  // Index of the layer's first frame as CurrentFrame counts, with the state's fields; negative
  // where the layer begins before its media. Host codes are thrown.
  std::int64_t GetLayerStart(const AnalysisState& state);
  // Of the current frame.
  StatusRecord GetStatusRecord();
  // What the state holds, to what an analysis would give now. Never throws, and leaves no message.
  Validity GetValidity(AnalysisState& state);
  // Whether an analysis would give now what the state holds. A state without frames is never
  // current, nor is none. Never throws, and leaves no message about it.
  bool IsAnalysisCurrent(AnalysisState* state);
  // The source of the host's instance without a layer.
  bool IsOneByOne() const;

 protected:
  explicit AnalysisEffect(const kelp::effect::HostContext& context) noexcept
      : GenericEffect(context) {}
  ~AnalysisEffect() = default;

  // The only writer of the two buttons; spares the host what it has been told before. A null label
  // is an empty name on Cancel.
  void UpdateStartStopButtonEnablement(bool analyze_enabled, bool cancel_enabled,
                                       const char* cancel_label);
  // As the user's press of Analyze, once the job input could be read. What fails gives the buttons
  // back; a failure that has its message already ends here.
  void StartAnalysisFromUI();

 private:
  void UpdateButton(std::int32_t id, bool enabled, const char* name);
  void BeginPolledAnalysis(AnalysisState& state);
  void EndPolledAnalysis(AnalysisState& state, bool finished, bool failed_with_text);
  void SaveTrackFile();
};

}  // namespace kelp::analysis::effect
