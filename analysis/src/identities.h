#pragma once

#include "analysis/src/job_input.h"
#include "platform/hx/hx_effect.h"
#include "platform/tessel/guid.h"
#include "tracking/selector_params.h"
#include "tracking/tracker_params.h"

// Identities of what a stored result depends on. They stand in projects: order and width of what is
// mixed must never change, or every stored analysis has to run again.
namespace kelp::analysis {

// Of the clip's span, steps and fields.
tessel::utility::Guid GetIdentifierForJobInput(const JobInput& input);

// Of both records as a run uses them, automatic values filled in.
tessel::utility::Guid GetIdentifierForTracker(const marrow::tracking::SelectorParams& selector,
                                              const marrow::tracking::TrackerParams& tracker);

// Of all that stands upstream of the effect in the host's node graph; nil without a media node.
// Throws host codes.
tessel::utility::Guid GetUpstreamIdentifier(HX_InData* host_in, HX_OutData* host_out);

}  // namespace kelp::analysis
