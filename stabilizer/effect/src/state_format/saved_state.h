#pragma once

#include <boost/logic/tribool.hpp>
#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <optional>

#include "analysis/src/analysis_result.h"
#include "analysis/src/analyzer.h"
#include "effect/source_shape.h"
#include "stabilizer/effect/src/solve_result.h"

namespace kelp::effect {

// What a project keeps of an instance. docs/state_format.md tells the bytes.
struct SavedState {
  SourceShape source;                                        // that was analysed
  boost::shared_ptr<const analysis::AnalysisResult> result;  // never null
  // Never null. With a warper only where the phase is Solved.
  boost::shared_ptr<const SolveResult> solve_result;
  SolvePhase phase = SolvePhase::None;
  bool needs_solve = false;

  std::uint64_t analysis_tick = 0;  // HighPrecisionTime of the process that began the analysis
  boost::logic::tribool detailed = boost::logic::indeterminate;
  bool analysis_pending = false;
  std::optional<analysis::AnalyzerRecord> job;  // of an analysis that was not done
};

}  // namespace kelp::effect
