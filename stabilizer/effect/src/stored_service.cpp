#include "stabilizer/effect/src/stored_service.h"

#include <cmath>
#include <cstring>

#include "analysis/host/video_segment_render_suite_job.h"
#include "analysis/src/job_frame_source.h"
#include "analysis/src/read_job_input.h"
#include "analysis/src/state_errors.h"
#include "effect/host_text.h"
#include "effect/suite.h"
#include "platform/tessel/debug.h"
#include "platform/tessel/filesupport.h"
#include "stabilizer/effect/src/stabilizer_strings.h"
#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"

namespace kelp::effect {

using analysis::AfterReport;
using analysis::FrameStatus;
using state_format::PayloadForm;

namespace {

PayloadForm FormAskedFor(const HostContext& context) {
  using tessel::debug::DebugDatabase;
  if (DebugDatabase::GetBool("AnalysisDataIsAlwaysCompressed")) return PayloadForm::deflated;
  if (DebugDatabase::GetBool("AnalysisDataIsNeverCompressed")) return PayloadForm::raw;
  const ScopedSuite<HX_AnalysisHostSuite1> suite(context);
  std::uint8_t raw = 0;
  ThrowIfFailed(suite->GetCompressionPreference(&raw));
  return state_format::FormOf(state_format::kPresentVersion, raw);
}

// Tells how much was written.
class CountingStream final : public tessel::filesupport::OutputByteStream {
 public:
  void Write(const void*, std::size_t size) override { size_ += size; }
  std::size_t size() const { return size_; }

 private:
  std::size_t size_ = 0;
};

// Into memory of a size that was counted before.
class PlacedStream final : public tessel::filesupport::OutputByteStream {
 public:
  explicit PlacedStream(void* place) : next_(static_cast<char*>(place)) {}
  void Write(const void* data, std::size_t size) override {
    if (size > 0) std::memcpy(next_, data, size);
    next_ += size;
  }

 private:
  char* next_;
};

// A handle of a payload of that size, with its header; fill(the payload's place).
template <class Fill>
HX_Handle HandleOf(const HostContext& context, std::size_t size, PayloadForm form,
                   const Fill& fill) {
  OwnedHandle flat(*context.in->cb, NewInstanceHandle(context, size));
  {
    const InstanceHandleLock header(context, flat.get());
    header->flattened = 1;
    header->raw = static_cast<std::uint8_t>(form);
    fill(&*header + 1);
  }
  return flat.release();
}

SavedState ReadPayload(const HostContext& context, HX_Handle handle) {
  const InstanceHandleLock header(context, handle);
  return ReadState(&*header + 1, static_cast<std::size_t>(header->payload_length), header->version,
                   header->raw, ShapeOf(*context.in));
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
    state.Load(ReadPayload(context, context.in->instance_handle), context.in->global_data,
               MakeVideoSegmentRenderSuiteJob);
  } catch (const StateRefused& refused) {
    Refuse(context, refused);
  }
}

// A table has room for all frames from the start, of which a file may tell any number: by its span,
// and by a step as short as can be.
bool HasMoreFramesThanLayer(const HostContext& context, const analysis::JobInput& job) {
  try {
    return analysis::GetRunFrames(job).frame_count >
           analysis::GetRunFrames(analysis::ReadJobInput(context.in, context.out)).frame_count;
  } catch (...) {  // of the host's, or of times that are none, which a start meets too
    ClearMessage(context);
    return false;
  }
}

// A job runs, or has results, in the process that began it alone.
void KeepJobThatCanGoOn(const HostContext& context, StabilizerState& state) {
  if (!state.analyzer) return;
  if (state.analyzer->job_stage() == analysis::JobStage::NotStarted) {
    if (!HasMoreFramesThanLayer(context, state.analyzer->record().job_input_parameters)) return;
  } else if (state.analyzer->CanGoOn()) {
    state.first_analysis = true;
    return;
  }
  state.EndAnalyzer(context.in, context.out);  // a failed job would keep its frames
}

FrameStatus ToldStatus(double counter) {
  return static_cast<FrameStatus>(std::llround(std::fmod(counter, 100)));
}

}  // namespace

HX_Handle FlattenedHandle(const HostContext& context, const StabilizerState* state) {
  const PayloadForm form = FormAskedFor(context);
  if (!state) return HandleOf(context, 0, form, [](void*) {});
  const SavedState saved = state->Save();
  if (form == PayloadForm::deflated) {
    tessel::filesupport::OStringByteStream bytes;
    tessel::filesupport::OZipByteStream zip(bytes);
    WriteState(zip, saved);
    zip.Close();
    return HandleOf(context, bytes.bytes().size(), form, [&bytes](void* payload) {
      std::memcpy(payload, bytes.bytes().data(), bytes.bytes().size());
    });
  }
  // Written twice, which is little work where all is kept as it is stored, so that a long clip's
  // payload is in memory once.
  CountingStream counted;
  WriteState(counted, saved, form);
  return HandleOf(context, counted.size(), form, [&](void* payload) {
    PlacedStream placed(payload);
    WriteState(placed, saved, form);
  });
}

std::unique_ptr<StabilizerState> StateOfFlattened(const HostContext& context,
                                                  FlattenedInstance kind) {
  if (kind == FlattenedInstance::Nothing) return nullptr;
  auto state = std::make_unique<StabilizerState>(*context.in, false);
  try {
    LoadInstance(context, kind, *state);
  } catch (const analysis::StateDeserializationFailed&) {
    state = std::make_unique<StabilizerState>(*context.in, false);
  }
  KeepJobThatCanGoOn(context, *state);
  return state;
}

FrameStatus UntoldStatus(const StabilizerState* state, double counter) {
  if (state && (state->analyzer || (state->has_frames() && state->needs_solve))) {
    return FrameStatus::None;
  }
  const FrameStatus status = state ? state->SettledStatus() : FrameStatus::PressAnalyze;
  const FrameStatus told = ToldStatus(counter);
  const bool idle = status == FrameStatus::PressAnalyze && told == FrameStatus::None;
  return told == status || idle ? FrameStatus::None : status;
}

FrameStatus UntoldEnd(const StabilizerState* state, double counter) {
  const FrameStatus told = ToldStatus(counter);
  const bool waits =
      told >= FrameStatus::AnalysisInProgress && told <= FrameStatus::SubsequentSolveOnDeletion;
  return waits ? UntoldStatus(state, counter) : FrameStatus::None;
}

}  // namespace kelp::effect
