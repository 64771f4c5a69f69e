#include "stabilizer/effect/src/state_format/state_writer.h"

#include "stabilizer/effect/src/state_format/format.h"
#include "stabilizer/effect/src/state_format/job_json.h"
#include "stabilizer/effect/src/state_format/solve_sections.h"
#include "stabilizer/effect/src/state_format/track_table.h"

namespace kelp::effect {

using namespace state_format;
using tessel::filesupport::OutputByteStream;

namespace {

void Write(OutputByteStream& out, Marker marker) {
  out << static_cast<std::int32_t>(marker);
}

void WriteAnalysis(OutputByteStream& out, const SavedState& state) {
  Write(out, Marker::Stab);
  out << state.source_width << state.source_height << state.par_num << state.par_den;
  out << state.all_features.frame_count
      << static_cast<std::uint64_t>(state.all_features.feature_count);
  out << JobInputText(state.job_input) << state.tracker_identity << state.analysis_tick;
  Write(out, Marker::Guid);
  out << state.source_identity << state.analysis_pending << state.needs_solve << state.detailed;
  out << state.job.has_value();
  if (state.job) out << JobText(*state.job);
}

void WriteSolve(OutputByteStream& out, const SavedState& state) {
  const bool without_results = state.phase == SolvePhase::Solved && !state.warper;
  const SolvePhase phase = without_results ? SolvePhase::None : state.phase;
  Write(out, Marker::Solv);
  out << static_cast<std::int32_t>(phase) << state.solve_hash << state.crop_hash;
  Write(out, Marker::Mesh);
  if (phase == SolvePhase::Solved) WriteWarps(out, *state.warper);
  Write(out, Marker::MtoN);
  WriteFrameMap(out, phase == SolvePhase::Solved ? state.warper->frameMap().get() : nullptr);
}

}  // namespace

void WriteState(OutputByteStream& out, const SavedState& state) {
  WriteAnalysis(out, state);
  WriteSolve(out, state);
  Write(out, Marker::StrF);
  out << state.all_features.first_frame;
  WriteTrackTable(out, state.all_features);
  Write(out, Marker::Crop);
  out << bool{state.crop};
  if (state.crop) WriteCrop(out, *state.crop);
  Write(out, Marker::Pup);
}

}  // namespace kelp::effect
