#pragma once

#include <boost/shared_ptr.hpp>
#include <shared_mutex>

#include "analysis/src/analysis_result.h"
#include "analysis/src/analyzer.h"
#include "effect/source_shape.h"
#include "stabilizer/effect/src/solve_result.h"

namespace kelp::effect {

// What the user interface and the renders of one effect on the timeline have in common, made by
// the first instance that attaches and deleted by the last that detaches. The host keeps its
// address as the effect's opaque data, which outside renderers hand to the plug-in's exports. What
// it points at is never changed, only replaced.
struct StabilizerSharedData {
  mutable std::shared_mutex lock;  // guards everything below; PublishSharedData is the one writer

  struct Contents {
    SourceShape source;
    // Null before the first publishing, both at once.
    boost::shared_ptr<const analysis::AnalysisResult> result;
    boost::shared_ptr<const SolveResult> solve_result;
    boost::shared_ptr<analysis::Analyzer> analyzer;
    // Without defaults, so that whoever makes them names them all.
    SolvePhase phase;
    bool needs_solve;
    bool first_analysis;
    bool subsequent_solve;
    bool source_changed;
    bool gpu_allowed;  // outside renderers may draw the frames
  } contents{};
};

}  // namespace kelp::effect
