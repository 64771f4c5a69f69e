#pragma once

#include <boost/logic/tribool.hpp>
#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <optional>

#include "analysis/src/analyzer.h"
#include "analysis/src/job_input.h"
#include "platform/tessel/guid.h"
#include "stabilization/crop/cropper.h"
#include "stabilization/warp/cp_warper.h"
#include "stabilizer/effect/src/solve_phase.h"
#include "tracking/track_store.h"

namespace kelp::effect {

// What a project keeps of an instance. docs/state_format.md tells the bytes.
struct SavedState {
  std::int32_t source_width = 0, source_height = 0;  // of the analysed source, in its pixels
  std::int32_t par_num = 1;
  std::uint32_t par_den = 1;

  marrow::tracking::AllFeatures all_features;
  analysis::JobInput job_input;
  tessel::utility::Guid tracker_identity;
  tessel::utility::Guid source_identity;
  std::uint64_t analysis_tick = 0;  // HighPrecisionTime of the process that began the analysis
  boost::logic::tribool detailed = boost::logic::indeterminate;
  bool analysis_pending = false;
  std::optional<analysis::AnalyzerRecord> job;  // of an analysis that was not done

  bool needs_solve = false;
  SolvePhase phase = SolvePhase::None;
  // Hashes of parameters, in 32 bits, or beyond them where no parameters can have that hash.
  std::int64_t solve_hash = 0;
  std::int64_t crop_hash = 0;
  // With one record for each row of the table; null unless the phase is Solved.
  boost::shared_ptr<const marrow::stabilization::CPWarper> warper;
  boost::shared_ptr<const cropper> crop;  // may be null
};

}  // namespace kelp::effect
