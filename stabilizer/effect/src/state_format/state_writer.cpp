#include "stabilizer/effect/src/state_format/state_writer.h"

#include "stabilizer/effect/src/state_format/format.h"
#include "stabilizer/effect/src/state_format/job_json.h"
#include "stabilizer/effect/src/state_format/solve_sections.h"
#include "stabilizer/effect/src/state_format/stored_tracks.h"

namespace kelp::effect {

using namespace state_format;
using tessel::filesupport::OutputByteStream;

namespace {

void Write(OutputByteStream& out, Marker marker) {
  out << static_cast<std::int32_t>(marker);
}

void WriteAnalysis(OutputByteStream& out, const SavedState& state) {
  const SourceShape& source = state.source;
  const analysis::AnalysisResult& result = *state.result;
  Write(out, Marker::Stab);
  out << source.width << source.height << source.par_num << source.par_den;
  out << result.all_features.frame_count
      << static_cast<std::uint64_t>(result.all_features.feature_count);
  out << JobInputText(result.job_input) << result.tracker_identity << state.analysis_tick;
  Write(out, Marker::Guid);
  out << result.source_identity << state.analysis_pending << state.needs_solve << state.detailed;
  out << state.job.has_value();
  if (state.job) out << JobText(*state.job);
}

void WriteSolve(OutputByteStream& out, const SavedState& state, PayloadForm form) {
  const SolveResult& solve = *state.solve_result;
  const bool without_results = state.phase == SolvePhase::Solved && !solve.warper;
  const SolvePhase phase = without_results ? SolvePhase::None : state.phase;
  Write(out, Marker::Solv);
  out << static_cast<std::int32_t>(phase) << solve.solve_hash << solve.crop_hash;
  Write(out, Marker::Mesh);
  if (phase == SolvePhase::Solved) WriteWarps(out, *solve.warper, form);
  Write(out, Marker::MtoN);
  WriteFrameMap(out, phase == SolvePhase::Solved ? solve.warper->frameMap().get() : nullptr);
}

}  // namespace

void WriteState(OutputByteStream& out, const SavedState& state, PayloadForm form) {
  const auto& crop = state.solve_result->crop;
  WriteAnalysis(out, state);
  WriteSolve(out, state, form);
  Write(out, Marker::StrF);
  out << state.result->all_features.first_frame;
  WriteTrackTable(out, state.result->all_features, form);
  Write(out, Marker::Crop);
  out << bool{crop};
  if (crop) WriteCrop(out, *crop);
  Write(out, Marker::Pup);
}

}  // namespace kelp::effect
