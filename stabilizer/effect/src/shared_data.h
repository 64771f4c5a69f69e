#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <shared_mutex>

#include "analysis/src/analyzer.h"
#include "analysis/src/job_input.h"
#include "platform/tessel/guid.h"
#include "stabilization/crop/cropper.h"
#include "stabilization/warp/cp_warper.h"
#include "stabilizer/effect/src/solve_phase.h"
#include "tracking/track_store.h"

namespace kelp::effect {

// What the user interface and the renders of one effect on the timeline have in common, made by
// the first instance that attaches and deleted by the last that detaches. The host keeps its
// address as the effect's opaque data, which outside renderers hand to the plug-in's exports. What
// it points at is never changed, only replaced.
struct StabilizerSharedData {
  mutable std::shared_mutex lock;  // guards everything below; PublishSharedData is the one writer

  struct Contents {
    boost::shared_ptr<const marrow::stabilization::CPWarper> warper;
    boost::shared_ptr<const cropper> crop;
    analysis::JobInput job_input;
    tessel::utility::Guid source_identity;
    tessel::utility::Guid tracker_identity;
    // A header of its own over the cells that all share; null before the first publishing.
    boost::shared_ptr<const marrow::tracking::AllFeatures> all_features;
    std::uint64_t feature_count = 0;
    std::int32_t first_frame = 0;
    std::int32_t source_width = 0, source_height = 0;
    std::int32_t par_num = 1;
    std::uint32_t par_den = 1;
    boost::shared_ptr<analysis::Analyzer> analyzer;
    SolvePhase solve_status = SolvePhase::None;
    bool needs_solve = false;
    bool gpu_allowed = false;
    bool first_solve = false;
    bool subsequent_solve = false;
  } contents;
};

}  // namespace kelp::effect
