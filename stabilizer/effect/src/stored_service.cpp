#include <cmath>
#include <cstring>
#include <memory>
#include <string>
#include <utility>

#include "analysis/host/video_segment_render_suite_job.h"
#include "analysis/src/state_errors.h"
#include "effect/host_requests.h"
#include "effect/suite.h"
#include "platform/tessel/debug.h"
#include "platform/tessel/filesupport.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "stabilizer/effect/src/parameter_table.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "stabilizer/effect/src/stabilizer_strings.h"
#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"

// StabilizerEffect and what projects keep of an instance.
namespace kelp::effect {

using analysis::AfterReport;
using analysis::FrameStatus;

namespace {

bool KeepsPayloadRaw(const HostContext& context) {
  using tessel::debug::DebugDatabase;
  if (DebugDatabase::GetBool("AnalysisDataIsAlwaysCompressed")) return false;
  if (DebugDatabase::GetBool("AnalysisDataIsNeverCompressed")) return true;
  const ScopedSuite<HX_AnalysisHostSuite1> suite(context);
  std::uint8_t raw = 0;
  ThrowIfFailed(suite->GetCompressionPreference(&raw));
  return raw != 0;
}

std::string PayloadOf(const StabilizerState& state, bool raw) {
  tessel::filesupport::OStringByteStream bytes;
  if (raw) {
    WriteState(bytes, state.Save());
  } else {
    tessel::filesupport::OZipByteStream zip(bytes);
    WriteState(zip, state.Save());
    zip.Close();
  }
  return bytes.Take();
}

SavedState ReadPayload(const HostContext& context, HX_Handle handle) {
  const InstanceHandleLock header(context, handle);
  return ReadState(&*header + 1, static_cast<std::size_t>(header->payload_length), header->version,
                   header->raw != 0, ShapeOf(*context.in));
}

// Tells the user why a payload is not taken, and throws StateDeserializationFailed.
[[noreturn]] void Refuse(const HostContext& context, const char* literal) {
  analysis::ReportStateError(context.in, context.out, literal, {}, AfterReport::GoOn);
  throw analysis::StateDeserializationFailed(literal);
}

[[noreturn]] void Refuse(const HostContext& context, const StateRefused& refused) {
  switch (refused.reason) {
    case StateRefused::Reason::SourceSize:
      analysis::ReportSizeMismatch(context.in, context.out, kEffectName, refused.stored,
                                   ShapeOf(*context.in), AfterReport::GoOn);
      throw analysis::StateDeserializationFailed(refused.what());
    case StateRefused::Reason::Grid:
      Refuse(context, kGridMismatch);
    default:
      Refuse(context, kBadSerializedData);
  }
}

// Reads a flattened instance. Throws StateDeserializationFailed when the user was told why not.
void LoadInstance(const HostContext& context, FlattenedInstance kind, StabilizerState& state) {
  switch (kind) {
    case FlattenedInstance::TooOld:
      Refuse(context, kVersionTooOld);
    case FlattenedInstance::TooNew:
      Refuse(context, kVersionTooNew);
    case FlattenedInstance::Payload:
      break;
    default:
      Refuse(context, kBadSerializedData);
  }
  try {
    state.Load(ReadPayload(context, context.in->instance_handle), MakeVideoSegmentRenderSuiteJob);
  } catch (const StateRefused& refused) {
    Refuse(context, refused);
  }
}

// A job runs, or has results, in the process that began it alone.
void KeepJobThatCanGoOn(const HostContext& context, StabilizerState& state) {
  if (!state.analyzer || state.analyzer->job_stage() == analysis::JobStage::NotStarted) return;
  if (state.analyzer->CanGoOn()) {
    state.first_analysis = true;
    return;
  }
  state.EndAnalyzer(context.in, context.out);  // a failed job would keep its frames
  state.analysis_pending = false;
}

}  // namespace

// The project's parameters tell what was under way, or could not be told, when it was saved.
FrameStatus StabilizerEffect::UntoldStatus(const StabilizerState& state) {
  if (state.analyzer || (state.has_frames() && state.needs_solve)) return FrameStatus::None;
  const FrameStatus status = !state.has_frames()                 ? FrameStatus::PressAnalyze
                             : state.phase == SolvePhase::Failed ? FrameStatus::SolveFailed
                                                                 : FrameStatus::Ready;
  const double counter = GetFloatParam(kAnalysisStatusCounterIndex);
  const auto told = static_cast<FrameStatus>(std::llround(std::fmod(counter, 100)));
  const bool idle = status == FrameStatus::PressAnalyze && told == FrameStatus::None;
  return told == status || idle ? FrameStatus::None : status;
}

void StabilizerEffect::FlattenInstance() {
  HX_InData& in = *context().in;
  const HX_Handle live = in.instance_handle;
  if (!live || InspectInstance(context(), live) != FlattenedInstance::Live) return;
  const bool raw = KeepsPayloadRaw(context());
  const StabilizerState* const present = GetState();
  const std::string payload = present ? PayloadOf(*present, raw) : std::string();
  OwnedHandle flat(*in.cb, NewInstanceHandle(context(), payload.size()));
  {
    const InstanceHandleLock header(context(), flat.get());
    header->flattened = 1;
    header->raw = raw ? 1 : 0;
    std::memcpy(&*header + 1, payload.data(), payload.size());
  }
  {
    // Locked before anything changes. An analysis goes on without the state: whoever asks for the
    // same again finds its job.
    const InstanceHandleLock header(context(), live);
    DetachSharedData();
    const std::unique_ptr<StabilizerState> state(std::exchange(header->state, nullptr));
  }
  in.instance_handle = context().out->instance_handle = flat.release();
  in.cb->dispose_handle(live);
}

void StabilizerEffect::ReloadInstance() {
  HX_InData& in = *context().in;
  const HX_Handle stored = in.instance_handle;
  if (!stored) return CreateInstanceState(true);
  const FlattenedInstance kind = InspectInstance(context(), stored);
  if (kind == FlattenedInstance::Live) return;
  std::unique_ptr<StabilizerState> state;
  if (kind != FlattenedInstance::Nothing) {
    state = std::make_unique<StabilizerState>(in, false);
    try {
      LoadInstance(context(), kind, *state);
    } catch (const analysis::StateDeserializationFailed&) {
      state = std::make_unique<StabilizerState>(in, false);
    }
    KeepJobThatCanGoOn(context(), *state);
    state->unpublished = UntoldStatus(*state);
  }
  OwnedHandle live(*in.cb, AllocateInstanceHandle(kLivePayloadLength));
  {
    const InstanceHandleLock header(context(), live.get());  // may throw, so ahead of the release
    header->state = state.release();
  }
  in.instance_handle = context().out->instance_handle = live.release();
  in.cb->dispose_handle(stored);
  AttachSharedData(false);
  const StabilizerState* const present = GetState();
  if (present && present->unpublished != FrameStatus::None) PublishStatus(present->unpublished);
  ForceRerender(context());
}

}  // namespace kelp::effect
